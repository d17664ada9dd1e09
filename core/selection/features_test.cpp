#include <gtest/gtest.h>

#include <ctime>
#include <string>
#include <vector>

#include "VXSelFeatures.h"
#include "VXSelImageFeatures.h"
#include "VXSelPropFeatures.h"
#include "seltest_util.h"

namespace {

using seltest::Bytes;
using seltest::Fresh;
using seltest::Loaded;
using seltest::SampleCore;
using seltest::SetSampleCore;
using seltest::Stored;

// `sample` stores as `want`, which loads back to the same bytes; every shorter prefix fails
// with 10020 and leaves the target as it was.
template <typename T>
void ExpectRecord(T sample, const Bytes& want) {
  SetSampleCore(sample);
  EXPECT_EQ(Stored(sample), want.b);
  EXPECT_EQ(Stored(Loaded<T>(want.b)), want.b);
  for (size_t cut = 0; cut < want.b.size(); ++cut) {
    T target = Fresh<T>();
    std::vector<uint8_t> before = Stored(target);
    CVXMemFile part(want.b.data(), cut);
    EXPECT_EQ(ThrownCode([&] { target.Load(&part, true); }), VX_NOT_FOUND) << cut;
    ASSERT_EQ(Stored(target), before) << cut;
  }
}

// The start of a stored record: the sample core block when `withCore`, then the record
// block's version and tag.
Bytes Head(uint16_t version, const char* tag, bool withCore = false, bool needsOriginals = false) {
  Bytes b = withCore ? SampleCore(needsOriginals) : Bytes();
  b.u16(version).str(tag);
  return b;
}

TEST(SelCoreData, OlderCoreBlocksLackOptionAndThenInterActiveAndUserData) {
  Bytes v3 = SampleCore(true);
  SSelCoreData core = Loaded<SSelCoreData>(v3.b);
  EXPECT_TRUE(core.Active && core.NeedsOriginals && core.InterActive);
  EXPECT_EQ(core.Option, 7u);
  EXPECT_EQ(core.UserData[127], 127);
  EXPECT_EQ(Stored(core), v3.b);
  // Only the core block exists on the base; without it nothing is read or written.
  EXPECT_TRUE(Stored(core, false).empty());

  Bytes v2 = Bytes().u16(2).str("SCD").le(uint8_t{1}).le(uint8_t{0}).le(uint8_t{1});
  for (int i = 0; i < 128; ++i) v2.le(uint8_t{9});
  core = Loaded<SSelCoreData>(v2.b);
  EXPECT_EQ(core.Version, 2);
  EXPECT_TRUE(core.InterActive);
  EXPECT_EQ(core.Option, 0u);
  EXPECT_EQ(core.UserData[0], 9);

  Bytes v1 = Bytes().u16(1).str("any tag").le(uint8_t{1}).le(uint8_t{7});
  SetSampleCore(core);
  CVXMemFile in(v1.b.data(), v1.b.size());
  core.Load(&in, true);
  EXPECT_EQ(in.Remaining(), 0u);
  EXPECT_TRUE(core.Active && core.NeedsOriginals);
  EXPECT_FALSE(core.InterActive);
  EXPECT_EQ(core.Option, 0u);
  EXPECT_EQ(core.UserData[5], 0);
  EXPECT_EQ(ThrownCode([&] { core.Load(nullptr, true); }), VX_NOT_FOUND);
}

TEST(SelFeatures, FolderAndCategoryStreams) {
  auto folders = Fresh<SSelFolders>();
  folders.Folders = {5, 6};
  folders.Op = 0x33, folders.Recursive = 1, folders.Mode = 0x44;
  ExpectRecord(folders,
               Head(2, "SFL", true).u32(2).u32(5).u32(6).u32(0x33).le(uint8_t{1}).u32(0x44));

  // Version 1 has no Mode and means the listed folders.
  SSelFolders old =
      Loaded<SSelFolders>(Head(1, "SFL").u32(1).u32(9).u32(0).le(uint8_t{0}).b, false);
  EXPECT_EQ(old.Mode, 1u);
  EXPECT_EQ(old.Folders, std::vector<uint32_t>{9});

  // A count beyond the stream fails before anything is sized for it.
  Bytes huge = Head(2, "SFL").u32(0x40000000).u32(1);
  CVXMemFile in(huge.b.data(), huge.b.size());
  EXPECT_EQ(ThrownCode([&] { old.Load(&in, false); }), VX_NOT_FOUND);

  auto cats = Fresh<SSelCategories>();
  cats.Mode = 2, cats.Categories = {0xFFFFEFFF}, cats.Op = 1;
  ExpectRecord(cats, Head(1, "SCT", true).u32(2).u32(1).u32(0xFFFFEFFF).u32(1));
}

TEST(SelFeatures, FileNameStreamKeepsNeedsOriginalsInStepWithMode) {
  auto r = Fresh<SSelFileName>();
  r.Mode = 1, r.Pattern = "IMG_*.jpg", r.Invert = 7;
  ExpectRecord(r, Head(2, "SFN", true, true).u32(1).str("IMG_*.jpg").u32(7));

  // Store sets the flag from Mode, and so does Load whatever the core block says.
  r.Mode = 2, r.NeedsOriginals = true;
  std::vector<uint8_t> bytes = Stored(r);
  EXPECT_EQ(bytes[10], 0);  // NeedsOriginals of the core block, after version, tag and Active
  bytes[10] = 1;
  EXPECT_FALSE(Loaded<SSelFileName>(bytes).NeedsOriginals);

  Bytes v1 = Head(1, "SFN").u32(0).str("x");
  auto old = Fresh<SSelFileName>();
  old.Invert = 5;
  CVXMemFile in(v1.b.data(), v1.b.size());
  old.Load(&in, false);
  EXPECT_EQ(old.Invert, 0u);
  EXPECT_TRUE(old.NeedsOriginals);
}

TEST(SelFeatures, FormatSizeDateAndDimensionStreamsAndResetDates) {
  auto r = Fresh<SSelFileFormat>();
  r.Formats.Resize(64);
  r.Formats.Set(1), r.Formats.Set(5), r.Formats.Set(40);
  r.ListMode = 0x11, r.GrayScaleMode = 0x22;
  Bytes want = Head(1, "SFF", true).u32(8).u32(0x22).u32(0x100).u32(0x11).u32(0x22);
  ExpectRecord(r, want);
  EXPECT_TRUE(Loaded<SSelFileFormat>(want.b).Formats.Get(40));

  auto size = Fresh<SSelFileSize>();
  size.Mode = 1, size.MaxKB = 2, size.MinKB = 3, size.TolerancePercent = 4;
  ExpectRecord(size, Head(1, "SFS", true).u32(2).u32(3).u32(4).u32(1));

  auto dt = Fresh<SSelFileDateTime>();
  time_t from = dt.From, to = dt.To;  // Reset gives dates that mktime has normalised
  std::tm f = *std::localtime(&from), t = *std::localtime(&to);
  EXPECT_EQ(f.tm_year * 10000 + f.tm_mon * 100 + f.tm_mday, 700101);   // 1 February 1970
  EXPECT_EQ(t.tm_year * 10000 + t.tm_mon * 100 + t.tm_mday, 1370031);  // 31 January 2037
  dt.Mode = 1, dt.Relation = 2, dt.Amount = 3, dt.Unit = 4, dt.Direction = 5;
  dt.From = 6, dt.To = 7;
  ExpectRecord(dt, Head(1, "SDT", true).u32(2).u32(1).u32(3).u32(4).u32(5).u32(6).u32(7));

  auto dim = Fresh<SSelDimensions>();
  dim.Mode = 1, dim.SubMode = 2, dim.TolerancePercent = 3, dim.MaxHeight = 4;
  dim.MinHeight = 5, dim.MaxWidth = 6, dim.MinWidth = 7, dim.Orientation = 8;
  ExpectRecord(dim, Head(1, "SDM", true).u32(3).u32(4).u32(5).u32(6).u32(7).u32(1).u32(8).u32(2));
}

Bytes LimitsStream(uint16_t version, uint32_t maxResults) {
  Bytes b = Head(version, "SLM").u32(2).u32(0).u32(60).u32(50).u32(maxResults).u32(3);
  if (version >= 2) b.u32(4);
  return b;
}

TEST(SelFeatures, LimitsStreamAndMaxResultsFixUps) {
  EXPECT_EQ(SSelLimits().MaxResults, 0u);  // a fresh record is not reset
  auto r = Fresh<SSelLimits>();
  r.ExactDuplicates = 2, r.Mode = 0, r.MinScore = 60, r.MaxResults = 7, r.DropEmpty = 3;
  r.PropsAny = 4;
  Bytes block = LimitsStream(3, 7);
  ExpectRecord(r, SampleCore().raw(block.b.data(), block.b.size()));

  auto maxResults = [](uint16_t version, uint32_t stored) {
    return Loaded<SSelLimits>(LimitsStream(version, stored).b, false).MaxResults;
  };
  EXPECT_EQ(maxResults(3, 40000), 32000u);
  EXPECT_EQ(maxResults(2, 1), 500u);
  EXPECT_EQ(maxResults(3, 1), 1u);
  EXPECT_EQ(maxResults(1, 1), 1u);
  SSelLimits old = Loaded<SSelLimits>(LimitsStream(1, 7).b, false);
  EXPECT_EQ(old.PropsAny, 0u);
  EXPECT_EQ(old.ExactDuplicates, 2u);
  EXPECT_EQ(old.DropEmpty, 3u);
}

TEST(SelFeatures, ColorAndMaskReadTheirFixedSizeWhateverTheCount) {
  auto color = Fresh<SSelColor>();
  color.Mode = 1, color.Tolerance = 20;
  for (uint32_t i = 0; i < 400; ++i) color.Colors[i].Value = i * 0x01010101u;
  Bytes want = Head(1, "SDC", true).u32(1).u32(20).u32(1600);
  for (uint32_t i = 0; i < 400; ++i) want.u32(i * 0x01010101u);
  ExpectRecord(color, want);
  Bytes odd = Head(1, "SDC").u32(0).u32(0).u32(4);
  odd.b.resize(odd.b.size() + 1600, 0x7F);
  EXPECT_EQ(Loaded<SSelColor>(odd.b, false).Colors[399].Value, 0x7F7F7F7Fu);

  auto mask = Fresh<SSelMask>();
  mask.MaskMode = 3;
  mask.Cells[0] = 0, mask.Cells[399] = 9;
  want = Head(1, "SMA", true).u32(3).u32(400).le(uint8_t{0});
  want.b.resize(want.b.size() + 398, 1);
  want.le(uint8_t{9});
  ExpectRecord(mask, want);
  odd = Head(1, "SMA").u32(0).u32(0xFFFFFFFF);
  odd.b.resize(odd.b.size() + 400, 4);
  EXPECT_EQ(Loaded<SSelMask>(odd.b, false).Cells[200], 4);

  // Reset: every colour white and unused, every cell of weight 1.
  color.Reset(), mask.Reset();
  EXPECT_EQ(color.Colors[399].Value, 0x00FFFFFFu);
  EXPECT_EQ(mask.Cells[0] + mask.Cells[399], 2);
}

TEST(SelFeatures, MatchStreamStartsFromReset) {
  auto r = Fresh<SSelMatch>();
  r.Method = 2, r.Precision = 1, r.Weighting = 3, r.LumaWeight = 10, r.ColorWeight = 40;
  r.Rotate = false, r.Fast = true;
  ExpectRecord(r, Head(2, "SDMA", true).u32(2).u32(1).u32(3).u32(10).u32(40).u32(0).u32(1));

  // Version 1 has no Fast. Without the core block the core comes back as Reset leaves it.
  Bytes v1 = Head(1, "SDMA").u32(0).u32(0).u32(0).u32(0).u32(0).u32(5);
  SetSampleCore(r);
  CVXMemFile in(v1.b.data(), v1.b.size());
  r.Load(&in, false);
  EXPECT_TRUE(r.Rotate);
  EXPECT_FALSE(r.Fast || r.Active || r.InterActive);
  EXPECT_EQ(r.UserData[1], 0);
}

void Condition(Bytes& b, uint32_t op, uint32_t matchMode, uint32_t flags, uint32_t value) {
  b.u32(op).u32(matchMode).u32(flags).u32(0).u32(0).u32(vptUInt32).u32(value);
}

TEST(SelFeatures, PropsStreamWritesThreeConditionsAndReadsAnyCount) {
  auto r = Fresh<SSelProps>();
  r.DataType = vptUInt32, r.Table = "Images", r.Column = "Rating", r.MatchEmpty = true;
  r.Invert = 1;
  for (uint32_t i = 0; i < 3; ++i) {
    r.Conditions[i].Op = i + 1, r.Conditions[i].Flags = 0x10 + i;
    r.Conditions[i].Value = CVXProperty(uint32_t{100 + i});
  }
  Bytes want = Head(2, "SDPS", true).u32(vptUInt32).str("Images").str("Rating").u32(1).u32(3);
  for (uint32_t i = 0; i < 3; ++i) Condition(want, i + 1, 1, 0x10 + i, 100 + i);
  want.u32(1);
  ExpectRecord(r, want);
  EXPECT_EQ(SSelProps::GenerateID("Images", "Rating"), "VXSELProperties.Images.Rating");

  // One condition: the others read as Reset leaves them. Four: the fourth is read and dropped.
  // Version 1 has no Invert.
  for (uint32_t count : {1u, 4u}) {
    Bytes v1 = Head(1, "SDPS").u32(0).str("T").str("C").u32(0).u32(count);
    for (uint32_t i = 0; i < count; ++i) Condition(v1, 9, 2, 0, i);
    SSelProps got = Loaded<SSelProps>(v1.b, false);
    EXPECT_EQ(got.Invert, 0u);
    EXPECT_EQ(got.Conditions[0].Op, 9u);
    EXPECT_EQ(got.Conditions[2].Op, count == 1 ? 0u : 9u);
    EXPECT_EQ(got.Conditions[2].MatchMode, count == 1 ? 1u : 2u);
  }
}

TEST(SelFeatures, XmpStreamVersions) {
  auto r = Fresh<SSelXMP>();
  r.UseField = 1, r.Reserved = 2, r.Field = "dc:subject", r.Query = "cat", r.Flag = true;
  r.Exclude = 1;
  ExpectRecord(r, Head(3, "SDXM", true).u32(1).u32(2).str("dc:subject").str("cat").u32(1).u32(1));

  SSelXMP got = Loaded<SSelXMP>(Head(2, "SDXM").u32(0).u32(0).str("").str("q").u32(7).b, false);
  EXPECT_TRUE(got.Flag);
  EXPECT_EQ(got.Exclude, 0u);
  EXPECT_FALSE(Loaded<SSelXMP>(Head(1, "SDXM").u32(0).u32(0).str("").str("q").b, false).Flag);
}

}  // namespace
