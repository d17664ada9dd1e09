#include <gtest/gtest.h>
#include <signal.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>

#include "QRLBlobDB.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "vxtest.h"

namespace fs = std::filesystem;
using Sel = CQRLBlobDB::SSelector;

namespace {

// Started by RunChild, the binary is only a second opener: it prints the code of one Open or
// Create and leaves before any test runs.
const bool kChild = [] {
  const char* arg = std::getenv("VXFDB_TEST_CHILD");
  if (!arg) return false;
  std::string mode(arg, 2), path(arg + 2);
  CQRLBlobDB db;
  unsigned rc = mode == "c:" ? db.Create(path, 0) : db.Open(path, mode == "r:");
  std::printf("%u\n", rc);
  std::fflush(stdout);
  _exit(0);
}();

// The code that a fresh process gets for `mode` ("o:", "r:" read-only, "c:" create) of `path`.
unsigned RunChild(const std::string& mode, const std::string& path) {
  std::string command =
      "VXFDB_TEST_CHILD='" + mode + path + "' " + fs::read_symlink("/proc/self/exe").string();
  FILE* out = popen(command.c_str(), "r");
  unsigned rc = 0;
  if (out && std::fscanf(out, "%u", &rc) != 1) rc = 0;
  if (out) pclose(out);
  return rc;
}

std::string Record(uint32_t oid, size_t size) {
  std::string r(size, '\0');
  for (size_t i = 0; i < size; ++i) r[i] = static_cast<char>(oid * 31 + i * 7);
  return r;
}

std::string FileBytes(const std::string& path) {
  return fs::is_regular_file(path) ? vxtest::ReadFile(path) : "<none>";
}

class BlobDBTest : public ::testing::Test {
 protected:
  unsigned Put(CQRLBlobDB& db, Sel sel, size_t size) {
    auto r = Record(sel.Oid, size);
    return db.Set(sel, r.data(), static_cast<unsigned>(size));
  }
  bool Intact(CQRLBlobDB& db, Sel sel, size_t size) {
    CVXMemFile mem;
    auto want = Record(sel.Oid, size);
    return db.Get(sel, mem) == VX_OK && mem.GetFileSize() == size &&
           std::equal(want.begin(), want.end(), mem.GetBuffer(),
                      [](char w, uint8_t g) { return uint8_t(w) == g; });
  }

  vxtest::TempDir tmp_;
  std::string dir_ = tmp_.path().string(), path_ = tmp_ / "store.vxt";
};

// Everything a reader can observe, for comparing the cache configurations.
std::string Observe(CQRLBlobDB& db, const std::vector<Sel>& sels) {
  std::ostringstream o;
  for (const Sel& s : sels) {
    unsigned size = 0;
    o << db.GetSize(s, size) << ":" << size << ":" << db.HasRecord(s) << " ";
  }
  unsigned total = 0, count = 0;
  std::vector<uint32_t> sorted, unsorted;
  o << db.GetSize(sels, total) << ":" << total << " " << db.GetNumberOfRecords(2, count) << ":"
    << count << " " << db.GetOids(2, sorted, true) << " " << db.GetOids(2, unsorted, false);
  std::set<uint32_t> set(unsorted.begin(), unsorted.end());
  o << " " << std::is_sorted(sorted.begin(), sorted.end())
    << (set == std::set<uint32_t>(sorted.begin(), sorted.end()));
  for (uint32_t oid : sorted) o << " " << oid;
  std::string bytes(total, '\0');
  o << " " << db.Get(sels, bytes.data(), bytes.size()) << bytes;
  return o.str();
}

}  // namespace

TEST_F(BlobDBTest, RecordsRoundTripAndPersist) {
  CQRLBlobDB db;
  ASSERT_EQ(db.Create(path_, 1), VX_OK);
  // Key range edges: the highest OID of type 1 must not leak into type 2, nor type 65535 wrap.
  const std::vector<std::pair<Sel, size_t>> recs = {
      {{1, 0xFFFFFFFF}, 10}, {{2, 1}, 1601}, {{2, 7}, 0}, {{2, 3}, 200000}, {{65535, 5}, 3}};
  for (auto& [sel, size] : recs) ASSERT_EQ(Put(db, sel, size), VX_OK);
  ASSERT_EQ(Put(db, {2, 1}, 40), VX_OK);  // replace with another size
  EXPECT_EQ(Put(db, {2, 0}, 4), VX_NOT_FOUND);
  char small[41] = {};
  small[40] = 'G';
  EXPECT_EQ(db.Get({2, 1}, small, 39), VX_NOT_FOUND);
  EXPECT_EQ(db.Get({2, 1}, small, 40), VX_OK);
  EXPECT_EQ(std::string(small, 41), Record(1, 40) + 'G');
  EXPECT_TRUE(Intact(db, {2, 7}, 0));
  EXPECT_EQ(db.Remove({2, 7}), VX_OK);
  EXPECT_EQ(db.Remove({2, 7}), VX_NOT_FOUND);
  EXPECT_EQ(db.Get({2, 7}, small), VX_NOT_FOUND);
  ASSERT_EQ(db.Close(), VX_OK);
  ASSERT_EQ(db.Open(path_, false), VX_OK);
  EXPECT_TRUE(Intact(db, {2, 1}, 40) && Intact(db, {2, 3}, 200000) &&
              Intact(db, {1, 0xFFFFFFFF}, 10) && Intact(db, {65535, 5}, 3));
  std::vector<uint32_t> oids;
  EXPECT_EQ(db.GetOids(2, oids, true), VX_OK);
  EXPECT_EQ(oids, (std::vector<uint32_t>{1, 3}));
  EXPECT_EQ(db.GetOids(1, oids, true), VX_OK);
  EXPECT_EQ(oids, (std::vector<uint32_t>{0xFFFFFFFF}));
}

TEST_F(BlobDBTest, BatchReadsAndCachesAgree) {
  CQRLBlobDB db;
  ASSERT_EQ(db.Create(path_, 0), VX_OK);
  std::vector<Sel> sels;
  for (uint32_t oid = 300; oid > 0; oid -= 3) {
    ASSERT_EQ(Put(db, {2, oid}, oid * 5 % 1700), VX_OK);
    sels.push_back({2, oid});
  }
  // Runs of consecutive keys take the range path; 1020 leaves a gap in the stored run.
  for (uint32_t oid = 1001; oid <= 1030; ++oid) {
    ASSERT_EQ(oid == 1020 ? unsigned{VX_OK} : Put(db, {2, oid}, oid * 5 % 1700), VX_OK);
  }
  for (uint32_t oid = 1001; oid < 1020; ++oid) sels.push_back({2, oid});
  ASSERT_EQ(Put(db, {3, 1}, 99), VX_OK);
  sels.insert(sels.begin() + 5, Sel{3, 1});
  std::string plain = Observe(db, sels);
  std::string expected;  // the records one behind the other, in the order asked
  for (const Sel& s : sels) expected += Record(s.Oid, s.Type == 3 ? 99 : s.Oid * 5 % 1700);
  std::string guarded(expected.size() + 1, 'G');
  EXPECT_EQ(db.Get(sels, guarded.data(), expected.size() - 1), VX_NOT_FOUND);
  EXPECT_EQ(guarded.substr(expected.size() - 1), "GG");
  EXPECT_EQ(db.Get(sels, guarded.data()), VX_OK);
  EXPECT_EQ(guarded, expected + 'G');
  std::vector<Sel> withMissing = sels;
  withMissing.push_back({2, 2});
  unsigned size = 0;
  EXPECT_EQ(db.GetSize(withMissing, size), VX_NOT_FOUND);
  EXPECT_EQ(db.Get(withMissing, guarded.data()), VX_NOT_FOUND);
  std::vector<Sel> acrossGap;
  for (uint32_t oid = 1010; oid <= 1030; ++oid) acrossGap.push_back({2, oid});
  EXPECT_EQ(db.GetSize(acrossGap, size), VX_NOT_FOUND);
  EXPECT_EQ(db.Get(acrossGap, guarded.data(), guarded.size()), VX_NOT_FOUND);

  db.EnableCaching(true, 0);
  EXPECT_EQ(Observe(db, sels), plain);
  db.EnableSelectorCache(2, true);
  EXPECT_EQ(Observe(db, sels), plain);
  // Writes must keep the selector cache in step with the table.
  ASSERT_EQ(db.Remove({2, 3}), VX_OK);
  ASSERT_EQ(Put(db, {2, 6}, 7), VX_OK);
  ASSERT_EQ(Put(db, {2, 1000}, 5), VX_OK);
  std::string cached = Observe(db, sels);
  db.ReleaseCaches();
  EXPECT_EQ(Observe(db, sels), cached);
  db.EnableSelectorCache(2, false);
  db.EnableCaching(false, 0);
  EXPECT_EQ(Observe(db, sels), cached);
}

TEST_F(BlobDBTest, OneOpenerAtATime) {
  CQRLBlobDB held, other;
  ASSERT_EQ(held.Create(path_, 0), VX_OK);
  ASSERT_EQ(Put(held, {2, 1}, 100), VX_OK);
  EXPECT_EQ(other.Open(path_, false), VX_SHARING_VIOLATION);
  EXPECT_EQ(other.Open(path_, true), VX_SHARING_VIOLATION);
  EXPECT_EQ(other.Create(path_, 0), VX_SHARING_VIOLATION);
  auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(RunChild("o:", path_), VX_SHARING_VIOLATION);
  EXPECT_EQ(RunChild("c:", path_), VX_SHARING_VIOLATION);
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
  // The refused openers left the holder's store whole and usable.
  EXPECT_TRUE(Intact(held, {2, 1}, 100));
  ASSERT_EQ(Put(held, {2, 2}, 100), VX_OK);
  held.Close();
  EXPECT_EQ(RunChild("r:", path_), VX_OK);
  EXPECT_EQ(other.Open(path_, false), VX_OK);
  EXPECT_TRUE(Intact(other, {2, 2}, 100));
  EXPECT_EQ(other.Create(path_, 0), VX_OK);  // Create starts empty
  EXPECT_FALSE(other.HasRecord({2, 2}));
}

TEST_F(BlobDBTest, KilledWriterLosesNothingReported) {
  int reports[2];
  ASSERT_EQ(pipe(reports), 0);
  pid_t pid = fork();
  if (pid == 0) {
    close(reports[0]);
    CQRLBlobDB db;
    if (db.Create(path_, 0) != VX_OK) _exit(1);
    for (uint32_t oid = 1;; ++oid) {
      if (Put(db, {2, oid}, 1601) == VX_OK && write(reports[1], &oid, 4) != 4) _exit(2);
    }
  }
  close(reports[1]);
  std::vector<uint32_t> done;
  uint32_t oid;
  while (done.size() < 3000 && read(reports[0], &oid, 4) == 4) done.push_back(oid);
  kill(pid, SIGKILL);
  waitpid(pid, nullptr, 0);
  while (read(reports[0], &oid, 4) == 4) done.push_back(oid);
  close(reports[0]);
  ASSERT_GE(done.size(), 3000u);

  // Read-only first: it must read the WAL the writer left, refuse writes and change nothing.
  std::string mainBefore = FileBytes(path_), walBefore = FileBytes(path_ + "-wal");
  ASSERT_NE(walBefore, "<none>");
  CQRLBlobDB db;
  vxtest::CapturedLog log;
  db.SetLogFile(&log);
  ASSERT_EQ(db.Open(path_, true), VX_OK);
  for (uint32_t o : done) ASSERT_TRUE(Intact(db, {2, o}, 1601)) << o;
  EXPECT_EQ(Put(db, {2, 1}, 5), VX_NOT_FOUND);
  EXPECT_EQ(db.Remove({2, 1}), VX_NOT_FOUND);
  EXPECT_EQ(db.Optimize(dir_ + "/opt", nullptr, nullptr), VX_NOT_FOUND);
  EXPECT_FALSE(fs::exists(dir_ + "/opt"));
  db.Close();
  EXPECT_TRUE(FileBytes(path_) == mainBefore && FileBytes(path_ + "-wal") == walBefore);
  EXPECT_FALSE(fs::exists(path_ + "-shm"));
  EXPECT_TRUE(log.Has("Error 10020: CQRLBlobDB::Set " + path_ + " is read-only"));

  ASSERT_EQ(db.Open(path_, false), VX_OK);
  for (uint32_t o : done) ASSERT_TRUE(Intact(db, {2, o}, 1601)) << o;
}

TEST_F(BlobDBTest, BadFilesGiveACodeAndStayUntouched) {
  {
    CQRLBlobDB good;
    ASSERT_EQ(good.Create(path_, 0), VX_OK);
    for (uint32_t oid = 1; oid <= 200; ++oid) ASSERT_EQ(Put(good, {2, oid}, 1601), VX_OK);
  }
  std::string whole = FileBytes(path_);
  const std::vector<std::pair<std::string, std::string>> files = {
      {"zero", ""},
      {"junk", Record(7, 8192)},
      {"half", whole.substr(0, whole.size() / 2)},
      {"header", whole.substr(0, 100)}};
  std::vector<std::string> paths = {dir_ + "/missing", dir_};
  for (auto& [name, bytes] : files) vxtest::WriteFile(paths.emplace_back(tmp_ / name), bytes);
  // A foreign database in WAL mode whose WAL still holds a transaction.
  std::string foreign = dir_ + "/foreign";
  sqlite3* f = nullptr;
  ASSERT_EQ(sqlite3_open(foreign.c_str(), &f), SQLITE_OK);
  int persist = 1;
  sqlite3_file_control(f, nullptr, SQLITE_FCNTL_PERSIST_WAL, &persist);
  sqlite3_db_config(f, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
  ASSERT_EQ(sqlite3_exec(f, "PRAGMA journal_mode=WAL; CREATE TABLE t(x); INSERT INTO t VALUES(1)",
                         nullptr, nullptr, nullptr),
            SQLITE_OK);
  sqlite3_close(f);
  paths.push_back(foreign);

  for (const std::string& p : paths) {
    std::string before = FileBytes(p), walBefore = FileBytes(p + "-wal");
    for (bool ro : {true, false}) {
      CQRLBlobDB db;
      EXPECT_EQ(db.Open(p, ro), VX_NOT_FOUND) << p;
    }
    EXPECT_TRUE(FileBytes(p) == before && FileBytes(p + "-wal") == walBefore) << p;
  }
  EXPECT_FALSE(FileBytes(foreign + "-wal").empty());
  EXPECT_FALSE(fs::exists(dir_ + "/missing"));
}

TEST_F(BlobDBTest, SelfTestFindsDamage) {
  std::vector<std::pair<unsigned long, unsigned long>> progress;
  auto callback = [](CQRLBlobDB::ECBMessage m, unsigned long a, unsigned long b, void* user,
                     const char*) {
    if (m == CQRLBlobDB::cbProgress) static_cast<decltype(progress)*>(user)->push_back({a, b});
  };
  CQRLBlobDB db;
  std::ostringstream report;
  unsigned long errors = 5;
  EXPECT_EQ(db.SelfTest(report, errors, callback, &progress), VX_NOT_FOUND);
  ASSERT_EQ(db.Create(path_, 0), VX_OK);
  for (uint32_t oid = 1; oid <= 5000; ++oid) ASSERT_EQ(Put(db, {2, oid}, 1601), VX_OK);
  EXPECT_EQ(db.SelfTest(report, errors, callback, &progress), VX_OK);
  EXPECT_EQ(errors, 5u);
  ASSERT_FALSE(progress.empty());
  EXPECT_EQ(progress.back().first, progress.back().second);
  EXPECT_TRUE(std::is_sorted(progress.begin(), progress.end()));

  // Rows that no Set can make: OID 0, a key beyond 16-bit types, a value that is no blob.
  ASSERT_EQ(sqlite3_exec(db.Handle(),
                         "INSERT INTO blobdb_records VALUES(2 << 32, x'00'), (1 << 50, x'00'),"
                         "(17, 'text')",
                         nullptr, nullptr, nullptr),
            SQLITE_OK);
  EXPECT_EQ(db.SelfTest(report, errors, nullptr, nullptr), VX_SELFTEST_ERRORS);
  EXPECT_EQ(errors, 8u);
  db.Close();

  // Pages overwritten in the middle of the file: found by the check, and reads give codes.
  {
    std::fstream file(path_, std::ios::in | std::ios::out | std::ios::binary);
    file.seekp(40 * 4096);
    file << std::string(3 * 4096, '\x5A');
  }
  ASSERT_EQ(db.Open(path_, false), VX_OK);
  errors = 0;
  EXPECT_EQ(db.SelfTest(report, errors, nullptr, nullptr), VX_SELFTEST_ERRORS);
  EXPECT_GT(errors, 0u);
  int unreadable = 0;
  for (uint32_t oid = 1; oid <= 5000; ++oid) unreadable += !Intact(db, {2, oid}, 1601);
  EXPECT_GT(unreadable, 0);
}

TEST_F(BlobDBTest, OptimizeCompactsAndKeepsRecords) {
  CQRLBlobDB db, other;
  ASSERT_EQ(db.Create(path_, 0), VX_OK);
  for (uint32_t oid = 1; oid <= 3000; ++oid) ASSERT_EQ(Put(db, {2, oid}, 1601), VX_OK);
  for (uint32_t oid = 1; oid <= 3000; ++oid) {
    ASSERT_EQ(oid % 3 ? db.Remove({2, oid}) : unsigned{VX_OK}, VX_OK);
  }
  ASSERT_EQ(db.Flush(), VX_OK);
  int64_t before = db.GetFileSize();
  // The target is held by another store: it must be refused and left alone.
  std::string held = dir_ + "/held";
  ASSERT_EQ(other.Create(held, 0), VX_OK);
  ASSERT_EQ(Put(other, {2, 9}, 50), VX_OK);
  EXPECT_EQ(db.Optimize(held, nullptr, nullptr), VX_SHARING_VIOLATION);
  EXPECT_TRUE(Intact(other, {2, 9}, 50));

  // A statement of another user on the handle keeps the connection from closing: refused,
  // with the store unchanged and open.
  std::string target = dir_ + "/store.tmp";
  sqlite3_stmt* foreign = nullptr;
  sqlite3_prepare_v2(db.Handle(), "SELECT 1", -1, &foreign, nullptr);
  EXPECT_EQ(db.Optimize(target, nullptr, nullptr), VX_NOT_FOUND);
  sqlite3_finalize(foreign);
  EXPECT_TRUE(Intact(db, {2, 3}, 1601));
  EXPECT_FALSE(fs::exists(target));

  std::ofstream(target) << "stale";
  ASSERT_EQ(db.Optimize(target, nullptr, nullptr), VX_OK);
  EXPECT_FALSE(fs::exists(target));
  EXPECT_LT(db.GetFileSize(), before / 2);
  unsigned count = 0;
  EXPECT_EQ(db.GetNumberOfRecords(2, count), VX_OK);
  EXPECT_EQ(count, 1000u);
  for (uint32_t oid = 3; oid <= 3000; oid += 3) ASSERT_TRUE(Intact(db, {2, oid}, 1601)) << oid;
  EXPECT_EQ(Put(db, {2, 1}, 1601), VX_OK);
  EXPECT_TRUE(fs::exists(path_ + "-wal"));  // still journalled through a WAL
  EXPECT_EQ(RunChild("o:", path_), VX_SHARING_VIOLATION);
  db.Close();
  ASSERT_EQ(db.Open(path_, false), VX_OK);
  EXPECT_TRUE(Intact(db, {2, 1}, 1601) && Intact(db, {2, 3000}, 1601));
}

// One walk hands over what GetOids and batch Gets of the same runs would give, and no record of
// a neighbouring type.
TEST_F(BlobDBTest, GetAllWalksATypeInRuns) {
  CQRLBlobDB db;
  std::vector<std::vector<uint32_t>> runs;
  std::string bytes;
  auto collect = [&](uint16_t type, size_t runLength) {
    return db.GetAll(type, runLength, [&](std::vector<uint32_t>& oids, std::vector<uint8_t>& b) {
      runs.push_back(oids);
      bytes.append(b.begin(), b.end());
      // The sink may take the buffers and give others back: the walk empties them first.
      std::vector<uint32_t> otherOids = {99};
      std::vector<uint8_t> otherBytes(3, 0xEE);
      oids.swap(otherOids);
      b.swap(otherBytes);
      return unsigned{VX_OK};
    });
  };
  EXPECT_EQ(collect(2, 3), VX_NOT_FOUND);  // closed
  ASSERT_EQ(db.Create(path_, 0), VX_OK);
  ASSERT_EQ(Put(db, {1, 0xFFFFFFFF}, 4), VX_OK);
  ASSERT_EQ(Put(db, {3, 1}, 4), VX_OK);
  std::string want;  // the records in the order of their keys
  for (uint32_t oid : {40u, 2u, 9u, 10u, 11u, 500u, 7u, 0xFFFFFFFFu}) {
    ASSERT_EQ(Put(db, {2, oid}, oid % 700), VX_OK);
  }
  for (uint32_t oid : {2u, 7u, 9u, 10u, 11u, 40u, 500u, 0xFFFFFFFFu}) {
    want += Record(oid, oid % 700);
  }

  ASSERT_EQ(collect(2, 3), VX_OK);
  EXPECT_EQ(runs, (std::vector<std::vector<uint32_t>>{{2, 7, 9}, {10, 11, 40}, {500, 0xFFFFFFFF}}));
  EXPECT_EQ(bytes, want);

  runs.clear();
  EXPECT_EQ(collect(4, 3), VX_OK);
  EXPECT_TRUE(runs.empty());
  int calls = 0;
  EXPECT_EQ(db.GetAll(2, 2, [&](auto&, auto&) { return ++calls == 2 ? 10123u : VX_OK; }), 10123u);
  EXPECT_EQ(calls, 2);
}
