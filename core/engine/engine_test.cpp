#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include <algorithm>
#include <stdexcept>
#include <thread>

#include "QRLBlobDB.h"
#include "VXEngine.h"
#include "VXException.h"
#include "VXLog.h"
#include "VXPropDB.h"
#include "VXResult.h"
#include "VXTable.h"
#include "vxtest.h"

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

class EngineTest : public ::testing::Test {
 protected:
  void SetUp() override {
    info_.Name = dir_ / "db.vxm";
    info_.ThumbInfo.Width = 160;
    info_.ThumbInfo.Height = 120;
    info_.ThumbInfo.Depth = 24;
    info_.ThumbInfo.Quality = 90;
    info_.ThumbInfo.Version = 1;
    engine_.SetLogFile(&log_);
  }

  void CreateAndClose() {
    ASSERT_EQ(engine_.Create(info_), VX_OK);
    ASSERT_EQ(engine_.Close(), VX_OK);
  }

  std::string Store(const char* ext) const {
    return *ext ? (dir_ / ("db" + std::string(ext))) : info_.Name;
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

  vxtest::TempDir dir_;
  vxtest::CapturedLog log_;
  SVXCreateInfo info_;
  CVXEngine engine_;
};

TEST_F(EngineTest, CreateMakesEveryStoreAndReopens) {
  ASSERT_EQ(engine_.Create(info_), VX_OK);
  EXPECT_TRUE(engine_.IsOpen());
  EXPECT_FALSE(engine_.IsReadOnly());
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
    std::vector<uint8_t> thumbs = Record(db, Sel(5, 1));
    ASSERT_EQ(thumbs.size(), 280u);
    uint32_t fields[6];
    std::memcpy(fields, thumbs.data(), sizeof fields);
    EXPECT_EQ(fields[1], 160u);
    EXPECT_EQ(fields[2], 120u);
    EXPECT_EQ(fields[4], 90u);
  });

  ASSERT_EQ(engine_.Open(info_), VX_OK);
  EXPECT_EQ(uint32_t{engine_.GetThumbInfo().Width}, 160u);
  CVXTable table(1000);
  EXPECT_EQ(engine_.GetPropertyDatabase().GetTable(table), VX_OK);
  EXPECT_EQ(engine_.Catalog().Groups().count(0xFFFFEFFF), 1u);
}

TEST_F(EngineTest, SecondOpenerGetsSharingViolation) {
  ASSERT_EQ(engine_.Create(info_), VX_OK);
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

TEST_F(EngineTest, AppDataPersistsAndIsCappedAndFlushWritesOnlyWhenModified) {
  ASSERT_EQ(engine_.Create(info_), VX_OK);
  std::vector<uint8_t> data(5000);
  for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<uint8_t>(i * 7);
  EXPECT_EQ(engine_.SetAppData(data.data(), data.size()), VX_OK);
  EXPECT_TRUE(engine_.IsModified());
  ASSERT_EQ(engine_.Close(), VX_OK);
  EXPECT_FALSE(engine_.IsModified());

  ASSERT_EQ(engine_.Open(info_), VX_OK);
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
}

TEST_F(EngineTest, CoreInfoFallsBackToItsCopy) {
  CreateAndClose();
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
  CreateAndClose();
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
  EXPECT_EQ(uint32_t{t.Field0}, 3u);
  EXPECT_EQ(uint32_t{t.Width}, 64u);
  EXPECT_EQ(uint32_t{t.Height}, 48u);
  EXPECT_EQ(uint32_t{t.Depth}, 16u);
  EXPECT_EQ(uint32_t{t.Quality}, 55u);
  EXPECT_EQ(uint32_t{t.Version}, 1u);
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

TEST_F(EngineTest, ReadOnlyOpenRecreatesALostSortStoreAndRefusesMutation) {
  CreateAndClose();
  std::filesystem::remove(Store(".vxlt"));
  info_.ReadOnly = true;
  ASSERT_EQ(engine_.Open(info_), VX_OK);
  EXPECT_TRUE(engine_.IsReadOnly());
  EXPECT_TRUE(std::filesystem::exists(Store(".vxlt")));
  EXPECT_EQ(engine_.SetAppData("x", 1), VX_OK);  // memory only: Flush skips a read-only store
  log_.ClearCaptured();
  EXPECT_EQ(engine_.Flush(), VX_OK);
  EXPECT_FALSE(log_.Has("Flushing core info"));
}

// Every store file replaced by junk, truncated to nothing or cut short: Open answers with a code
// and a log line (or, for the disposable stores, repairs), and never crashes.
TEST_F(EngineTest, DamagedStoreFilesGiveCodesNotCrashes) {
  CreateAndClose();
  std::vector<std::string> backups;
  for (const char* ext : kStoreExts) backups.push_back(vxtest::ReadFile(Store(ext)));
  const std::string variants[] = {"", "junk junk junk junk", std::string(3000, '\x5A')};
  for (size_t s = 0; s < std::size(kStoreExts); ++s) {
    const char* ext = kStoreExts[s];
    for (const std::string& variant : variants) {
      for (size_t i = 0; i < std::size(kStoreExts); ++i) {
        vxtest::WriteFile(Store(kStoreExts[i]), backups[i]);
      }
      vxtest::WriteFile(Store(ext), variant);
      log_.ClearCaptured();
      CVXEngine engine;
      engine.SetLogFile(&log_);
      unsigned rc = engine.Open(info_);
      std::string what =
          std::string("store '") + ext + "' as " + std::to_string(variant.size()) + " bytes";
      if (std::string(ext) == ".vxlt" || std::string(ext) == ".v3x") {
        // The sort store is recreated; the XMP store is not fatal.
        EXPECT_EQ(rc, VX_OK) << what;
      } else {
        EXPECT_NE(rc, VX_OK) << what;
        EXPECT_FALSE(engine.IsOpen()) << what;
        EXPECT_TRUE(log_.Has("VXEngine::Open")) << what;
      }
      if (std::string(ext) == ".v3x" && !variant.empty()) {
        EXPECT_TRUE(log_.Has("    Failed to open database with")) << what;
      }
    }
  }
}

// Public operations from many threads meet the engine's lock; run under ThreadSanitizer in CI.
TEST_F(EngineTest, ConcurrentCallersAreSerialised) {
  ASSERT_EQ(engine_.Create(info_), VX_OK);
  std::vector<std::thread> threads;
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

TEST_F(EngineTest, OidsKeepRisingAcrossCloseAndOpen) {
  ASSERT_EQ(engine_.Create(info_), VX_OK);
  uint32_t last = 0;
  for (int round = 0; round < 4; ++round) {
    for (int i = 0; i < 3; ++i) {
      uint32_t oid = engine_.Catalog().GenerateFileOID();
      EXPECT_GT(oid, last);
      last = oid;
    }
    ASSERT_EQ(engine_.Close(), VX_OK);
    ASSERT_EQ(engine_.Open(info_), VX_OK);
  }
  EXPECT_EQ(last, 12u);
}

}  // namespace

namespace {

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
