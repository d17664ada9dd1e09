#pragma once

// An engine on a fresh database in a scratch directory, with shorthands to make folders, files,
// bitmaps, thumbnails and shape records, and to look into every store of the engine. Shared by
// the engine's file, thumbnail and consistency tests.

#include <gtest/gtest.h>

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "VXBitmap.h"
#include "VXCatFile.h"
#include "VXEngine.h"
#include "VXFolder.h"
#include "VXMatchInfo.h"
#include "VXPropDB.h"
#include "VXProperty.h"
#include "VXResult.h"
#include "VXTable.h"
#include "VXThumb.h"
#include "VXURI.h"
#include "VXXMPDB.h"
#include "vxtest.h"

namespace vxtest {

// Opens the engine's protected store accessors to the tests.
class ProbeEngine : public CVXEngine {
 public:
  using CVXEngine::MatchStore;
  using CVXEngine::ThumbStore;
};

// A w x h bitmap whose pixels follow `seed`: different seeds give different shape data.
inline CVXBitmap MakeBitmap(uint32_t w, uint32_t h, uint32_t seed, bool grey = false) {
  CVXBitmap bitmap;
  bitmap.Create(w, h, grey);
  SVXColor* p = bitmap.GetColorMatrix();
  for (uint32_t i = 0; i < w * h; ++i) {
    uint32_t v = (i * 2654435761u) ^ (seed * 40503u);
    uint8_t x = static_cast<uint8_t>(v >> 8);
    p[i].R = x;
    p[i].G = grey ? x : static_cast<uint8_t>(v >> 16);
    p[i].B = grey ? x : static_cast<uint8_t>(v >> 24);
    p[i].A = 0;
  }
  return bitmap;
}

inline CVXThumb MakeThumb(uint32_t w, uint32_t h, uint32_t bytes, uint8_t seed) {
  std::vector<uint8_t> data(bytes);
  for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(seed + i * 31);
  CVXThumb thumb;
  thumb.Create(w, h, 7, bytes, data.data());
  return thumb;
}

inline SVXDBRec_3 MakeShape(uint8_t seed) {
  SVXDBRec_3 shape{};
  auto* cells = reinterpret_cast<uint8_t*>(&shape.Info);
  for (size_t i = 0; i < sizeof shape.Info; ++i) cells[i] = static_cast<uint8_t>(seed ^ i);
  return shape;
}

inline std::vector<CVXProperty> MakeRow(uint32_t value, size_t columns) {
  std::vector<CVXProperty> row;
  for (size_t c = 0; c < columns; ++c) row.emplace_back(value + static_cast<uint32_t>(c));
  return row;
}

// Gives the image properties table `columns` columns of unsigned numbers.
inline void DefineColumns(CVXEngine& engine, size_t columns) {
  CVXTable table(VX_IMAGE_PROPERTIES_TABLE);
  table.Properties().Name = "Image Properties";
  for (size_t c = 0; c < columns; ++c) table.AddColumn("p" + std::to_string(c), vptUInt32);
  ASSERT_EQ(engine.GetPropertyDatabase().SetTable(table), VX_OK);
}

// The OIDs of files that have data in each store besides the catalog.
struct StoreContents {
  std::set<uint32_t> shapes, thumbs, properties, xmp;
};

inline StoreContents ReadStores(ProbeEngine& engine) {
  StoreContents c;
  std::vector<uint32_t> oids;
  EXPECT_EQ(engine.MatchStore().GetOids(2, oids, true), VX_OK);
  c.shapes.insert(oids.begin(), oids.end());
  EXPECT_EQ(engine.ThumbStore().GetOids(3, oids, true), VX_OK);
  c.thumbs.insert(oids.begin(), oids.end());
  EXPECT_EQ(engine.GetPropertyDatabase().GetRecordOids(VX_IMAGE_PROPERTIES_TABLE, oids), VX_OK);
  c.properties.insert(oids.begin(), oids.end());
  // Tests give every XMP record a rating, so the rated files are all files with XMP data.
  EXPECT_EQ(engine.XMPDB().GetOidsWithRank(oids), 0);
  c.xmp.insert(oids.begin(), oids.end());
  EXPECT_EQ(engine.XMPDB().FTIQuery("", "", CVXXMPDB::fqPrefix, oids, 0, 0), 0);
  c.xmp.insert(oids.begin(), oids.end());
  return c;
}

class EngineFixture : public ::testing::Test {
 protected:
  void SetUp() override {
    info_.Name = dir_ / "db.vxm";
    engine_.SetLogFile(&log_);
    ASSERT_EQ(engine_.Create(info_), VX_OK);
  }

  void Reopen(bool readOnly = false) {
    ASSERT_EQ(engine_.Close(), VX_OK);
    info_.ReadOnly = readOnly;
    ASSERT_EQ(engine_.Open(info_), VX_OK);
  }

  uint32_t AddFolder(const std::string& uri, const std::string& media = "VOL",
                     const std::string& serial = "1") {
    CVXFolder folder(CVXURI(uri, true), 0, 0);
    folder.MediaID() = media;
    folder.MediaSerial() = serial;
    EXPECT_EQ(engine_.AddFolder(folder), VX_OK) << uri;
    return folder.Oid();
  }

  // A file from a bitmap, followed by its thumbnail, as a host adds one.
  uint32_t AddFile(uint32_t folder, const std::string& name, uint32_t seed = 1) {
    CVXCatFile file(0, name, folder);
    EXPECT_EQ(engine_.AddFile(file, MakeBitmap(24, 16, seed), seed), VX_OK) << name;
    CVXThumb thumb = MakeThumb(32, 24, 64, static_cast<uint8_t>(seed));
    EXPECT_EQ(engine_.AddThumb(file.Oid(), thumb), VX_OK) << name;
    return file.Oid();
  }

  CVXCatFile File(uint32_t oid) {
    CVXCatFile file;
    EXPECT_EQ(engine_.GetFile(oid, file), VX_OK) << oid;
    return file;
  }

  std::vector<uint8_t> ShapeBytes(uint32_t oid) {
    SVXDBRec_3 record;
    if (engine_.GetShapeData(oid, record) != VX_OK) return {};
    auto* p = reinterpret_cast<const uint8_t*>(&record);
    return std::vector<uint8_t>(p, p + sizeof record);
  }

  bool HasThumb(uint32_t oid) {
    CVXThumb thumb;
    return engine_.GetThumb(oid, thumb) == VX_OK;
  }

  void SetXMP(uint32_t oid, const std::string& packet) {
    SXMPRecord rec;
    rec.Oid = oid;
    rec.Packet = packet;
    rec.Rating = 3;
    ASSERT_EQ(engine_.SetXMP(&rec, false), VX_OK);
    ASSERT_EQ(engine_.SetXMPFTI(oid, {{"dc:subject", packet}}), VX_OK);
  }

  std::string XMPPacket(uint32_t oid) {
    SXMPRecord rec;
    rec.Oid = oid;
    return engine_.GetXMP(&rec, false) == VX_OK ? rec.Packet : "";
  }

  TempDir dir_;
  CapturedLog log_;
  SVXCreateInfo info_;
  ProbeEngine engine_;
};

}  // namespace vxtest
