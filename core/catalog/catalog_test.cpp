#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <map>
#include <vector>

#include "QRLBlobDB.h"
#include "VXCatFile.h"
#include "VXEngine.h"
#include "VXException.h"
#include "VXFolder.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "VXURI.h"
#include "vxcatalog.h"
#include "vxtest.h"

namespace {

using Sel = CQRLBlobDB::SSelector;

// The catalog logs through an engine; the engine itself stays closed in these tests.
class CatalogTest : public ::testing::Test {
 protected:
  void SetUp() override { engine_.SetLogFile(&log_); }
  CVXCatalog& Catalog() { return engine_.Catalog(); }
  std::string Path() const { return dir_ / "db.vxc"; }

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

  // Empty when the maps are equal, else where they first differ.
  template <typename Map>
  static std::string Differs(const Map& got, const Map& want) {
    auto [g, w] = std::mismatch(got.begin(), got.end(), want.begin(), want.end());
    if (g == got.end() && w == want.end()) return "";
    return std::to_string(got.size()) + " entries, want " + std::to_string(want.size()) +
           "; first difference at " + (g != got.end() ? std::to_string(g->first) : "the end") +
           " / " + (w != want.end() ? std::to_string(w->first) : "the end");
  }

  unsigned OpenCode(bool readOnly = false) {
    try {
      Catalog().Reset();
      Catalog().Open(Path(), readOnly);
    } catch (CVXException* e) {
      unsigned code = e->GetCode();
      delete e;
      return code;
    }
    return VX_OK;
  }

  vxtest::TempDir dir_;
  vxtest::CapturedLog log_;
  CVXEngine engine_;
};

TEST_F(CatalogTest, CreateWritesBothHeaderCopiesAndTheSuperCategory) {
  Catalog().Create(Path());
  EXPECT_TRUE(log_.HasLine("  Super Category created"));
  Catalog().Close();

  std::vector<uint8_t> want(278, 0);
  std::memcpy(want.data(), "VXCF", 4);
  want[4] = 0x00;
  want[5] = 0x03;  // 768, little-endian
  WithStore([&](CQRLBlobDB& db) {
    EXPECT_EQ(Record(db, Sel(1, 1)), want);
    EXPECT_EQ(Record(db, Sel(21, 1)), want);
    ASSERT_TRUE(db.HasRecord(Sel(4, VX_ALL_GROUP_OID)));
  });

  ASSERT_EQ(OpenCode(), VX_OK);
  ASSERT_EQ(Catalog().Groups().count(VX_ALL_GROUP_OID), 1u);
  const CVXGroup& all = Catalog().Groups().at(VX_ALL_GROUP_OID);
  EXPECT_EQ(all.Name(), "@All");
  EXPECT_EQ(all.Description(), "This category virtually contains ALL images in your database.");
  EXPECT_EQ(all.Parent(), 0u);
}

// Counters start at 1 and survive a reopen, from the backup copy when the main one is damaged.
TEST_F(CatalogTest, OidsStartAtOneAndSurviveADamagedMainHeader) {
  Catalog().Create(Path());
  EXPECT_EQ(Catalog().GenerateFolderOID(), 1u);
  EXPECT_EQ(Catalog().GenerateGroupOID(), 1u);
  EXPECT_EQ(Catalog().GeneratePersistantSelectionOID(), 1u);
  for (uint32_t oid = 1; oid <= 5; ++oid) EXPECT_EQ(Catalog().GenerateFileOID(), oid);
  Catalog().Close();
  WithStore([](CQRLBlobDB& db) { ASSERT_EQ(db.Set(Sel(1, 1), "junk", 4), VX_OK); });
  log_.ClearCaptured();
  ASSERT_EQ(OpenCode(), VX_OK);
  EXPECT_TRUE(log_.Has("Failed to load original header. Reverting to backup copy!"));
  EXPECT_FALSE(log_.Has("BOTH copies"));
  EXPECT_EQ(Catalog().GenerateFileOID(), 6u);
  // The first load added "@Interactive" with group OID 2.
  EXPECT_EQ(Catalog().GenerateGroupOID(), 3u);
}

TEST_F(CatalogTest, BothHeadersLostAreRebuiltFromContent) {
  Catalog().Create(Path());
  for (int i = 0; i < 3; ++i) Catalog().GenerateGroupOID();
  Catalog().GeneratePersistantSelectionOID();
  CVXURI uri;
  uri.Set("/photos/", true);
  CVXFolder folder(uri, 4, 0);
  ASSERT_EQ(Catalog().AddFolder(folder), VX_OK);
  for (uint32_t oid : {1u, 2u, 7u}) {
    ASSERT_EQ(Catalog().AddFile(4, CVXCatFile(oid, "f" + std::to_string(oid) + ".jpg", 4)), VX_OK);
  }
  Catalog().Close();
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
  EXPECT_EQ(Catalog().GenerateFileOID(), 9u);
  EXPECT_EQ(Catalog().GenerateFolderOID(), 6u);
  EXPECT_EQ(Catalog().GenerateGroupOID(), 3u);
  EXPECT_EQ(Catalog().GeneratePersistantSelectionOID(), 1u);
  Catalog().Close();
  // The recovered header was stored: a plain reopen keeps the counters.
  ASSERT_EQ(OpenCode(), VX_OK);
  EXPECT_EQ(uint32_t{Catalog().Header().LastFileOid}, 9u);
}

TEST_F(CatalogTest, InteractiveCategoryIsMadeOnceAndForgetsItsFormula) {
  Catalog().Create(Path());
  Catalog().Close();
  ASSERT_EQ(OpenCode(), VX_OK);
  uint32_t interactive = Catalog().GetInteractiveGroup();
  ASSERT_NE(interactive, 0u);
  CVXGroup g;
  ASSERT_EQ(Catalog().LookupGroup(interactive, g), VX_OK);
  EXPECT_EQ(g.Name(), "@Interactive");
  EXPECT_EQ(g.Flags(), 96u);
  EXPECT_EQ(g.SortSequence(), -2);
  CVXGroup a(Catalog().GenerateGroupOID());
  a.Name() = "A";
  ASSERT_EQ(Catalog().AddGroup(a), VX_OK);
  ASSERT_EQ(g.SetExpression(Catalog(), "\"A\"").code, VX_OK);
  ASSERT_EQ(Catalog().UpdateGroup(g), VX_OK);
  Catalog().Close();
  for (bool readOnly : {true, false}) {
    ASSERT_EQ(OpenCode(readOnly), VX_OK);
    EXPECT_EQ(Catalog().GetInteractiveGroup(), interactive);
    ASSERT_EQ(Catalog().LookupGroup(interactive, g), VX_OK);
    EXPECT_TRUE(g.Postfix().empty()) << (readOnly ? "read-only" : "writable");
    EXPECT_EQ(Catalog().NumberOfGroups(), 3u);
    Catalog().Close();
  }
}

TEST_F(CatalogTest, SecondOpenerAndBadFilesGiveCodes) {
  Catalog().Create(Path());
  CVXCatalog other;
  try {
    other.Open(Path(), false);
    FAIL() << "a held catalog opened twice";
  } catch (CVXException* e) {
    EXPECT_EQ(e->GetCode(), VX_SHARING_VIOLATION);
    delete e;
  }
  Catalog().Close();

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
  Catalog().Create(Path());
  Catalog().Close();
  WithStore([](CQRLBlobDB& db) { ASSERT_EQ(db.Set(Sel(4, 9), "\x01\x00", 2), VX_OK); });
  EXPECT_EQ(OpenCode(), VX_NOT_FOUND);
  EXPECT_TRUE(log_.Has("Loading groups"));
}

TEST_F(CatalogTest, OpenSendsLoadMessagesToTheEngine) {
  Catalog().Create(Path());
  Catalog().Close();
  struct Seen {
    std::vector<std::pair<unsigned, unsigned long>> messages;
  } seen;
  // The engine forwards catalog notifications only while its own Open runs; drive it through a
  // full engine open to see them.
  vxtest::TempDir dir;
  SVXCreateInfo info;
  info.Name = dir / "e.vxm";
  CVXEngine engine;
  ASSERT_EQ(engine.Create(info), VX_OK);
  ASSERT_EQ(engine.Close(), VX_OK);
  auto cb = [](ECBMessage m, void* user, unsigned long a, unsigned long, const char*) {
    static_cast<Seen*>(user)->messages.emplace_back(m, a);
  };
  ASSERT_EQ(engine.Open(info, cb, &seen), VX_OK);
  // Files and folders of an empty catalog: begin, 0 %, 100 %, end. Groups: begin, 0 %, 100 %
  // after the one category, the closing 100 %, end. Then the catalog's own end of loading.
  std::vector<std::pair<unsigned, unsigned long>> want = {
      {5000, 0}, {5003, 0}, {5003, 100}, {5004, 0},   {5001, 0},   {5003, 0}, {5003, 100},
      {5004, 0}, {5002, 0}, {5003, 0},   {5003, 100}, {5003, 100}, {5004, 0}, {5004, 0}};
  EXPECT_EQ(seen.messages, want);
  seen.messages.clear();
  engine.Catalog().Notify(5003, 1, 0, nullptr);
  EXPECT_TRUE(seen.messages.empty()) << "the callback outlived Open";
}

// Bulk loads read file records straight from bytes: every cut short record fails as the stream
// reader fails, and a whole one reads the same and ends where the next begins.
TEST(CatFileBytes, ReadLikeTheStream) {
  CVXCatFile file(77, "name.jpg", 5);
  file.Properties().CRC = 0xDEADBEEF;
  file.Properties().Reserved4[18] = 9;
  CVXMemFile mem;
  mem << file;
  std::vector<uint8_t> bytes(mem.GetBuffer(), mem.GetBuffer() + mem.GetFileSize());
  auto codeOf = [](auto read) {
    try {
      read();
    } catch (CVXException* e) {
      unsigned code = e->GetCode();
      delete e;
      return code;
    }
    return unsigned{VX_OK};
  };
  for (size_t size = 0; size < bytes.size(); ++size) {
    CVXMemFile cut(bytes.data(), size);
    CVXCatFile streamed;
    EXPECT_EQ(codeOf([&] { cut >> streamed; }), VX_NOT_FOUND) << size;
    const uint8_t* at = bytes.data();
    EXPECT_EQ(codeOf([&] { CVXCatFile read(at, bytes.data() + size); }), VX_NOT_FOUND) << size;
  }
  bytes.push_back(0xAB);  // the next record's first byte
  const uint8_t* at = bytes.data();
  CVXCatFile read(at, bytes.data() + bytes.size());
  EXPECT_EQ(at, bytes.data() + bytes.size() - 1);
  CVXMemFile again;
  again << read;
  EXPECT_TRUE(std::equal(bytes.begin(), bytes.end() - 1, again.GetBuffer()));
  EXPECT_EQ(again.GetFileSize(), bytes.size() - 1);
}

// A catalog of more than two batches of files loads them as stored, with a progress message per
// batch; a record that does not read in the middle of the second batch ends the load there,
// keeping every file before it and sending the messages of the batches before.
TEST_F(CatalogTest, FilesLoadInBatchesAndStopAtABadRecord) {
  SVXCreateInfo info;
  info.Name = dir_ / "db.vxm";  // its catalog is Path()
  {
    CVXEngine engine;
    ASSERT_EQ(engine.Create(info), VX_OK);
    ASSERT_EQ(engine.Close(), VX_OK);
  }
  constexpr uint32_t kFiles = 12001;
  std::map<uint32_t, std::vector<uint8_t>> stored;  // OID -> record
  auto oidOf = [](uint32_t i) { return 2 * i + 1; };
  WithStore([&](CQRLBlobDB& db) {
    for (uint32_t i = 0; i < kFiles; ++i) {
      // A long name ends the first batch and an empty one begins the second.
      std::string name = i == 4999   ? std::string(5000, 'x')
                         : i == 5000 ? std::string()
                                     : "IMG_" + std::to_string(i) + ".JPG";
      CVXCatFile file(oidOf(i), name, i % 97 + 1);
      CVXCatFile::SData& d = file.Properties();
      d.Width = i;
      d.CRC = i * 2654435761u;
      d.Flags = static_cast<uint16_t>(i);
      d.VersionTag = static_cast<uint8_t>(i);
      d.Reserved4[18] = static_cast<uint8_t>(i % 251);
      CVXMemFile mem;
      mem << file;
      stored[oidOf(i)].assign(mem.GetBuffer(), mem.GetBuffer() + mem.GetFileSize());
      ASSERT_EQ(db.Set(Sel(3, oidOf(i)), mem.GetBuffer(), static_cast<unsigned>(mem.GetFileSize())),
                VX_OK);
    }
  });
  using Messages = std::vector<std::pair<unsigned, unsigned long>>;
  // The messages up to the end of the file stage, and the code of an engine open.
  auto openEngine = [&](Messages& files) {
    Messages seen;
    auto cb = [](ECBMessage m, void* user, unsigned long a, unsigned long, const char*) {
      static_cast<Messages*>(user)->emplace_back(m, a);
    };
    CVXEngine engine;
    unsigned rc = engine.Open(info, cb, &seen);
    engine.Close();
    auto end = std::find(seen.begin(), seen.end(), std::pair<unsigned, unsigned long>(5004, 0));
    files.assign(seen.begin(), end == seen.end() ? end : end + 1);
    return rc;
  };
  // Compared record by record: a difference names the first OID that differs.
  auto loaded = [&] {
    std::map<uint32_t, std::vector<uint8_t>> out;
    for (const auto& [oid, file] : Catalog().Files()) {
      CVXMemFile mem;
      mem << file;
      out[oid].assign(mem.GetBuffer(), mem.GetBuffer() + mem.GetFileSize());
    }
    return out;
  };

  Messages files;
  ASSERT_EQ(openEngine(files), VX_OK);
  EXPECT_EQ(
      files,
      (Messages{
          {5000, 0}, {5003, 0}, {5003, 41}, {5003, 83}, {5003, 100}, {5003, 100}, {5004, 0}}));
  ASSERT_EQ(OpenCode(true), VX_OK);
  EXPECT_EQ(Differs(loaded(), stored), "");
  Catalog().Close();

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
  EXPECT_EQ(Differs(loaded(), stored), "");
}

}  // namespace
