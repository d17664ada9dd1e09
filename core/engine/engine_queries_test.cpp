#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "QRLBlobDB.h"
#include "VXEngine.h"
#include "VXPropDB.h"
#include "VXResult.h"
#include "VXURI.h"
#include "vxbytes.h"
#include "vxcatalog_fixture.h"
#include "vxtest.h"

namespace {

using Sel = CQRLBlobDB::SSelector;
using Oids = std::vector<uint32_t>;

// An open engine; the fixture's shorthands fill its catalog directly.
class EngineQueries : public vxtest::CatalogFixture {
 protected:
  void SetUp() override {
    CatalogFixture::SetUp();
    info_.Name = dir_ / "db.vxm";
    ASSERT_EQ(engine_.Create(info_), VX_OK);
  }

  void Reopen(bool readOnly) {
    ASSERT_EQ(engine_.Close(), VX_OK);
    info_.ReadOnly = readOnly;
    ASSERT_EQ(engine_.Open(info_), VX_OK);
  }

  static Oids Members(const CBitVector& bits) {
    Oids oids;
    bits.Convert(oids);
    return oids;
  }

  SVXCreateInfo info_;
};

TEST_F(EngineQueries, NameRules) {
  for (const char* bad : {"", "a\"b", "a@b", "a\\b", "a|b", "a/b"}) {
    EXPECT_EQ(engine_.IsValidSelectionTemplateName(bad), VX_INVALID_NAME) << bad;
  }
  EXPECT_TRUE(CVXEngine::IsValidName("Müller <1>.b"));
  // Category names also refuse the separators and operators of formulas.
  for (const char* bad : {"a.b", "a=b", "a;b", "a[b", "a]b", "a<b", "a>b", "a/b"}) {
    EXPECT_EQ(engine_.IsValidGroupName(bad, 0), VX_INVALID_NAME) << bad;
  }

  uint32_t animals = AddGroup("Animals");
  AddGroup("Cats", animals);
  EXPECT_EQ(engine_.IsValidGroupName("Animals", 0), VX_NAME_USED);
  EXPECT_EQ(engine_.IsValidGroupName("animals", 0), VX_OK) << "the sibling test keeps case";
  EXPECT_EQ(engine_.IsValidGroupName("Cats", 0), VX_OK) << "a child is no top-level sibling";
  EXPECT_EQ(engine_.IsValidGroupName("Cats", animals), VX_NAME_USED);
  EXPECT_EQ(engine_.IsValidGroupName("Dogs", 4711), VX_NOT_FOUND) << "missing parent";
}

TEST_F(EngineQueries, CategoriesAndFoldersUniteOrIntersect) {
  uint32_t top = AddFolder("/pics/");
  uint32_t sub = AddFolder("/pics/sub/");
  uint32_t f1 = AddFile(top, "1.jpg");
  uint32_t f2 = AddFile(top, "2.jpg");
  uint32_t f3 = AddFile(sub, "3.jpg");
  uint32_t a = AddGroup("A", 0, {f1, f2});
  uint32_t b = AddGroup("B", 0, {f2, f3});
  using E = CVXEngine;

  CBitVector out;
  out.Set(999);
  ASSERT_EQ(engine_.SelectCategories({a, b}, E::soUnion, out), VX_OK);
  EXPECT_EQ(Members(out), (Oids{f1, f2, f3}));
  ASSERT_EQ(engine_.SelectCategories({a, b}, E::soIntersect, out), VX_OK);
  EXPECT_EQ(Members(out), Oids{f2});
  // The first category is united into the empty result, so one category gives its own files.
  ASSERT_EQ(engine_.SelectCategories({a}, E::soIntersect, out), VX_OK);
  EXPECT_EQ(Members(out), (Oids{f1, f2}));
  ASSERT_EQ(engine_.SelectCategories({}, E::soIntersect, out), VX_OK);
  EXPECT_TRUE(out.IsEmpty());
  ASSERT_EQ(engine_.SelectCategories({a, b}, static_cast<E::ESelectOp>(2), out), VX_OK);
  EXPECT_EQ(Members(out), (Oids{f1, f2, f3})) << "any other value unites";
  EXPECT_EQ(engine_.SelectCategories({a, 4711}, E::soUnion, out), VX_NOT_FOUND);
  EXPECT_TRUE(out.IsEmpty());

  ASSERT_EQ(engine_.SelectFolders({top, sub}, E::soUnion, false, out), VX_OK);
  EXPECT_EQ(Members(out), (Oids{f1, f2, f3}));
  ASSERT_EQ(engine_.SelectFolders({top}, E::soUnion, false, out), VX_OK);
  EXPECT_EQ(Members(out), (Oids{f1, f2}));
  // Unlike categories the first folder is intersected with the empty start: always empty.
  ASSERT_EQ(engine_.SelectFolders({top}, E::soIntersect, true, out), VX_OK);
  EXPECT_TRUE(out.IsEmpty());
}

TEST_F(EngineQueries, ClosedEngineAnswersNotOpenWithEmptyResults) {
  uint32_t d = AddFolder("/pics/");
  uint32_t f = AddFile(d, "1.jpg");
  ASSERT_EQ(engine_.Close(), VX_OK);

  CBitVector out;
  auto filled = [&]() -> CBitVector& {
    out.Set(5);
    return out;
  };
  EXPECT_EQ(engine_.SelectCategories({}, CVXEngine::soUnion, filled()), VX_NOT_OPEN);
  EXPECT_TRUE(out.IsEmpty());
  EXPECT_EQ(engine_.SelectFolders({d}, CVXEngine::soUnion, true, filled()), VX_NOT_OPEN);
  EXPECT_TRUE(out.IsEmpty());
  EXPECT_EQ(engine_.SelectCRC(0, filled()), VX_NOT_OPEN);
  EXPECT_TRUE(out.IsEmpty());
  CVXEngine::SVXStats stats;
  stats.Files = 3;
  EXPECT_EQ(engine_.GetStats(stats), VX_NOT_OPEN);
  EXPECT_EQ(stats.Files, 0u);
  CVXURI uri;
  EXPECT_EQ(engine_.GetFileURI(f, uri), VX_NOT_OPEN);
  unsigned long folder = 9;
  EXPECT_EQ(engine_.GetFileFolder(f, folder), VX_NOT_OPEN);
  EXPECT_EQ(folder, 0u);
}

TEST_F(EngineQueries, SortArrays) {
  const Oids oids{3, 1, 0xFFFFFFFFu};
  ASSERT_EQ(engine_.UpdateSortArray(Sel(7, 42), oids), VX_OK);
  Oids back{99};
  ASSERT_EQ(engine_.GetSortArray(Sel(7, 42), back), VX_OK);
  EXPECT_EQ(back, oids);

  ASSERT_EQ(engine_.Close(), VX_OK);
  {
    CQRLBlobDB db;
    ASSERT_EQ(db.Open(dir_ / "db.vxlt", false), VX_OK);
    std::vector<uint8_t> stored(16);
    ASSERT_EQ(db.Get(Sel(7, 42), stored.data(), 16), VX_OK);
    EXPECT_EQ(stored, vxtest::Bytes().u32(3).u32(3).u32(1).u32(0xFFFFFFFFu).b);
    auto put = [&](uint32_t oid, const std::vector<uint8_t>& bytes) {
      ASSERT_EQ(db.Set(Sel(1, oid), bytes.data(), static_cast<unsigned>(bytes.size())), VX_OK);
    };
    put(1, vxtest::Bytes().u32(5).u32(1).b);  // claims more OIDs than it holds
    put(2, vxtest::Bytes().u16(1).b);         // too short for the count
  }
  ASSERT_EQ(engine_.Open(info_), VX_OK);
  for (uint32_t oid : {1u, 2u, 3u}) {
    back = {1, 2};
    EXPECT_EQ(engine_.GetSortArray(Sel(1, oid), back), VX_NOT_FOUND) << oid;
    EXPECT_TRUE(back.empty()) << oid;
  }

  EXPECT_EQ(engine_.RemoveSortArray(Sel(7, 42)), VX_OK);
  // A missing array is an ordinary answer and leaves no trace in the log.
  size_t lines = log_.Captured().size();
  EXPECT_EQ(engine_.RemoveSortArray(Sel(7, 42)), VX_NOT_FOUND);
  EXPECT_EQ(log_.Captured().size(), lines);
}

TEST_F(EngineQueries, StatsCountAndMeasureTheStores) {
  uint32_t d = AddFolder("/pics/");
  for (uint32_t size : {0xF0000000u, 0x20000000u}) {
    CVXCatFile file(Cat().GenerateFileOID(), std::to_string(size), d);
    file.Properties().Size = size;
    ASSERT_EQ(Cat().AddFile(d, file), VX_OK);
  }
  AddGroup("G");
  unsigned long oid = 1;
  ASSERT_EQ(engine_.GetPropertyDatabase().AddRecord(1000, oid, {}, true), VX_OK);
  auto diskBytes = [&](const std::string& ext) {
    std::string path = ext.empty() ? info_.Name : dir_ / ("db" + ext);
    std::error_code ec;
    auto wal = std::filesystem::file_size(path + "-wal", ec);
    return static_cast<int64_t>(std::filesystem::file_size(path) + (ec ? 0 : wal));
  };

  CVXEngine::SVXStats stats;
  ASSERT_EQ(engine_.GetStats(stats), VX_OK);
  EXPECT_EQ(stats.Version, 768u);
  EXPECT_EQ(stats.Files, 2u);
  EXPECT_EQ(stats.Folders, 1u);
  EXPECT_EQ(stats.Groups, Cat().NumberOfGroups());  // "@All" comes with the catalog
  EXPECT_EQ(stats.Properties, 1u);
  EXPECT_EQ(stats.LastUpdate, engine_.LastUpdate());
  EXPECT_EQ(stats.FileBytes, 0x110000000ull) << "the sum must not wrap at 32 bits";
  EXPECT_EQ(stats.MatchDBSize, diskBytes(""));
  EXPECT_EQ(stats.CatalogDBSize, diskBytes(".vxc"));
  EXPECT_EQ(stats.ThumbDBSize, diskBytes(".vxt"));
  EXPECT_EQ(stats.PropDBSize, diskBytes(".vxp"));
  EXPECT_EQ(stats.XMPDBSize, diskBytes(".v3x"));

  // Without a property store the rest is still reported.
  ASSERT_EQ(engine_.GetPropertyDatabase().Close(), VX_OK);
  ASSERT_EQ(engine_.GetStats(stats), VX_OK);
  EXPECT_EQ(stats.Properties, 0u);
  EXPECT_EQ(stats.PropDBSize, 0);
  EXPECT_EQ(stats.Files, 2u);
}

TEST_F(EngineQueries, CategoryForwardsRespectReadOnly) {
  CVXGroup animals;
  animals.Name() = "Animals";
  ASSERT_EQ(engine_.AddGroup(animals), VX_OK);
  EXPECT_NE(animals.Oid(), 0u) << "the engine hands out the OID";
  // A root has a tag and no pattern; its data-driven children have both.
  auto tag = [&](uint32_t oid, const char* pattern) {
    CVXGroup g = Group(oid);
    g.FTITag() = "Keywords";
    g.FTIPattern() = pattern;
    Store(g);
  };
  uint32_t root = AddGroup("Keywords");
  tag(root, "");
  uint32_t driven = AddGroup("sea", root);
  tag(driven, "sea");
  uint32_t byHand = AddGroup("mine", root);

  Reopen(true);
  CVXGroup refused;
  EXPECT_EQ(engine_.AddGroup(refused), VX_NOT_MUTABLE);
  EXPECT_EQ(refused.Oid(), 0u);
  EXPECT_TRUE(log_.Has("Engine not mutable"));
  EXPECT_EQ(engine_.SetGroup(animals), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.RemoveGroup(animals.Oid()), VX_NOT_MUTABLE);
  EXPECT_FALSE(engine_.IsModified());
  EXPECT_EQ(engine_.ClearDynamicGroup(root), VX_OK) << "skipped";
  CVXGroup still;
  EXPECT_EQ(engine_.GetGroup(driven, still), VX_OK);

  Reopen(false);
  ASSERT_EQ(engine_.ClearDynamicGroup(root), VX_OK);
  EXPECT_TRUE(Group(root).FTITag().empty());
  EXPECT_EQ(engine_.GetGroup(driven, still), VX_NOT_FOUND);
  EXPECT_EQ(engine_.GetGroup(byHand, still), VX_OK);
}

}  // namespace
