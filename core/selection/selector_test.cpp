#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "VXSelFeatures.h"
#include "VXSelImageFeatures.h"
#include "VXSelPropFeatures.h"
#include "VXSelector.h"
#include "seltest_util.h"

namespace {

using seltest::Blob;
using seltest::Bytes;
using seltest::Content;
using seltest::Streamed;

// A bare core block as a feature: what the flag queries read.
CVXMemFile CoreBlob(bool active, bool interActive, bool needsOriginals = false) {
  SSelCoreData core;
  core.Active = active, core.InterActive = interActive, core.NeedsOriginals = needsOriginals;
  return Blob(core);
}

CVXMemFile FoldersBlob(bool active, uint32_t mode) {
  auto folders = seltest::Fresh<SSelFolders>();
  folders.Active = active, folders.Mode = mode;
  return Blob(folders);
}

TEST(Selector, StreamMatchesTheHandBuiltBytesAndOrsInTheFeaturesNeeds) {
  CVXSelector sel;
  sel.Oid() = 0x0A0B0C0D;
  sel.Properties().Name = "Similar";
  sel.SetFeature("b", CVXMemFile("\x01\x02", 2));
  sel.SetFeature("VXSELLimits", seltest::Blob(SSelCoreData()));
  Bytes want;
  want.u16(1).u32(0x0A0B0C0D).u16(1).str("Similar").le(uint8_t{0}).u32(2);
  // Keys in byte order: upper case before lower case.
  Bytes core = seltest::PlainCore(false, false, false);
  want.str("VXSELLimits").u32(core.b.size()).raw(core.b.data(), core.b.size());
  want.str("b").u32(2).le(uint8_t{1}).le(uint8_t{2});
  EXPECT_EQ(Streamed(sel), want.b);

  CVXSelector back;
  back.Properties().ActiveFolder = 7;
  back.SetFeature("stale", CVXMemFile());
  seltest::ExpectPrefixesFail(want.b, back);

  // The stream says no originals, a feature says it needs them: the need wins.
  Bytes needs = seltest::PlainCore(true, true, false);
  std::copy(needs.b.begin(), needs.b.end(), want.b.begin() + 43);
  back = seltest::Read(want.b, back);
  EXPECT_EQ(back.Oid(), 0x0A0B0C0Du);
  EXPECT_TRUE(back.Properties().NeedsOriginals);
  EXPECT_EQ(back.Properties().Features.size(), 2u);
  EXPECT_EQ(back.Properties().ActiveFolder, 7u);  // not persisted, so not touched
  EXPECT_TRUE(back.HasSelectorForKey("VXSELLimits"));
  CVXMemFile blob;
  ASSERT_TRUE(back.GetFeature("b", blob));
  EXPECT_EQ(blob.GetPosition(), 0u);
  EXPECT_EQ(Content(blob), (std::vector<uint8_t>{1, 2}));
  EXPECT_FALSE(back.GetFeature("stale", blob));
}

TEST(Selector, FlagQueriesReadTheFeatureCores) {
  CVXSelector sel;
  EXPECT_FALSE(sel.IsInterActive() || sel.HasActiveMask() || sel.HasPropertySelector() ||
               sel.WorksWithActiveFolder() || sel.WorksWithActiveCategory() ||
               sel.NeedsVXShapeData() || sel.HasSelectorForKey("VXSELColor"));

  sel.SetFeature("VXSELColor", CoreBlob(false, true));
  sel.SetFeature("VXSELMask", CoreBlob(true, false));
  sel.SetFeature(SSelProps::GenerateID("T", "C"), CoreBlob(true, false));
  EXPECT_FALSE(sel.NeedsVXShapeData());  // colour present but inactive
  EXPECT_FALSE(sel.IsInterActive());     // the interactive one is inactive
  EXPECT_FALSE(sel.HasActiveMask());     // active but not interactive
  EXPECT_TRUE(sel.HasPropertySelector());

  sel.SetFeature("VXSELMatch", CoreBlob(true, false));
  sel.SetFeature("VXSELMask", CoreBlob(true, true));
  EXPECT_TRUE(sel.NeedsVXShapeData());
  EXPECT_TRUE(sel.HasActiveMask());
  EXPECT_TRUE(sel.IsInterActive());

  // A blob that does not hold a core block counts as an inactive feature.
  sel.SetFeature("VXSELXMP", CVXMemFile("\x03", 1));
  EXPECT_FALSE(sel.HasSelectorForKey("VXSELXMP"));
}

TEST(Selector, ActiveFolderAndCategoryLookOnlyAtTheFirstKeyFound) {
  CVXSelector sel;
  sel.SetFeature("VXSELFolders", FoldersBlob(true, 0));
  EXPECT_TRUE(sel.WorksWithActiveFolder());
  sel.SetFeature("VXSELFolders", FoldersBlob(true, 2));  // any Mode but 0 is not enough
  EXPECT_FALSE(sel.WorksWithActiveFolder());
  sel.SetFeature("VXSELFolders", FoldersBlob(true, 0));
  sel.SetFeature("A.VXSELFolders", FoldersBlob(false, 0));  // sorts first
  EXPECT_FALSE(sel.WorksWithActiveFolder());

  auto cats = seltest::Fresh<SSelCategories>();
  cats.Active = true, cats.Mode = 2;
  sel.SetFeature("VXSELCategories", Blob(cats));
  EXPECT_TRUE(sel.WorksWithActiveCategory());
  cats.Mode = 0;
  sel.SetFeature("VXSELCategories", Blob(cats));
  EXPECT_FALSE(sel.WorksWithActiveCategory());
}

TEST(Selector, EqualityAndCopies) {
  CVXSelector a;
  a.Oid() = 3;
  a.Properties().Name = "Same";
  CVXSelector b = a;
  b.Properties().Name = "SAME";
  b.Properties().Scratch[0] = 1, b.Properties().ActiveFolder = 9;
  EXPECT_TRUE(a == b);  // empty selectors; Scratch and the active folder play no part

  a.SetFeature("k", CoreBlob(true, false));
  CVXSelector copy = a;
  EXPECT_TRUE(copy == a);
  a.Properties().Features["k"].Write("x", 1);  // the copy holds its own blob
  EXPECT_FALSE(copy == a);
  b.SetFeature("j", CoreBlob(true, false));
  EXPECT_FALSE(copy == b);  // same count, other key
  b = copy;
  b.Properties().NeedsOriginals = true;
  EXPECT_FALSE(copy == b);
  b = copy;
  b.Oid() = 4;
  EXPECT_FALSE(copy == b);

  b = copy;
  b.Clear();
  EXPECT_TRUE(b.Properties().Features.empty());
  EXPECT_EQ(b.Properties().Name, "Same");
  EXPECT_EQ(b.Oid(), 3u);
}

}  // namespace
