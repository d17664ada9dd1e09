#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "QRLBlobDB.h"
#include "VXException.h"
#include "VXLog.h"
#include "vxbytes.h"
#include "vxengine_fixture.h"

namespace {

using Sel = CQRLBlobDB::SSelector;

// When started with VX_ENGINE_CHILD_OPEN=<path>, this test binary is a second process that opens
// the database and exits with the result code less 10000, before any test runs.
const bool kChildRan = [] {
  const char* path = std::getenv("VX_ENGINE_CHILD_OPEN");
  if (!path) return false;
  SVXCreateInfo info;
  info.Name = path;
  CVXEngine engine;
  unsigned rc = engine.Open(info);
  std::_Exit(static_cast<int>(rc - 10000));
}();

unsigned OpenInChildProcess(const std::string& path) {
  pid_t pid = fork();
  if (pid == 0) {
    setenv("VX_ENGINE_CHILD_OPEN", path.c_str(), 1);
    execl("/proc/self/exe", "engine_test", static_cast<char*>(nullptr));
    std::_Exit(127);
  }
  int status = 0;
  waitpid(pid, &status, 0);
  return WIFEXITED(status) ? 10000u + WEXITSTATUS(status) : 0u;
}

const char* const kStoreExts[] = {"", ".vxc", ".vxp", ".vxt", ".vxlt", ".vxl", ".v3x"};

// The fixture's engine, created with thumbnail settings of its own.
class EngineTest : public vxtest::EngineFixture {
 protected:
  void SetUp() override {
    info_.ThumbInfo = {0, 160, 120, 24, 90, 1};
    EngineFixture::SetUp();
  }

  std::string Store(const std::string& ext) const {
    return ext.empty() ? info_.Name : dir_ / ("db" + ext);
  }

  // Opens the closed match store directly to look at or tamper with its records.
  template <typename F>
  void WithMatchStore(F f) {
    CQRLBlobDB db;
    ASSERT_EQ(db.Open(info_.Name, false), VX_OK);
    f(db);
    ASSERT_EQ(db.Close(), VX_OK);
  }

  static std::vector<uint8_t> Record(CQRLBlobDB& db, Sel sel) {
    unsigned size = 0;
    if (db.GetSize(sel, size) != VX_OK) return {};
    std::vector<uint8_t> bytes(size);
    EXPECT_EQ(db.Get(sel, bytes.data(), size), VX_OK);
    return bytes;
  }
};

TEST_F(EngineTest, CreateMakesEveryStoreAndReopens) {
  for (const char* ext : kStoreExts) EXPECT_TRUE(std::filesystem::exists(Store(ext))) << ext;
  EXPECT_TRUE(log_.Has("New feature match database created"));
  EXPECT_TRUE(log_.Has("  Creating XMPDB completed"));
  std::string name;
  EXPECT_EQ(engine_.GetPathAndName(name), VX_OK);
  EXPECT_EQ(name, info_.Name);
  ASSERT_EQ(engine_.Close(), VX_OK);
  EXPECT_EQ(engine_.GetPathAndName(name), VX_NOT_OPEN);
  EXPECT_TRUE(name.empty());

  WithMatchStore([&](CQRLBlobDB& db) {
    std::vector<uint8_t> core = Record(db, Sel(1, 1));
    ASSERT_EQ(core.size(), 5154u);
    EXPECT_EQ(std::memcmp(core.data(), "VXDB\x00\x03", 6), 0);
    EXPECT_EQ(Record(db, Sel(4, 1)), core);
    // The thumbnail settings as given, then 256 reserved bytes.
    auto thumbs = vxtest::Bytes().u32(0).u32(160).u32(120).u32(24).u32(90).u32(1).b;
    thumbs.resize(280);
    EXPECT_EQ(Record(db, Sel(5, 1)), thumbs);
  });

  ASSERT_EQ(engine_.Open(info_), VX_OK);
  CVXTable table(1000);
  EXPECT_EQ(engine_.GetPropertyDatabase().GetTable(table), VX_OK);
  EXPECT_EQ(engine_.Catalog().Groups().count(0xFFFFEFFF), 1u);
}

TEST_F(EngineTest, SecondOpenerGetsSharingViolation) {
  EXPECT_EQ(OpenInChildProcess(info_.Name), VX_SHARING_VIOLATION);
  vxtest::CapturedLog log;  // outlives the engine that writes to it
  CVXEngine second;
  second.SetLogFile(&log);
  EXPECT_EQ(second.Open(info_), VX_SHARING_VIOLATION);
  EXPECT_TRUE(log.Has("Sharing Violation while opening the database!"));
  EXPECT_FALSE(second.IsOpen());
  // The failed opener held nothing: once the first closes, a new process opens the database.
  ASSERT_EQ(engine_.Close(), VX_OK);
  EXPECT_EQ(OpenInChildProcess(info_.Name), VX_OK);
  EXPECT_EQ(second.Open(info_), VX_OK);
}

// The app data, capped at its size, and the catalog's OID counter outlive a close. Flush writes
// the core info only when it changed and the store is writable.
TEST_F(EngineTest, AppDataPersistsAndIsCappedAndFlushWritesOnlyWhenModifiedAndWritable) {
  for (uint32_t oid = 1; oid <= 3; ++oid) EXPECT_EQ(engine_.Catalog().GenerateFileOID(), oid);
  std::vector<uint8_t> data(5000);
  for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(i * 7);
  EXPECT_EQ(engine_.SetAppData(data.data(), data.size()), VX_OK);
  EXPECT_TRUE(engine_.IsModified());
  ASSERT_EQ(engine_.Close(), VX_OK);
  EXPECT_FALSE(engine_.IsModified());

  ASSERT_EQ(engine_.Open(info_), VX_OK);
  EXPECT_EQ(engine_.Catalog().GenerateFileOID(), 4u);
  uint8_t back[VX_APP_DATA_SIZE];
  engine_.GetAppData(back);
  EXPECT_EQ(engine_.GetAppDataSize(), 4096u);
  EXPECT_EQ(std::memcmp(back, data.data(), sizeof back), 0);

  log_.ClearCaptured();
  EXPECT_EQ(engine_.Flush(), VX_OK);
  EXPECT_TRUE(log_.Has("+ VXEngine::Flush"));
  EXPECT_FALSE(log_.Has("Flushing core info")) << "an unmodified engine wrote its core info";
  engine_.SetAppData("x", 1);
  EXPECT_EQ(engine_.Flush(), VX_OK);
  EXPECT_TRUE(log_.Has("Flushing core info"));
  ASSERT_EQ(engine_.Close(), VX_OK);
  log_.ClearCaptured();
  EXPECT_EQ(engine_.Close(), VX_OK);
  EXPECT_TRUE(log_.Has("+ VXEngine::Close"));
  EXPECT_FALSE(log_.Has("Match Database closed"));

  // A read-only open recreates a lost sort store; a change stays in memory.
  std::filesystem::remove(Store(".vxlt"));
  info_.ReadOnly = true;
  ASSERT_EQ(engine_.Open(info_), VX_OK);
  EXPECT_TRUE(std::filesystem::exists(Store(".vxlt")));
  EXPECT_EQ(engine_.SetAppData("y", 1), VX_OK);
  log_.ClearCaptured();
  EXPECT_EQ(engine_.Flush(), VX_OK);
  EXPECT_FALSE(log_.Has("Flushing core info"));
}

TEST_F(EngineTest, CoreInfoFallsBackToItsCopy) {
  ASSERT_EQ(engine_.Close(), VX_OK);
  WithMatchStore([](CQRLBlobDB& db) { ASSERT_EQ(db.Set(Sel(1, 1), "bad", 3), VX_OK); });
  log_.ClearCaptured();
  ASSERT_EQ(engine_.Open(info_), VX_OK);
  EXPECT_TRUE(log_.Has("Loading core info"));
  ASSERT_EQ(engine_.Close(), VX_OK);

  WithMatchStore([](CQRLBlobDB& db) {
    ASSERT_EQ(db.Remove(Sel(1, 1)), VX_OK);
    ASSERT_EQ(db.Remove(Sel(4, 1)), VX_OK);
  });
  log_.ClearCaptured();
  EXPECT_EQ(engine_.Open(info_), VX_NOT_FOUND);
  EXPECT_FALSE(engine_.IsOpen());
  EXPECT_TRUE(log_.Has("Loading core info copy"));
  // Everything the failed open had opened was closed again: a new engine can open the catalog.
  CVXEngine other;
  EXPECT_EQ(other.Open(info_), VX_NOT_FOUND);
}

TEST_F(EngineTest, MissingThumbSettingsAreSeededFromTheOldFieldsEvenReadOnly) {
  ASSERT_EQ(engine_.Close(), VX_OK);
  WithMatchStore([](CQRLBlobDB& db) {
    std::vector<uint8_t> core = Record(db, Sel(1, 1));
    uint32_t old[4] = {3, 64, 48, 16};
    std::memcpy(core.data() + 14, old, sizeof old);
    core[30] = 55;
    ASSERT_EQ(db.Set(Sel(1, 1), core.data(), static_cast<unsigned>(core.size())), VX_OK);
    ASSERT_EQ(db.Remove(Sel(5, 1)), VX_OK);
  });
  ASSERT_EQ(engine_.Open(info_), VX_OK);
  SVXThumbInfoNew t = engine_.GetThumbInfo();
  EXPECT_EQ((std::vector<uint32_t>{t.Field0, t.Width, t.Height, t.Depth, t.Quality, t.Version}),
            (std::vector<uint32_t>{3, 64, 48, 16, 55, 1}));
  ASSERT_EQ(engine_.Close(), VX_OK);
  WithMatchStore([](CQRLBlobDB& db) { EXPECT_EQ(Record(db, Sel(5, 1)).size(), 280u); });

  // A damaged record is replaced by the defaults, with the core-info wording in the log.
  WithMatchStore([](CQRLBlobDB& db) { ASSERT_EQ(db.Set(Sel(5, 1), "z", 1), VX_OK); });
  log_.ClearCaptured();
  ASSERT_EQ(engine_.Open(info_), VX_OK);
  EXPECT_TRUE(log_.Has("Loading core info copy"));
  EXPECT_EQ(uint32_t{engine_.GetThumbInfo().Width}, 200u);
  EXPECT_EQ(uint32_t{engine_.GetThumbInfo().Quality}, 75u);
}

// Every store file replaced by junk, truncated to nothing or cut short: Open answers with a code
// and a log line (or, for the disposable stores, repairs), and never crashes.
TEST_F(EngineTest, DamagedStoreFilesGiveCodesNotCrashes) {
  ASSERT_EQ(engine_.Close(), VX_OK);
  std::vector<std::string> backups;
  for (const char* ext : kStoreExts) backups.push_back(vxtest::ReadFile(Store(ext)));
  const std::string variants[] = {"", "junk junk junk junk", std::string(3000, '\x5A')};
  for (const std::string ext : kStoreExts) {
    for (const std::string& variant : variants) {
      SCOPED_TRACE("store '" + ext + "' as " + std::to_string(variant.size()) + " bytes");
      for (size_t i = 0; i < std::size(kStoreExts); ++i) {
        vxtest::WriteFile(Store(kStoreExts[i]), backups[i]);
      }
      vxtest::WriteFile(Store(ext), variant);
      log_.ClearCaptured();
      CVXEngine engine;
      engine.SetLogFile(&log_);
      // The sort store is recreated; the XMP store is not fatal.
      bool repairable = ext == ".vxlt" || ext == ".v3x";
      EXPECT_EQ(engine.Open(info_) == VX_OK, repairable);
      EXPECT_EQ(engine.IsOpen(), repairable);
      EXPECT_TRUE(log_.Has("VXEngine::Open"));
      if (ext == ".v3x" && !variant.empty()) {
        EXPECT_TRUE(log_.Has("    Failed to open database with"));
      }
    }
  }
}

// Public operations from many threads meet the engine's lock; run under ThreadSanitizer in CI.
TEST_F(EngineTest, ConcurrentCallersAreSerialised) {
  std::vector<std::thread> threads;
  threads.reserve(4);
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([this, t] {
      uint8_t data[VX_APP_DATA_SIZE];
      for (int i = 0; i < 50; ++i) {
        std::memset(data, t * 50 + i, sizeof data);
        EXPECT_EQ(engine_.SetAppData(data, sizeof data), VX_OK);
        engine_.GetAppData(data);
        // Whole records only: every byte comes from the same writer.
        EXPECT_EQ(std::count(data, data + sizeof data, data[0]), VX_APP_DATA_SIZE);
        EXPECT_EQ(engine_.Flush(), VX_OK);
        std::string name;
        EXPECT_EQ(engine_.GetPathAndName(name), VX_OK);
        EXPECT_GT(engine_.LastUpdate(), 0);
      }
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(engine_.Close(), VX_OK);
}

// The public edge turns every kind of exception into a code.
TEST(ExceptionEdge, EveryExceptionBecomesACode) {
  vxtest::CapturedLog log;
  auto codeOf = [&](auto thrower) {
    try {
      thrower();
    } catch (...) {
      return VXCodeOfCurrentException(&log, __LINE__, __FILE__);
    }
    return 0u;
  };
  EXPECT_EQ(codeOf([] { VX_THROW(VX_SHARING_VIOLATION); }), VX_SHARING_VIOLATION);
  EXPECT_EQ(codeOf([] { throw std::runtime_error("framework"); }), VX_FRAMEWORK_EXCEPTION);
  EXPECT_EQ(codeOf([] { throw 42; }), VX_UNKNOWN_EXCEPTION);
  EXPECT_TRUE(log.Has("10211"));
  EXPECT_TRUE(log.Has("framework"));
  EXPECT_TRUE(log.HasLine("..."));
}

}  // namespace
