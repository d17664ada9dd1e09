#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "QRLBlobDB.h"
#include "VXException.h"
#include "VXMemFile.h"
#include "VXThumb.h"
#include "bitvector.h"
#include "vxbytes.h"
#include "vxengine_fixture.h"

namespace {

using vxtest::MakeThumb;
using Sel = CQRLBlobDB::SSelector;

// A thumbnail record by hand: version 1, OID, version 2, format, width, height, data size, data.
std::vector<uint8_t> ThumbRecord(uint32_t oid, int32_t format, uint32_t w, uint32_t h,
                                 const void* data, uint32_t size) {
  vxtest::Bytes bytes;
  bytes.u16(1).u32(oid).u16(2).le(format).u32(w).u32(h);
  return bytes.u32(size).raw(data, size).b;
}

// The record a thumbnail writes.
std::vector<uint8_t> Written(const CVXThumb& thumb) {
  CVXMemFile mem;
  thumb.Write(mem);
  return {mem.GetBuffer(), mem.GetBuffer() + mem.GetFileSize()};
}

TEST(ThumbRecord, WritesTheHandBuiltBytesAndReadsThemBack) {
  CVXThumb thumb;
  thumb.Create(100, 80, -7, 5, "abcde");
  thumb.Oid() = 42;
  const std::vector<uint8_t> golden = ThumbRecord(42, -7, 100, 80, "abcde", 5);
  EXPECT_EQ(Written(thumb), golden);

  // Versions are not tested on reading.
  std::vector<uint8_t> other = golden;
  other[0] = other[6] = 9;
  CVXMemFile in(other.data(), other.size());
  CVXThumb back;
  back.Read(in);
  EXPECT_EQ(Written(back), golden);
}

TEST(ThumbRecord, ShortRecordsThrowAndLeaveTheObjectAlone) {
  std::vector<uint8_t> golden = ThumbRecord(42, -7, 100, 80, "abcde", 5);
  // A data size that claims more than the record holds, and every cut of the record.
  std::vector<std::vector<uint8_t>> bad = {golden};
  bad[0][20] = 0xFF;
  for (size_t n = 0; n < golden.size(); ++n) bad.emplace_back(golden.begin(), golden.begin() + n);
  for (const auto& bytes : bad) {
    CVXThumb thumb = MakeThumb(3, 4, 10, 1);
    thumb.Oid() = 5;
    const std::vector<uint8_t> before = Written(thumb);
    CVXMemFile in(bytes.data(), bytes.size());
    try {
      thumb.Read(in);
      ADD_FAILURE() << "read " << bytes.size() << " bytes";
    } catch (CVXException* e) {
      EXPECT_EQ(e->GetCode(), VX_NOT_FOUND);
      delete e;
    }
    EXPECT_EQ(Written(thumb), before) << bytes.size() << " bytes";
  }
}

class EngineThumbsTest : public vxtest::EngineFixture {};

TEST_F(EngineThumbsTest, ThumbnailsRoundTripThroughTheStore) {
  CVXThumb thumb = MakeThumb(100, 80, 12000, 3);
  ASSERT_EQ(engine_.AddThumb(9, thumb), VX_OK);
  EXPECT_EQ(thumb.Oid(), 9u);
  CVXThumb back;
  ASSERT_EQ(engine_.GetThumb(9, back), VX_OK);
  EXPECT_EQ(Written(back), Written(thumb));

  CVXThumb smaller = MakeThumb(10, 8, 20, 4);
  smaller.Oid() = 9;
  ASSERT_EQ(engine_.SetThumb(smaller), VX_OK);

  // Missing thumbnails answer not found, without an error line.
  log_.ClearCaptured();
  EXPECT_EQ(engine_.GetThumb(0, back), VX_NOT_FOUND);
  EXPECT_EQ(engine_.GetThumb(77, back), VX_NOT_FOUND);
  EXPECT_EQ(log_.Count(" E1 "), 0u);
  EXPECT_EQ(engine_.RemoveThumb(77), VX_NOT_FOUND);

  // Record 3/9 of the thumbnail store holds the record format.
  ASSERT_EQ(engine_.Close(), VX_OK);
  CQRLBlobDB store;
  ASSERT_EQ(store.Open(dir_ / "db.vxt", true), VX_OK);
  unsigned size = 0;
  ASSERT_EQ(store.GetSize(Sel(3, 9), size), VX_OK);
  std::vector<uint8_t> raw(size);
  ASSERT_EQ(store.Get(Sel(3, 9), raw.data(), size), VX_OK);
  EXPECT_EQ(raw, ThumbRecord(9, 7, 10, 8, smaller.Data(), 20));
}

TEST_F(EngineThumbsTest, ThumbSetInfoFoldsSizesWithAFloorOf40) {
  using V = std::vector<uint32_t>;
  // Asks with a list and with a bit vector, which must agree.
  auto info = [&](const V& oids) {
    CVXEngine::SThumbSetInfo i, j;
    CBitVector bits;
    for (uint32_t oid : oids) bits.Set(oid);
    EXPECT_EQ(engine_.GetThumbSetInfo(oids, i), VX_OK);
    EXPECT_EQ(engine_.GetThumbSetInfo(bits, j), VX_OK);
    EXPECT_EQ((V{j.MinWidth, j.MaxWidth, j.MinHeight, j.MaxHeight}),
              (V{i.MinWidth, i.MaxWidth, i.MinHeight, i.MaxHeight}));
    return V{i.MinWidth, i.MaxWidth, i.MinHeight, i.MaxHeight};
  };
  auto add = [&](uint32_t oid, uint32_t w, uint32_t h) {
    CVXThumb thumb = MakeThumb(w, h, 8, 1);
    ASSERT_EQ(engine_.AddThumb(oid, thumb), VX_OK);
  };
  add(1, 100, 80);
  add(2, 300, 20);
  EXPECT_EQ(info({1}), (V{40, 100, 40, 80}));
  EXPECT_EQ(info({1, 2, 99}), (V{40, 300, 40, 80})) << "a file without thumbnail is skipped";

  // The size cache follows every change: AddThumb drops the entry, SetThumb replaces it,
  // RemoveThumb drops it.
  add(1, 500, 400);
  EXPECT_EQ(info({1}), (V{40, 500, 40, 400}));
  CVXThumb d = MakeThumb(60, 50, 8, 4);
  d.Oid() = 1;
  ASSERT_EQ(engine_.SetThumb(d), VX_OK);
  EXPECT_EQ(info({1}), (V{40, 60, 40, 50}));
  ASSERT_EQ(engine_.RemoveThumb(1), VX_OK);
  EXPECT_EQ(info({1}), (V{40, 40, 40, 40}));
  engine_.ReleaseCaches();
  EXPECT_EQ(info({2}), (V{40, 300, 40, 40}));
}

TEST_F(EngineThumbsTest, ThumbInfoIsStoredWhenOpenAndMutable) {
  SVXThumbInfoNew settings{};
  settings.Width = 321;
  settings.Version = 1;
  engine_.SetThumbInfo(settings);
  Reopen();
  EXPECT_EQ(uint32_t{engine_.GetThumbInfo().Width}, 321u);

  Reopen(true);
  settings.Width = 5;
  engine_.SetThumbInfo(settings);
  EXPECT_EQ(uint32_t{engine_.GetThumbInfo().Width}, 5u) << "kept in memory";
  Reopen();
  EXPECT_EQ(uint32_t{engine_.GetThumbInfo().Width}, 321u) << "a read-only engine wrote 5/1";
  ASSERT_EQ(engine_.Close(), VX_OK);
  engine_.SetThumbInfo(settings);  // closed: memory only, and no crash
  EXPECT_EQ(uint32_t{engine_.GetThumbInfo().Width}, 5u);
}

// Batches come back in the order asked, each record as a single one comes.
TEST_F(EngineThumbsTest, ShapeDataComesBackInBatches) {
  uint32_t folder = AddFolder("c:/pics/");
  uint32_t a = AddFile(folder, "a.jpg", 1);
  uint32_t b = AddFile(folder, "b.jpg", 2);
  std::vector<Sel> sels = {Sel(2, b), Sel(2, a)};
  std::vector<uint8_t> buffer(2 * sizeof(SVXDBRec_3));
  ASSERT_EQ(engine_.GetShapeData(sels, buffer.data()), VX_OK);
  std::vector<uint8_t> expected = ShapeBytes(b), second = ShapeBytes(a);
  expected.insert(expected.end(), second.begin(), second.end());
  EXPECT_EQ(buffer, expected);

  sels.push_back(Sel(2, 999));
  buffer.resize(3 * sizeof(SVXDBRec_3));
  EXPECT_EQ(engine_.GetShapeData(sels, buffer.data()), VX_NOT_FOUND);
  EXPECT_EQ(engine_.GetShapeData(sels, nullptr), VX_NOT_FOUND);
}

TEST_F(EngineThumbsTest, ImagePropertiesAddSetRemove) {
  vxtest::DefineColumns(engine_, 3);
  auto row = [&](uint32_t oid) {
    std::vector<CVXProperty> r;
    EXPECT_EQ(engine_.GetImageProperties(oid, r), VX_OK) << oid;
    return r;
  };
  ASSERT_EQ(engine_.AddImageProperties(4, vxtest::MakeRow(10, 3)), VX_OK);
  EXPECT_EQ(engine_.AddImageProperties(4, vxtest::MakeRow(20, 3)), VX_ALREADY_PRESENT);

  // Set replaces a row, and adds one where there is none.
  ASSERT_EQ(engine_.SetImageProperties(4, vxtest::MakeRow(30, 3)), VX_OK);
  ASSERT_EQ(engine_.SetImageProperties(5, vxtest::MakeRow(40, 2)), VX_OK);
  EXPECT_EQ(row(4), vxtest::MakeRow(30, 3));
  EXPECT_EQ(row(5).at(1), CVXProperty(uint32_t{41}));

  // Removing what is not there counts as done.
  EXPECT_EQ(engine_.RemoveImageProperties(4), VX_OK);
  EXPECT_EQ(engine_.RemoveImageProperties(4), VX_OK);
  std::vector<CVXProperty> none;
  EXPECT_EQ(engine_.GetImageProperties(4, none), VX_NOT_FOUND);

  CVXTable table(17);
  ASSERT_EQ(engine_.GetImagePropertiesTable(table), VX_OK);
  EXPECT_EQ(table.Columns().size(), 3u);
}

// The pass-through turns the XMP database's answers into codes; DeleteXMP takes both kinds of
// data in one transaction.
TEST_F(EngineThumbsTest, XMPPassThroughAndDeleteXMP) {
  SetXMP(6, "red barn");
  EXPECT_EQ(engine_.SetXMP(nullptr, true), VX_NOT_FOUND);
  std::vector<uint32_t> oids;
  ASSERT_EQ(engine_.FindXMPFTI(nullptr, "barn", CVXXMPDB::fqPrefix, oids, 0, 0), VX_OK);
  EXPECT_EQ(oids, std::vector<uint32_t>{6});
  EXPECT_EQ(engine_.FindXMPFTI("", "\"", CVXXMPDB::fqFTS, oids, 0, 0), VX_NOT_FOUND);

  ASSERT_EQ(engine_.DeleteXMP(6), VX_OK);
  EXPECT_EQ(XMPPacket(6), "");
  std::vector<SFTIRecord> records;
  ASSERT_EQ(engine_.GetXMPFTI(6, records), VX_OK);
  EXPECT_TRUE(records.empty());
  EXPECT_EQ(engine_.DeleteXMP(6), VX_OK) << "deleting nothing succeeds";

  ASSERT_EQ(engine_.Close(), VX_OK);
  EXPECT_EQ(engine_.DeleteXMP(6), VX_UNKNOWN_EXCEPTION) << "no transaction on a closed store";
}

}  // namespace
