#include <gtest/gtest.h>

#include <cstring>
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

std::vector<uint8_t> GoldenThumb() {
  return vxtest::Bytes()
      .u16(1)
      .u32(42)
      .u16(2)
      .le(int32_t{-7})
      .u32(100)
      .u32(80)
      .u32(5)
      .raw("abcde", 5)
      .b;
}

TEST(ThumbRecord, WritesTheHandBuiltBytesAndReadsThemBack) {
  CVXThumb thumb;
  thumb.Create(100, 80, -7, 5, "abcde");
  thumb.Oid() = 42;
  CVXMemFile mem;
  thumb.Write(mem);
  std::vector<uint8_t> golden = GoldenThumb();
  ASSERT_EQ(mem.GetFileSize(), golden.size());
  EXPECT_EQ(std::memcmp(mem.GetBuffer(), golden.data(), golden.size()), 0);

  // Versions are not tested on reading.
  golden[0] = 9;
  golden[6] = 9;
  CVXMemFile in(golden.data(), golden.size());
  CVXThumb back;
  back.Read(in);
  EXPECT_EQ(back.Oid(), 42u);
  EXPECT_EQ(back.Format(), -7);
  EXPECT_EQ(back.Width(), 100u);
  EXPECT_EQ(back.Height(), 80u);
  ASSERT_EQ(back.DataSize(), 5u);
  EXPECT_EQ(std::memcmp(back.Data(), "abcde", 5), 0);
}

TEST(ThumbRecord, ShortRecordsThrowAndLeaveTheObjectAlone) {
  std::vector<uint8_t> golden = GoldenThumb();
  // A data size that claims more than the record holds, and every cut of the record.
  std::vector<uint8_t> claims = golden;
  claims[20] = 0xFF;
  std::vector<std::vector<uint8_t>> bad = {claims};
  for (size_t n = 0; n < golden.size(); ++n) bad.emplace_back(golden.begin(), golden.begin() + n);
  for (const auto& bytes : bad) {
    CVXThumb thumb = MakeThumb(3, 4, 10, 1);
    thumb.Oid() = 5;
    CVXMemFile in(bytes.data(), bytes.size());
    try {
      thumb.Read(in);
      ADD_FAILURE() << "read " << bytes.size() << " bytes";
    } catch (CVXException* e) {
      EXPECT_EQ(e->GetCode(), VX_NOT_FOUND);
      delete e;
    }
    EXPECT_EQ(thumb.Oid(), 5u);
    EXPECT_EQ(thumb.Width(), 3u);
    EXPECT_EQ(thumb.DataSize(), 10u);
  }
}

class EngineThumbsTest : public vxtest::EngineFixture {};

TEST_F(EngineThumbsTest, ThumbnailsRoundTripThroughTheStore) {
  CVXThumb thumb = MakeThumb(100, 80, 12000, 3);
  ASSERT_EQ(engine_.AddThumb(9, thumb), VX_OK);
  EXPECT_EQ(thumb.Oid(), 9u);
  EXPECT_TRUE(log_.Has("+ VXEngine::AddThumb"));

  CVXThumb back;
  ASSERT_EQ(engine_.GetThumb(9, back), VX_OK);
  EXPECT_EQ(back.Width(), 100u);
  ASSERT_EQ(back.DataSize(), 12000u);
  EXPECT_EQ(std::memcmp(back.Data(), thumb.Data(), 12000), 0);

  CVXThumb smaller = MakeThumb(10, 8, 20, 4);
  smaller.Oid() = 9;
  ASSERT_EQ(engine_.SetThumb(smaller), VX_OK);
  ASSERT_EQ(engine_.GetThumb(9, back), VX_OK);
  EXPECT_EQ(back.DataSize(), 20u);

  // Record 3/9 of the thumbnail store holds the record format.
  ASSERT_EQ(engine_.Close(), VX_OK);
  CQRLBlobDB store;
  ASSERT_EQ(store.Open(dir_ / "db.vxt", true), VX_OK);
  unsigned size = 0;
  ASSERT_EQ(store.GetSize(Sel(3, 9), size), VX_OK);
  std::vector<uint8_t> raw(size);
  ASSERT_EQ(store.Get(Sel(3, 9), raw.data(), size), VX_OK);
  std::vector<uint8_t> expected =
      vxtest::Bytes().u16(1).u32(9).u16(2).le(int32_t{7}).u32(10).u32(8).u32(20).b;
  expected.insert(expected.end(), smaller.Data(), smaller.Data() + 20);
  EXPECT_EQ(raw, expected);
}

TEST_F(EngineThumbsTest, MissingThumbnailsAnswerNotFoundQuietly) {
  CVXThumb thumb;
  log_.ClearCaptured();
  EXPECT_EQ(engine_.GetThumb(0, thumb), VX_NOT_FOUND);
  EXPECT_EQ(engine_.GetThumb(77, thumb), VX_NOT_FOUND);
  EXPECT_EQ(log_.Count(" E1 "), 0u);
  EXPECT_EQ(engine_.RemoveThumb(77), VX_NOT_FOUND);
}

TEST_F(EngineThumbsTest, ThumbSetInfoFoldsSizesWithAFloorOf40) {
  using Info = CVXEngine::SThumbSetInfo;
  auto info = [&](const std::vector<uint32_t>& oids) {
    Info i;
    EXPECT_EQ(engine_.GetThumbSetInfo(oids, i), VX_OK);
    return std::vector<uint32_t>{i.MinWidth, i.MaxWidth, i.MinHeight, i.MaxHeight};
  };
  using V = std::vector<uint32_t>;
  EXPECT_EQ(info({}), (V{40, 40, 40, 40}));
  CVXThumb a = MakeThumb(100, 80, 8, 1);
  CVXThumb b = MakeThumb(300, 20, 8, 2);
  ASSERT_EQ(engine_.AddThumb(1, a), VX_OK);
  ASSERT_EQ(engine_.AddThumb(2, b), VX_OK);
  EXPECT_EQ(info({1}), (V{40, 100, 40, 80}));
  EXPECT_EQ(info({1, 2, 99}), (V{40, 300, 40, 80})) << "a file without thumbnail is skipped";

  // The size cache follows every change: AddThumb drops the entry, SetThumb replaces it,
  // RemoveThumb drops it.
  CVXThumb c = MakeThumb(500, 400, 8, 3);
  ASSERT_EQ(engine_.AddThumb(1, c), VX_OK);
  EXPECT_EQ(info({1}), (V{40, 500, 40, 400}));
  CVXThumb d = MakeThumb(60, 50, 8, 4);
  d.Oid() = 1;
  ASSERT_EQ(engine_.SetThumb(d), VX_OK);
  EXPECT_EQ(info({1}), (V{40, 60, 40, 50}));
  ASSERT_EQ(engine_.RemoveThumb(1), VX_OK);
  EXPECT_EQ(info({1}), (V{40, 40, 40, 40}));
  engine_.ReleaseCaches();
  EXPECT_EQ(info({2}), (V{40, 300, 40, 40}));

  CBitVector bits;
  bits.Set(2);
  Info i;
  EXPECT_EQ(engine_.GetThumbSetInfo(bits, i), VX_OK);
  EXPECT_EQ(i.MaxWidth, 300u);
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

TEST_F(EngineThumbsTest, ShapeDataComesBackSingleAndInBatches) {
  uint32_t folder = AddFolder("c:/pics/");
  std::vector<uint32_t> oids;
  for (uint8_t seed = 1; seed <= 3; ++seed) {
    CVXCatFile file(0, "f" + std::to_string(seed), folder);
    CVXThumb thumb = MakeThumb(8, 8, 8, seed);
    ASSERT_EQ(engine_.AddFile(file, thumb, vxtest::MakeShape(seed)), VX_OK);
    oids.push_back(file.Oid());
  }
  SVXDBRec_3 one;
  ASSERT_EQ(engine_.GetShapeData(oids[1], one), VX_OK);
  SVXDBRec_3 expected = vxtest::MakeShape(2);
  EXPECT_EQ(std::memcmp(&one, &expected, sizeof one), 0);

  std::vector<Sel> sels = {Sel(2, oids[2]), Sel(2, oids[0])};
  std::vector<uint8_t> buffer(2 * sizeof(SVXDBRec_3));
  ASSERT_EQ(engine_.GetShapeData(sels, buffer.data()), VX_OK);
  SVXDBRec_3 third = vxtest::MakeShape(3);
  EXPECT_EQ(std::memcmp(buffer.data(), &third, sizeof third), 0);
  SVXDBRec_3 first = vxtest::MakeShape(1);
  EXPECT_EQ(std::memcmp(buffer.data() + sizeof(SVXDBRec_3), &first, sizeof first), 0);

  sels.push_back(Sel(2, 999));
  buffer.resize(3 * sizeof(SVXDBRec_3));
  EXPECT_EQ(engine_.GetShapeData(sels, buffer.data()), VX_NOT_FOUND);
  EXPECT_EQ(engine_.GetShapeData(sels, nullptr), VX_NOT_FOUND);
  EXPECT_EQ(engine_.GetShapeData(999, one), VX_NOT_FOUND);
}

TEST_F(EngineThumbsTest, ImagePropertiesAddSetRemove) {
  vxtest::DefineColumns(engine_, 3);
  std::vector<CVXProperty> row;
  ASSERT_EQ(engine_.AddImageProperties(4, vxtest::MakeRow(10, 3)), VX_OK);
  EXPECT_EQ(engine_.AddImageProperties(4, vxtest::MakeRow(20, 3)), VX_ALREADY_PRESENT);
  ASSERT_EQ(engine_.GetImageProperties(4, row), VX_OK);
  EXPECT_EQ(row, vxtest::MakeRow(10, 3));

  // Set replaces a row, and adds one where there is none.
  ASSERT_EQ(engine_.SetImageProperties(4, vxtest::MakeRow(30, 3)), VX_OK);
  ASSERT_EQ(engine_.SetImageProperties(5, vxtest::MakeRow(40, 2)), VX_OK);
  ASSERT_EQ(engine_.GetImageProperties(4, row), VX_OK);
  EXPECT_EQ(row, vxtest::MakeRow(30, 3));
  ASSERT_EQ(engine_.GetImageProperties(5, row), VX_OK);
  EXPECT_EQ(row[1], CVXProperty(uint32_t{41}));

  // Removing what is not there counts as done.
  EXPECT_EQ(engine_.RemoveImageProperties(4), VX_OK);
  EXPECT_EQ(engine_.RemoveImageProperties(4), VX_OK);
  EXPECT_EQ(engine_.GetImageProperties(4, row), VX_NOT_FOUND);

  CVXTable table(17);
  ASSERT_EQ(engine_.GetImagePropertiesTable(table), VX_OK);
  EXPECT_EQ(table.Properties().Table, VX_IMAGE_PROPERTIES_TABLE);
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
