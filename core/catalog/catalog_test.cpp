#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <map>

#include "QRLBlobDB.h"
#include "VXMemFile.h"
#include "vxbytes.h"
#include "vxcatalog_fixture.h"
#include "vxlib_test_util.h"

namespace {

using Sel = CQRLBlobDB::SSelector;

// Each test starts with a catalog created at Path() and open.
class CatalogTest : public vxtest::CatalogFixture {
 protected:
  // Opens the closed catalog's store directly to look at or tamper with its records.
  template <typename F>
  void WithStore(F f) {
    CQRLBlobDB db;
    ASSERT_EQ(db.Open(Path(), false), VX_OK);
    f(db);
    ASSERT_EQ(db.Close(), VX_OK);
  }

  static std::vector<uint8_t> Record(CQRLBlobDB& db, Sel sel) {
    unsigned size = 0;
    EXPECT_EQ(db.GetSize(sel, size), VX_OK);
    std::vector<uint8_t> bytes(size);
    EXPECT_EQ(db.Get(sel, bytes.data(), size), VX_OK);
    return bytes;
  }

  unsigned OpenCode(bool readOnly = false) {
    unsigned code = ThrownCode([&] {
      Cat().Reset();
      Cat().Open(Path(), readOnly);
    });
    return code ? code : unsigned{VX_OK};
  }

  // Replaces the fixture's catalog with an engine whose catalog is Path(); OpenEngine opens one
  // on it and collects its messages.
  using Messages = std::vector<std::pair<unsigned, unsigned long>>;
  SVXCreateInfo CreateEngine() {
    Cat().Close();
    std::filesystem::remove(Path());
    SVXCreateInfo info;
    info.Name = dir_ / "db.vxm";
    CVXEngine engine;
    EXPECT_EQ(engine.Create(info), VX_OK);
    EXPECT_EQ(engine.Close(), VX_OK);
    return info;
  }
  static std::vector<uint8_t> Serialise(const CVXCatFile& file) {
    CVXMemFile mem;
    mem << file;
    return {mem.GetBuffer(), mem.GetBuffer() + mem.GetFileSize()};
  }
  static unsigned OpenEngine(CVXEngine& engine, const SVXCreateInfo& info, Messages& seen) {
    auto cb = [](ECBMessage m, void* user, unsigned long a, unsigned long, const char*) {
      static_cast<Messages*>(user)->emplace_back(m, a);
    };
    return engine.Open(info, cb, &seen);
  }
};

TEST_F(CatalogTest, CreateWritesBothHeaderCopiesAndTheSuperCategory) {
  EXPECT_TRUE(log_.HasLine("  Super Category created"));
  Cat().Close();

  vxtest::Bytes want;
  want.raw("VXCF", 4).u16(768).b.resize(278);
  WithStore([&](CQRLBlobDB& db) {
    EXPECT_EQ(Record(db, Sel(1, 1)), want.b);
    EXPECT_EQ(Record(db, Sel(21, 1)), want.b);
    ASSERT_TRUE(db.HasRecord(Sel(4, VX_ALL_GROUP_OID)));
  });

  ASSERT_EQ(OpenCode(), VX_OK);
  const CVXGroup all = Group(VX_ALL_GROUP_OID);
  EXPECT_EQ(all.Name(), "@All");
  EXPECT_EQ(all.Description(), "This category virtually contains ALL images in your database.");
  EXPECT_EQ(all.Parent(), 0u);
}

// Counters start at 1 and survive a reopen, from the backup copy when the main one is damaged.
TEST_F(CatalogTest, OidsStartAtOneAndSurviveADamagedMainHeader) {
  EXPECT_EQ(Cat().GenerateFolderOID(), 1u);
  EXPECT_EQ(Cat().GenerateGroupOID(), 1u);
  EXPECT_EQ(Cat().GeneratePersistantSelectionOID(), 1u);
  for (uint32_t oid = 1; oid <= 5; ++oid) EXPECT_EQ(Cat().GenerateFileOID(), oid);
  Cat().Close();
  WithStore([](CQRLBlobDB& db) { ASSERT_EQ(db.Set(Sel(1, 1), "junk", 4), VX_OK); });
  log_.ClearCaptured();
  ASSERT_EQ(OpenCode(), VX_OK);
  EXPECT_TRUE(log_.Has("Failed to load original header. Reverting to backup copy!"));
  EXPECT_FALSE(log_.Has("BOTH copies"));
  EXPECT_EQ(Cat().GenerateFileOID(), 6u);
  // The first load added "@Interactive" with group OID 2.
  EXPECT_EQ(Cat().GenerateGroupOID(), 3u);
}

TEST_F(CatalogTest, BothHeadersLostAreRebuiltFromContent) {
  for (int i = 0; i < 3; ++i) Cat().GenerateGroupOID();
  Cat().GeneratePersistantSelectionOID();
  ASSERT_EQ(Cat().AddFolder(CVXFolder(CVXURI("/photos/", true), 4, 0)), VX_OK);
  for (uint32_t oid : {1u, 2u, 7u}) {
    ASSERT_EQ(Cat().AddFile(4, CVXCatFile(oid, "f" + std::to_string(oid) + ".jpg", 4)), VX_OK);
  }
  Cat().Close();
  WithStore([](CQRLBlobDB& db) {
    ASSERT_EQ(db.Remove(Sel(1, 1)), VX_OK);
    ASSERT_EQ(db.Set(Sel(21, 1), "xx", 2), VX_OK);
  });
  log_.ClearCaptured();
  ASSERT_EQ(OpenCode(), VX_OK);
  EXPECT_TRUE(log_.Has("BOTH copies of the database header are damage."));
  EXPECT_TRUE(log_.Has("RESTORING damaged header information from database contents: "));
  EXPECT_TRUE(log_.HasLine("  Next file OID: 8"));
  // Restored counters are the highest OID plus 1; generating adds 1 again. The super category
  // never raises the group counter (the interactive category, made while loading, took 1), and
  // the selection counter restarts.
  EXPECT_EQ(Cat().GenerateFileOID(), 9u);
  EXPECT_EQ(Cat().GenerateFolderOID(), 6u);
  EXPECT_EQ(Cat().GenerateGroupOID(), 3u);
  EXPECT_EQ(Cat().GeneratePersistantSelectionOID(), 1u);
  Cat().Close();
  // The recovered header was stored: a plain reopen keeps the counters.
  ASSERT_EQ(OpenCode(), VX_OK);
  EXPECT_EQ(uint32_t{Cat().Header().LastFileOid}, 9u);
}

TEST_F(CatalogTest, InteractiveCategoryIsMadeOnceAndForgetsItsFormula) {
  Cat().Close();
  ASSERT_EQ(OpenCode(), VX_OK);
  uint32_t interactive = Cat().GetInteractiveGroup();
  ASSERT_NE(interactive, 0u);
  CVXGroup g = Group(interactive);
  EXPECT_EQ(g.Name(), "@Interactive");
  EXPECT_EQ(g.Flags(), 96u);
  EXPECT_EQ(g.SortSequence(), -2);
  AddGroup("A");
  ASSERT_EQ(g.SetExpression(Cat(), "\"A\"").code, VX_OK);
  ASSERT_EQ(Cat().UpdateGroup(g), VX_OK);
  Cat().Close();
  for (bool readOnly : {true, false}) {
    ASSERT_EQ(OpenCode(readOnly), VX_OK);
    EXPECT_EQ(Cat().GetInteractiveGroup(), interactive);
    EXPECT_TRUE(Group(interactive).Postfix().empty()) << (readOnly ? "read-only" : "writable");
    EXPECT_EQ(Cat().NumberOfGroups(), 3u);
    Cat().Close();
  }
}

TEST_F(CatalogTest, SecondOpenerAndBadFilesGiveCodes) {
  CVXCatalog other;
  EXPECT_EQ(ThrownCode([&] { other.Open(Path(), false); }), VX_SHARING_VIOLATION);
  Cat().Close();

  for (const std::string& bytes :
       {std::string(), std::string("not a store at all"), std::string(5000, '\xAB')}) {
    vxtest::WriteFile(Path(), bytes);
    log_.ClearCaptured();
    EXPECT_NE(OpenCode(), VX_OK);
    EXPECT_TRUE(log_.Has("Error opening files database. Potential database corruption."));
    EXPECT_EQ(vxtest::ReadFile(Path()), bytes) << "a failed open changed the file";
  }
}

TEST_F(CatalogTest, CorruptCategoryRecordFailsTheOpen) {
  Cat().Close();
  WithStore([](CQRLBlobDB& db) { ASSERT_EQ(db.Set(Sel(4, 9), "\x01\x00", 2), VX_OK); });
  EXPECT_EQ(OpenCode(), VX_NOT_FOUND);
  EXPECT_TRUE(log_.Has("Loading groups"));
}

// The engine forwards catalog notifications only while its own Open runs.
TEST_F(CatalogTest, OpenSendsLoadMessagesToTheEngine) {
  const SVXCreateInfo info = CreateEngine();
  CVXEngine engine;
  Messages seen;
  ASSERT_EQ(OpenEngine(engine, info, seen), VX_OK);
  // Files and folders of an empty catalog: begin, 0 %, 100 %, end. Groups: begin, 0 %, 100 %
  // after the one category, the closing 100 %, end. Then the catalog's own end of loading.
  const Messages want = {{5000, 0},   {5003, 0},   {5003, 100}, {5004, 0}, {5001, 0},
                         {5003, 0},   {5003, 100}, {5004, 0},   {5002, 0}, {5003, 0},
                         {5003, 100}, {5003, 100}, {5004, 0},   {5004, 0}};
  EXPECT_EQ(seen, want);
  seen.clear();
  engine.Catalog().Notify(5003, 1, 0, nullptr);
  EXPECT_TRUE(seen.empty()) << "the callback outlived Open";
}

// A catalog of more than two batches of files loads them as stored, with a progress message per
// batch; a record that does not read in the middle of the second batch ends the load there,
// keeping every file before it and sending the messages of the batches before.
TEST_F(CatalogTest, FilesLoadInBatchesAndStopAtABadRecord) {
  const SVXCreateInfo info = CreateEngine();
  std::map<uint32_t, std::vector<uint8_t>> stored;  // OID -> record
  auto oidOf = [](uint32_t i) { return 2 * i + 1; };
  WithStore([&](CQRLBlobDB& db) {
    for (uint32_t i = 0; i < 12001; ++i) {
      // A long name ends the first batch and an empty one begins the second.
      std::string name = i == 4999   ? std::string(5000, 'x')
                         : i == 5000 ? std::string()
                                     : "IMG_" + std::to_string(i) + ".JPG";
      CVXCatFile file(oidOf(i), name, i % 97 + 1);
      CVXCatFile::SData& d = file.Properties();
      d.Width = i, d.CRC = i * 2654435761u, d.Flags = static_cast<uint16_t>(i);
      d.VersionTag = static_cast<uint8_t>(i), d.Reserved4[18] = static_cast<uint8_t>(i % 251);
      const std::vector<uint8_t>& r = stored[oidOf(i)] = Serialise(file);
      ASSERT_EQ(db.Set(Sel(3, oidOf(i)), r.data(), static_cast<unsigned>(r.size())), VX_OK);
    }
  });
  // The code of an engine open, and its messages up to the end of the file stage.
  auto openEngine = [&](Messages& files) {
    CVXEngine engine;
    Messages seen;
    unsigned rc = OpenEngine(engine, info, seen);
    engine.Close();
    auto end = std::find(seen.begin(), seen.end(), Messages::value_type(5004, 0));
    files.assign(seen.begin(), end == seen.end() ? end : end + 1);
    return rc;
  };
  auto loaded = [&] {
    std::map<uint32_t, std::vector<uint8_t>> out;
    for (const auto& [oid, file] : Cat().Files()) out[oid] = Serialise(file);
    return out;
  };

  Messages files;
  ASSERT_EQ(openEngine(files), VX_OK);
  EXPECT_EQ(
      files,
      (Messages{
          {5000, 0}, {5003, 0}, {5003, 41}, {5003, 83}, {5003, 100}, {5003, 100}, {5004, 0}}));
  ASSERT_EQ(OpenCode(true), VX_OK);
  EXPECT_EQ(loaded(), stored);
  Cat().Close();

  const uint32_t bad = oidOf(7002);
  std::vector<uint8_t> record = stored[bad];
  std::fill(record.begin() + 8, record.begin() + 12, 0xFF);  // a name longer than the batch
  WithStore([&](CQRLBlobDB& db) {
    ASSERT_EQ(db.Set(Sel(3, bad), record.data(), static_cast<unsigned>(record.size())), VX_OK);
  });
  EXPECT_EQ(openEngine(files), VX_NOT_FOUND);
  EXPECT_EQ(files, (Messages{{5000, 0}, {5003, 0}, {5003, 41}, {5003, 100}, {5004, 0}}));
  log_.ClearCaptured();
  EXPECT_EQ(OpenCode(true), VX_NOT_FOUND);
  EXPECT_TRUE(log_.Has("Loading files"));
  stored.erase(stored.find(bad), stored.end());
  EXPECT_EQ(loaded(), stored);
}

}  // namespace
