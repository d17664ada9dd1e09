#include <gtest/gtest.h>

#include <cmath>
#include <map>
#include <string>
#include <vector>

#include "Hist.h"
#include "MatchKernels.h"
#include "VXColor.h"
#include "VXSelBase.h"
#include "VXSelEngine.h"
#include "VXSelector.h"
#include "seltest_util.h"
#include "vxengine_fixture.h"

// The worker is exercised through real runs on a small catalog: the hits of a run and their
// scores are what its preselection and checks decide.

namespace {

using Hits = std::map<std::string, double>;  // file name to score
using Names = std::vector<std::string>;

template <typename T>
T Feature() {
  T record = seltest::Fresh<T>();
  record.Active = true;
  return record;
}

SSelProps Prop(const std::string& column, uint32_t type) {
  auto p = Feature<SSelProps>();
  p.Table = "Image Properties", p.Column = column, p.DataType = type;
  return p;
}

template <typename T>
void Put(CVXSelector& selector, const T& record) {
  selector.SetFeature(T::kKey, seltest::Blob(record));
}
void Put(CVXSelector& selector, const SSelProps& record) {
  selector.SetFeature(SSelProps::GenerateID(record.Table, record.Column), seltest::Blob(record));
}

// Limits that keep every hit, so the checks' own scores show; a later SSelLimits replaces them.
template <typename... T>
CVXSelector Make(const T&... records) {
  CVXSelector selector;
  auto open = seltest::Fresh<SSelLimits>();
  open.Mode = 0;
  Put(selector, open);
  (Put(selector, records), ...);
  return selector;
}

SVXDBRec_3 Uniform(uint8_t c1, uint8_t c2, uint8_t c3) {
  SVXDBRec_3 shape{};
  for (auto& cell : shape.Info.Cells) cell = {c1, c2, c3, 255};
  return shape;
}

struct FileInfo {
  std::string name;
  uint32_t w = 400, h = 300, size = 1000, format = 1;
  int32_t time = 0;
  bool grey = false;
  uint32_t folder = 0;
  SVXDBRec_3 shape{};
};

class SelBaseTest : public vxtest::EngineFixture {
 protected:
  void SetUp() override {
    EngineFixture::SetUp();
    pics_ = AddFolder("/pics/");
  }

  uint32_t Add(const FileInfo& f) {
    CVXCatFile file(0, f.name, f.folder ? f.folder : pics_);
    CVXCatFile::SData& p = file.Properties();
    p.Width = f.w, p.Height = f.h, p.Size = f.size, p.Format = f.format;
    p.EmbeddedTime = f.time, p.Flags = f.grey ? cfGreyscale : 0;
    CVXThumb thumb = vxtest::MakeThumb(4, 4, 16, 1);
    EXPECT_EQ(engine_.AddFile(file, thumb, f.shape), VX_OK) << f.name;
    names_[file.Oid()] = f.name;
    oids_[f.name] = file.Oid();
    return file.Oid();
  }

  // The hits of all entries of a run against the named originals (none: a run without).
  Hits Run(CVXSelector selector, const Names& originals = {}) {
    std::vector<SVXFileDescriptor> descriptors;
    for (const auto& name : originals) descriptors.push_back({oids_.at(name), pics_, CVXURI()});
    selector.Properties().NeedsOriginals = !originals.empty();
    CVXSelEngine run(&engine_);
    EXPECT_EQ(run.InitSelection(selector, descriptors), VX_OK);
    CVXResultSet result;
    EXPECT_EQ(run.Run(result), VX_OK);
    Hits hits;
    for (const auto& entry : result.Properties().Entries) {
      for (const auto& hit : entry.Hits) hits[names_.at(hit.OID)] = hit.Score;
    }
    return hits;
  }

  // The names of the hits only.
  Names Found(const CVXSelector& selector, const Names& originals = {}) {
    Names names;
    for (const auto& hit : Run(selector, originals)) names.push_back(hit.first);
    return names;
  }

  uint32_t pics_ = 0;
  std::map<uint32_t, std::string> names_;
  std::map<std::string, uint32_t> oids_;
};

// Same names, scores equal but for rounding.
::testing::AssertionResult Same(const Hits& got, const Hits& want) {
  bool ok = got.size() == want.size();
  for (const auto& [name, score] : want) {
    ok = ok && got.count(name) && std::fabs(got.at(name) - score) < 1e-9;
  }
  if (ok) return ::testing::AssertionSuccess();
  std::string text;
  for (const auto& [name, score] : got) text += " " + name + "=" + std::to_string(score);
  return ::testing::AssertionFailure() << "hits:" << text;
}

// ---- Scores, averaging and the gate, on file sizes

TEST_F(SelBaseTest, FileSizeScoresAverageOverFeaturesAndTheGateRejectsEarly) {
  Add({.name = "o", .size = 100000});
  Add({.name = "smaller", .size = 95000});  // 5 % off: 95
  Add({.name = "lo", .size = 102400});      // 100 KB; 2.4 % off: 98
  Add({.name = "near", .size = 110000});    // 10 % off: 90
  Add({.name = "far", .size = 130000});     // 30 % off: 70, below the gate
  Add({.name = "hi", .size = 204800});      // 200 KB; beyond the tolerance
  Add({.name = "over", .size = 204801});
  auto size = Feature<SSelFileSize>();
  size.TolerancePercent = 50;
  EXPECT_TRUE(
      Same(Run(Make(size), {"o"}), {{"smaller", 95}, {"lo", 98}, {"near", 90}, {"far", 70}}));
  auto limits = Feature<SSelLimits>();  // Mode 1, MinScore 75
  limits.Mode = 0;
  EXPECT_TRUE(Same(Run(Make(limits, size), {"o"}),
                   {{"smaller", 97.5}, {"lo", 99}, {"near", 95}, {"far", 85}}));

  // With the gate, a candidate below MinScore never reaches the later checks: the property
  // check, last in line, reads a row only for the three that pass.
  limits.Mode = 1;
  vxtest::DefineColumns(engine_, 1);
  auto props = Prop("p0", vptUInt32);
  props.MatchEmpty = true, props.Conditions[0].High = CVXProperty(100u);
  auto rowReads = [&] {
    return log_.Count("+ VXEngine::GetImageProperties") -
           log_.Count("+ VXEngine::GetImagePropertiesTable");
  };
  const size_t before = rowReads();
  EXPECT_TRUE(Same(Run(Make(limits, size, props), {"o"}),
                   {{"smaller", 295 / 3.}, {"lo", 298 / 3.}, {"near", 290 / 3.}}));
  EXPECT_EQ(rowReads() - before, 3u);

  size.Mode = 1, size.MinKB = 100, size.MaxKB = 200;  // bounds inclusive
  EXPECT_EQ(Found(Make(size)), (Names{"far", "hi", "lo", "near"}));
  size.Mode = 2;
  EXPECT_TRUE(Run(Make(size)).empty());
}

// ---- Preselection

TEST_F(SelBaseTest, FormatsByListOrOriginalsWithTheGreyScaleRules) {
  Add({.name = "o", .format = 5});
  Add({.name = "same", .format = 5});
  Add({.name = "grey", .format = 5, .grey = true});
  Add({.name = "other", .format = 3});
  auto format = Feature<SSelFileFormat>();  // ListMode 1, GrayScaleMode 1
  EXPECT_TRUE(Same(Run(Make(format), {"o"}), {{"same", 100}, {"grey", 75}, {"other", 100}}));
  format.Formats.Set(3);
  EXPECT_TRUE(Same(Run(Make(format), {"o"}), {{"other", 100}}));
  format.ListMode = 0;
  EXPECT_TRUE(Same(Run(Make(format), {"o"}), {{"same", 100}, {"grey", 75}}));
  format.GrayScaleMode = 0;
  EXPECT_TRUE(Same(Run(Make(format), {"o"}), {{"same", 100}}));
}

TEST_F(SelBaseTest, CategoriesByListOriginalsOrActiveCategory) {
  for (const char* name : {"a", "b", "c", "d"}) Add({.name = name});
  auto group = [&](const char* name, const Names& files) {
    CVXGroup g;
    g.Name() = name;
    for (const auto& file : files) g.Images().Set(oids_[file]);
    EXPECT_EQ(engine_.AddGroup(g), VX_OK) << name;
    return g.Oid();
  };
  const uint32_t g1 = group("g1", {"a", "b"}), g2 = group("g2", {"b", "c"});
  auto cats = Feature<SSelCategories>();
  cats.Mode = 1;
  EXPECT_EQ(Found(Make(cats)), (Names{"a", "b", "c", "d"}));  // empty list: no effect
  cats.Categories = {g1, g2};
  EXPECT_EQ(Found(Make(cats)), (Names{"a", "b", "c"}));
  cats.Op = 1;
  EXPECT_EQ(Found(Make(cats)), (Names{"b"}));
  cats.Mode = 0;  // the categories of the originals
  EXPECT_EQ(Found(Make(cats), {"a"}), (Names{"b"}));
  EXPECT_EQ(Found(Make(cats), {"d"}), (Names{"a", "b", "c"}));
  cats.Mode = 2;
  CVXSelector selector = Make(cats);
  EXPECT_EQ(Found(selector), (Names{"a", "b", "c", "d"}));
  selector.Properties().ActiveCategory = g2;
  EXPECT_EQ(Found(selector), (Names{"b", "c"}));
}

TEST_F(SelBaseTest, FoldersByListOrActiveFolder) {
  const uint32_t sub = AddFolder("/pics/sub/"), other = AddFolder("/other/");
  Add({.name = "a"});
  Add({.name = "s", .folder = sub});
  Add({.name = "x", .folder = other});
  auto folders = Feature<SSelFolders>();
  folders.Mode = 1;
  EXPECT_TRUE(Run(Make(folders)).empty());  // an empty list leaves no candidate
  folders.Folders = {pics_, other};
  EXPECT_EQ(Found(Make(folders)), (Names{"a", "x"}));
  folders.Recursive = 1;
  EXPECT_EQ(Found(Make(folders)), (Names{"a", "s", "x"}));
  folders.Op = 1;
  EXPECT_TRUE(Run(Make(folders)).empty());
  folders.Mode = 0;
  CVXSelector selector = Make(folders);
  EXPECT_EQ(Found(selector), (Names{"a", "s", "x"}));
  selector.Properties().ActiveFolder = pics_;
  EXPECT_EQ(Found(selector), (Names{"a", "s"}));
}

TEST_F(SelBaseTest, XMPQueryKeepsOrRemovesItsFiles) {
  const uint32_t a = Add({.name = "a"}), b = Add({.name = "b"});
  Add({.name = "c"});
  ASSERT_EQ(engine_.SetXMPFTI(a, {{"dc:subject", "beach sun"}}), VX_OK);
  ASSERT_EQ(engine_.SetXMPFTI(b, {{"dc:title", "beach"}}), VX_OK);
  auto xmp = Feature<SSelXMP>();
  xmp.Query = "beach", xmp.Flag = true;
  EXPECT_EQ(Found(Make(xmp)), (Names{"a", "b"}));
  xmp.UseField = 1, xmp.Field = "dc:subject";
  EXPECT_EQ(Found(Make(xmp)), (Names{"a"}));
  xmp.Exclude = 1;
  EXPECT_EQ(Found(Make(xmp)), (Names{"b", "c"}));
}

// ---- Dimensions and orientation

TEST_F(SelBaseTest, DimensionsRelativeAbsoluteAndByOrientation) {
  Add({.name = "o", .w = 400, .h = 300});
  Add({.name = "near", .w = 440, .h = 330});
  Add({.name = "tall", .w = 400, .h = 600});
  Add({.name = "square", .w = 300, .h = 300});
  Add({.name = "wide", .w = 800, .h = 450});
  auto dim = Feature<SSelDimensions>();
  // Orientation 0, relative: the originals are all landscape, so portraits go before the loop.
  EXPECT_EQ(Found(Make(dim), {"o"}), (Names{"near", "square", "wide"}));
  EXPECT_EQ(Found(Make(dim), {"tall"}), (Names{"square"}));
  EXPECT_EQ(Run(Make(dim), {"o", "tall"}).size(), 5u);  // mixed: no cut
  dim.TolerancePercent = 100;  // two-sided score stays 100 up to a sum of 100 %
  EXPECT_TRUE(Same(Run(Make(dim), {"o"}), {{"near", 100}, {"square", 100}, {"wide", 50}}));
  dim.TolerancePercent = 30, dim.SubMode = 1;
  EXPECT_TRUE(Same(Run(Make(dim), {"o"}), {{"near", 90}, {"square", 75}}));
  dim.SubMode = 2;
  EXPECT_TRUE(Same(Run(Make(dim), {"o"}), {{"near", 90}, {"square", 100}}));

  dim.Mode = 1, dim.MinWidth = 350;
  EXPECT_EQ(Found(Make(dim), {"o"}), (Names{"near", "tall", "wide"}));
  dim.Orientation = 1;  // as the original
  EXPECT_EQ(Found(Make(dim), {"o"}), (Names{"near", "wide"}));
  dim.MinWidth = 0, dim.Orientation = 3;
  EXPECT_EQ(Found(Make(dim), {"o"}), (Names{"square", "tall"}));
  dim.Orientation = 2;
  EXPECT_EQ(Found(Make(dim), {"o"}), (Names{"near", "square", "wide"}));
}

// ---- Date and name

TEST_F(SelBaseTest, DateTimeRangesRelationsAndDistances) {
  const int32_t t0 = 1000000000, day = 86400;
  Add({.name = "o", .time = t0});
  Add({.name = "m3", .time = t0 - 3 * day});
  Add({.name = "m1", .time = t0 - day + 1});  // under one whole day
  Add({.name = "p10", .time = t0 + 10 * day});
  Add({.name = "p400", .time = t0 + 400 * day});
  auto dt = Feature<SSelFileDateTime>();
  struct Case {
    uint32_t relation, amount, unit, direction;
    Names hits;
  } cases[] = {
      {1, 0, 0, 0, {"m1", "m3"}}, {2, 0, 0, 0, {"p10", "p400"}},
      {0, 0, 0, 0, {"m1"}},       {0, 1, 1, 0, {"m1", "m3"}},
      {0, 1, 2, 2, {"p10"}},      {0, 1, 3, 0, {"m1", "m3", "p10"}},
      {0, 1, 3, 1, {"m1", "m3"}}, {0, 1, 3, 3, {}},
      {3, 0, 0, 0, {}},
  };
  for (const Case& c : cases) {
    dt.Relation = c.relation, dt.Amount = c.amount, dt.Unit = c.unit, dt.Direction = c.direction;
    EXPECT_EQ(Found(Make(dt), {"o"}), c.hits) << c.relation << c.amount << c.unit;
  }
  dt.Mode = 1, dt.From = t0 - 3 * day, dt.To = t0 + 10 * day;
  EXPECT_EQ(Found(Make(dt)), (Names{"m1", "m3", "o", "p10"}));
}

TEST_F(SelBaseTest, FileNameModesAndInvert) {
  Add({.name = "img1.jpg"});
  Add({.name = "img2.jpg"});
  Add({.name = "img12.jpg"});
  Add({.name = "IMG-beach.png"});
  auto name = Feature<SSelFileName>();
  Hits smart = Run(Make(name), {"img1.jpg"});
  EXPECT_EQ(smart["img2.jpg"], 100);
  EXPECT_NEAR(smart["img12.jpg"], 100 - 5 * 1.5 * 99.6 * 0.01, 1e-9);
  EXPECT_EQ(smart.size(), 3u);  // these modes rank, never reject
  name.Mode = 1;
  EXPECT_EQ(Run(Make(name), {"img1.jpg"})["IMG-beach.png"], 100);
  name.Invert = 1;
  EXPECT_TRUE(Run(Make(name), {"img1.jpg"}).empty());

  name.Invert = 0, name.Mode = 2,
  name.Pattern = "^img[0-9]$";  // no dot: the name without its extension
  EXPECT_TRUE(Same(Run(Make(name)), {{"img1.jpg", 100}, {"img2.jpg", 100}}));
  name.Invert = 1;
  EXPECT_TRUE(Same(Run(Make(name)), {{"IMG-beach.png", 100}, {"img12.jpg", 100}}));
  name.Invert = 0, name.Pattern = "2\\.jpg$";
  EXPECT_EQ(Found(Make(name)), (Names{"img12.jpg", "img2.jpg"}));
  name.Mode = 3, name.Pattern = "+img -12 -beach";
  EXPECT_EQ(Found(Make(name)), (Names{"img1.jpg", "img2.jpg"}));
  name.Mode = 4;
  EXPECT_TRUE(Run(Make(name)).empty());
}

// ---- Colour and shape

TEST_F(SelBaseTest, ColorAtPlaceScoresMarkedCellsWithinTolerance) {
  const SVXColor red{{255, 0, 0, 255}};
  uint8_t c1, c2, c3;
  RGB2C3(red, c1, c2, c3);
  SVXDBRec_3 shape = Uniform(0, 0, 0);
  shape.Info.Cells[0] = shape.Info.Cells[1] = {c1, c2, c3, 255};
  shape.Info.Cells[2] = {static_cast<uint8_t>(c1 + 10), c2, c3, 0};  // d = 5
  Add({.name = "a", .shape = shape});
  auto color = Feature<SSelColor>();
  color.Tolerance = 10;  // up to a distance of 3 * 26
  for (int i = 0; i < 4; ++i) color.Colors[i] = red;
  EXPECT_TRUE(Same(Run(Make(color)), {{"a", (765 + 765 + 760) / 306000.0 / 0.01 * 100}}));
  // No marked cell: 0 / 0, which no cut-off accepts.
  color = Feature<SSelColor>();
  EXPECT_TRUE(Run(Make(color)).empty());
}

TEST_F(SelBaseTest, ColorAnywhereTakesEachCellOnceAndAtMost20PerColour) {
  const SVXColor red{{255, 0, 0, 255}}, blue{{0, 0, 255, 255}};
  uint8_t c1, c2, c3;
  RGB2C3(red, c1, c2, c3);
  for (int reds : {10, 30}) {
    SVXDBRec_3 shape = Uniform(0, 255, 0);  // cells say "shape 255": not a taken mark
    for (int i = 0; i < reds; ++i) shape.Info.Cells[i * 13] = {c1, c2, c3, 255};
    Add({.name = "r" + std::to_string(reds), .shape = shape});
  }
  auto color = Feature<SSelColor>();
  color.Mode = 1, color.Tolerance = 10, color.Colors[0] = red;
  color.Colors[5] = blue;  // not a palette cell
  EXPECT_TRUE(Same(Run(Make(color)), {{"r10", 50}, {"r30", 100}}));
  color.Colors[20] = red;  // the second red gets what the first left
  EXPECT_TRUE(Same(Run(Make(color)), {{"r10", 25}, {"r30", 75}}));
}

TEST_F(SelBaseTest, MatchDispatchesByMethodAndBlendsTheHistogram) {
  const SVXDBRec_3 o = vxtest::MakeShape(1), c = vxtest::MakeShape(77);
  Add({.name = "o", .shape = o});
  Add({.name = "c", .shape = c});
  auto hist = [&](uint32_t weighting) {
    CHist ho, hc;
    ho.Build(o.Info, weighting);
    hc.Build(c.Info, weighting);
    double weight = 0;
    for (float bin : ho.Bins) weight += bin;
    return MatchHistogram(ho, std::trunc(weight), hc);
  };
  SVXMatchParams plain;
  plain.SetWeights(30, 25);
  auto match = Feature<SSelMatch>();  // method 2, quick, ColorWeight 25
  EXPECT_DOUBLE_EQ(Run(Make(match), {"o"})["c"], MatchCSQuick(o, c, plain));
  match.Precision = 1;
  EXPECT_DOUBLE_EQ(Run(Make(match), {"o"})["c"], MatchCSFuzzy(o, c, plain));
  match.Method = 0;
  EXPECT_DOUBLE_EQ(Run(Make(match), {"o"})["c"], MatchDuplicates(o, c, plain));
  match.Method = 1;
  EXPECT_DOUBLE_EQ(Run(Make(match), {"o"})["c"], hist(0));
  match.Method = 7, match.ColorWeight = 30;
  EXPECT_DOUBLE_EQ(Run(Make(match), {"o"})["c"], hist(0) * 0.5);

  // A mask weighs the worker's comparison only; the histogram keeps the selection's weighting.
  match.Method = 2, match.Precision = 0, match.ColorWeight = 25;
  auto mask = Feature<SSelMask>();
  for (int i = 0; i < 400; ++i) mask.Cells[i] = static_cast<uint8_t>(i % 3);
  SVXWeightMatrix masked;
  masked.SetMask(mask.Cells);
  SVXMatchParams p = plain;
  p.Weighting = 3, p.Weights = &masked;
  EXPECT_DOUBLE_EQ(Run(Make(match, mask), {"o"})["c"], MatchCSQuick(o, c, p));
  match.Weighting = 1, match.ColorWeight = 30;
  p.SetWeights(30, 30);
  EXPECT_DOUBLE_EQ(Run(Make(match, mask), {"o"})["c"], (hist(1) + MatchCSQuick(o, c, p)) * 0.5);
}

// ---- Properties

class SelBasePropsTest : public SelBaseTest {
 protected:
  void SetUp() override {
    SelBaseTest::SetUp();
    CVXTable table(VX_IMAGE_PROPERTIES_TABLE);
    table.Properties().Name = "Image Properties";
    table.AddColumn("Title", vptString, CVXProperty("DEFAULT"));
    table.AddColumn("Count", vptUInt32, CVXProperty(7u));
    table.AddColumn("Taken", vptDate);
    table.AddColumn("At", vptTime);
    table.AddColumn("Done", vptBool);
    table.AddColumn("Ref", vptReference);
    ASSERT_EQ(engine_.GetPropertyDatabase().SetTable(table), VX_OK);
    Row("red", {"RED CAR", 3u, CVXProperty::MakeDate(45000.25), CVXProperty::MakeTime(0.25), true,
                CVXProperty::MakeReference(42)});
    Row("blue", {"Blue car", 12u, CVXProperty::MakeDate(45010), CVXProperty::MakeTime(0.75), false,
                 CVXProperty::MakeReference(43)});
    Row("empty", std::vector<CVXProperty>(6));
    Add({.name = "norow"});  // reads as the column defaults
  }

  void Row(const std::string& name, const std::vector<CVXProperty>& row) {
    ASSERT_EQ(engine_.AddImageProperties(Add({.name = name}), row), VX_OK);
  }
};

TEST_F(SelBasePropsTest, StringWordsSubstringsAndEmpty) {
  struct Case {
    uint32_t mode;
    const char* value;
    uint32_t invert;
    Names hits;
  } cases[] = {
      {0, "+red -blue", 0, {"red"}},
      {0, "+red +blue", 0, {}},
      {0, "-blue", 0, {"empty", "norow", "red"}},
      {0, "blue", 0, {"blue"}},
      {0, "car", 0, {"blue", "red"}},
      {0, "^b", 0, {"blue"}},  // each word is a regular expression on each word
      {0, "(", 0, {}},
      {0, "+red -blue", 1, {"blue", "empty", "norow"}},
      {1, "d ca", 0, {"red"}},
      {1, "", 0, {"blue", "empty", "norow", "red"}},
      {2, "x", 0, {"empty"}},
  };
  for (const Case& c : cases) {
    SSelProps p = Prop("Title", vptString);
    p.Conditions[0].MatchMode = c.mode, p.Conditions[0].Value = CVXProperty(c.value);
    p.Invert = c.invert;
    EXPECT_EQ(Found(Make(p)), c.hits) << c.mode << " '" << c.value << "' " << c.invert;
  }
}

TEST_F(SelBasePropsTest, NumbersDatesTimesBoolsAndReferences) {
  auto range = [](SSelProps p, int i, const CVXProperty& low, const CVXProperty& high,
                  uint32_t op = 0) {
    p.Conditions[i].Low = low, p.Conditions[i].High = high, p.Conditions[i].Op = op;
    return p;
  };
  SSelProps count = range(Prop("Count", vptUInt32), 0, 0u, 10u);
  EXPECT_EQ(Found(Make(count)), (Names{"norow", "red"}));
  count.MatchEmpty = true;
  EXPECT_EQ(Found(Make(count)), (Names{"empty", "norow", "red"}));
  count.MatchEmpty = false;
  EXPECT_EQ(Found(Make(range(range(count, 0, 5u, 20u), 1, 10u, 15u, 3))), (Names{"norow"}));
  EXPECT_EQ(Found(Make(range(range(count, 0, 0u, 1u), 1, 12u, 12u, 1))), (Names{"blue"}));
  EXPECT_EQ(Found(Make(range(count, 1, 5u, 20u, 2))), (Names{"norow"}));

  SSelProps date = Prop("Taken", vptDate);
  date.MatchEmpty = true;  // an empty date fails all the same
  const CVXProperty none;
  EXPECT_EQ(Found(Make(range(date, 0, CVXProperty::MakeDate(45000), none))),
            (Names{"blue", "red"}));
  EXPECT_EQ(Found(Make(range(date, 0, CVXProperty::MakeDate(45000.9), none))),
            (Names{"blue", "red"}));  // whole days compare
  EXPECT_EQ(Found(Make(range(date, 0, none, CVXProperty::MakeDate(45005)))), (Names{"red"}));
  SSelProps time = Prop("At", vptTime);
  EXPECT_EQ(Found(Make(range(time, 0, CVXProperty::MakeTime(0.5), none))), (Names{"blue"}));

  SSelProps done = Prop("Done", vptBool);
  const std::vector<std::pair<uint32_t, Names>> byFlags = {
      {1, {"red"}}, {2, {"blue"}}, {4, {"empty", "norow"}}, {7, {"blue", "empty", "norow", "red"}}};
  for (const auto& [flags, hits] : byFlags) {
    done.Conditions[0].Flags = flags;
    EXPECT_EQ(Found(Make(done)), hits) << flags;
  }

  SSelProps ref = Prop("Ref", vptReference);
  ref.Conditions[0].Value = CVXProperty::MakeReference(42);
  EXPECT_EQ(Found(Make(ref)), (Names{"red"}));
  ref.Conditions[0].Op = 3;
  EXPECT_EQ(Found(Make(ref)), (Names{"blue"}));
  ref.Conditions[0].MatchMode = 2;
  EXPECT_EQ(Found(Make(ref)), (Names{"blue", "empty", "norow"}));
  ref.Conditions[0].Op = 0, ref.Conditions[1].Op = 1;
  ref.Conditions[1].Value = CVXProperty::MakeReference(43);
  EXPECT_EQ(Found(Make(ref)), (Names{"blue", "empty", "norow", "red"}));
}

TEST_F(SelBasePropsTest, AllOrAnyPropertyFeature) {
  SSelProps count = Prop("Count", vptUInt32);
  count.Conditions[0].High = CVXProperty(10u);  // red, norow
  SSelProps title = Prop("Title", vptString);
  title.Conditions[0].Value = CVXProperty("blue");  // substring: blue
  SSelProps missing = Prop("Nope", vptUInt32);      // after Count in key order
  auto limits = Feature<SSelLimits>();
  limits.Mode = 0;
  EXPECT_TRUE(Run(Make(limits, count, title)).empty());
  EXPECT_TRUE(Run(Make(limits, count, missing)).empty());
  limits.PropsAny = 1;
  EXPECT_TRUE(Same(Run(Make(limits, count, title)), {{"blue", 100}, {"norow", 100}, {"red", 100}}));
  // The first match decides: the unmappable column is never asked for these.
  EXPECT_EQ(Found(Make(limits, count, missing)), (Names{"norow", "red"}));
}

}  // namespace
