#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <future>
#include <thread>

#include "SQLiteStatement.h"
#include "SQLiteTransaction.h"
#include "VXSQLite.h"
#include "vxtest.h"

namespace {

using namespace std::chrono_literals;

// Reads single values back through the protected query interface.
class CTestDB : public CVXSQLite {
 public:
  // The first column of every row, as one text "1,3,".
  std::string Rows(const char* sql = "SELECT x FROM t ORDER BY x") {
    std::string rows;
    Query(sql, nullptr, [&](const CSQLiteStatement& s) {
      rows += std::string(s.Text(0)) + ",";
      return true;
    });
    return rows;
  }
};

// Runs `work` on another thread, repeating Abort until it ends. A statement in it that cannot
// be interrupted runs for many seconds and fails the test by its result.
template <typename F>
auto RunAborted(CVXSQLite& db, F work) {
  auto result = std::async(std::launch::async, work);
  while (result.wait_for(5ms) != std::future_status::ready) db.Abort();
  return result.get();
}

constexpr const char* kLongSelect =
    "WITH RECURSIVE c(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM c WHERE x < 1000000000) "
    "SELECT count(*) FROM c";
constexpr const char* kLongInsert =
    "INSERT INTO t WITH RECURSIVE c(x) AS (SELECT 100 UNION ALL SELECT x + 1 FROM c "
    "WHERE x < 1000000000) SELECT x FROM c";

class SQLiteTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(db.Create(path), 0) << db.GetLastErrorMsg();
    ASSERT_EQ(db.Execute("CREATE TABLE t(x INTEGER)"), 0);
  }
  void Insert(int x) {
    ASSERT_EQ(db.Execute("INSERT INTO t VALUES (" + std::to_string(x) + ")"), 0);
  }
  vxtest::TempDir dir;
  std::string path = dir / "a.db";
  CTestDB db;
};

TEST_F(SQLiteTest, OpenNeedsAnSQLiteFileAndCreateReplacesOne) {
  CTestDB other;
  EXPECT_EQ(other.Open(dir / "missing.db"), 14);
  EXPECT_NE(other.GetLastErrorMsg().find("no such database"), std::string::npos);
  EXPECT_FALSE(std::filesystem::exists(dir / "missing.db"));
  vxtest::WriteFile(dir / "text.db", std::string(4096, 'x'));
  EXPECT_EQ(other.Open(dir / "text.db"), 26);
  EXPECT_FALSE(other.IsOpen());
  EXPECT_EQ(other.Open(dir / "text.db"), 26);  // not 5: the failed open let go of the lock

  Insert(1);
  ASSERT_EQ(db.Close(), 0);
  vxtest::WriteFile(path + "-wal", std::string(8192, '\x01'));  // a stale journal
  ASSERT_EQ(db.Create(path), 0) << db.GetLastErrorMsg();
  EXPECT_EQ(db.Rows("SELECT count(*) FROM sqlite_schema"), "0,");
}

TEST_F(SQLiteTest, SecondOpenerIsRefusedUntilCloseAndDataOutlivesIt) {
  EXPECT_EQ(db.Rows("PRAGMA journal_mode"), "wal,");
  EXPECT_EQ(db.Rows("PRAGMA synchronous"), "1,");  // NORMAL
  Insert(7);
  EXPECT_GT(db.GetFileSize(), 0);
  CTestDB second;
  EXPECT_EQ(second.Open(path), 5);
  EXPECT_NE(second.GetLastErrorMsg().find("held by another user"), std::string::npos);
  EXPECT_EQ(second.Create(path), 5);
  EXPECT_EQ(db.Rows(), "7,");  // the refused Create truncated nothing
  pid_t child = fork();
  if (child == 0) _exit(CVXSQLite().Open(path));
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(WEXITSTATUS(status), 5);
  ASSERT_EQ(db.Close(), 0);
  EXPECT_EQ(db.GetFileSize(), 0);
  EXPECT_EQ(db.Close(), 0);
  ASSERT_EQ(second.Open(path), 0);
  EXPECT_EQ(second.Rows(), "7,");
}

TEST_F(SQLiteTest, FailuresAreReportedAndLogged) {
  vxtest::CapturedLog log;
  db.SetLogFile(&log);
  EXPECT_EQ(db.Execute("SELEKT 1"), 1);
  EXPECT_NE(db.GetLastErrorMsg().find("syntax error"), std::string::npos);
  EXPECT_TRUE(log.Has("syntax error"));
  db.Close();
  EXPECT_EQ(db.Execute("SELECT 1"), -1);
  EXPECT_EQ(db.Vacuum(), -1);
  EXPECT_EQ(db.Abort(), -1);
  db.SetLogFile(nullptr);
  EXPECT_EQ(db.Execute("SELECT 1"), -1);
  EXPECT_FALSE(CSQLiteTransaction(db).BeginTrans());
  EXPECT_EQ(log.Count("not open"), 2u);
}

TEST_F(SQLiteTest, VacuumShrinksTheFile) {
  ASSERT_EQ(db.Execute("CREATE TABLE b(x); INSERT INTO b SELECT randomblob(1000000)"), 0);
  ASSERT_EQ(db.Execute("DELETE FROM b"), 0);
  int64_t before = db.GetFileSize();
  ASSERT_EQ(db.Vacuum(), 0) << db.GetLastErrorMsg();
  EXPECT_LT(db.GetFileSize(), before - 500000);
  CSQLiteTransaction trans(db);
  ASSERT_TRUE(trans.BeginTrans());
  EXPECT_NE(db.Vacuum(), 0);
}

TEST_F(SQLiteTest, TransactionsCommitNestAndRollBack) {
  {
    CSQLiteTransaction outer(db);
    EXPECT_FALSE(outer.Commit());  // nothing begun
    ASSERT_TRUE(outer.BeginTrans());
    EXPECT_FALSE(outer.BeginTrans());
    Insert(1);
    {
      CSQLiteTransaction inner(db);
      ASSERT_TRUE(inner.BeginTrans());
      Insert(2);
    }  // rolled back
    CSQLiteTransaction inner(db);
    ASSERT_TRUE(inner.BeginTrans());
    Insert(3);
    ASSERT_TRUE(inner.Commit());
    ASSERT_TRUE(outer.Commit());
    EXPECT_FALSE(outer.IsActive());
  }
  {
    CSQLiteTransaction outer(db), inner(db);
    ASSERT_TRUE(outer.BeginTrans());
    ASSERT_TRUE(inner.BeginTrans());
    Insert(4);
    ASSERT_TRUE(inner.Commit());
  }  // the outer rollback takes the committed inner part too
  EXPECT_EQ(db.Rows(), "1,3,");
}

TEST_F(SQLiteTest, TransactionHoldsOtherThreadsOff) {
  CSQLiteTransaction trans(db);
  ASSERT_TRUE(trans.BeginTrans());
  Insert(1);
  std::atomic<bool> done = false;
  std::thread other([&] {
    Insert(2);
    done = true;
  });
  std::this_thread::sleep_for(100ms);
  EXPECT_FALSE(done);
  EXPECT_TRUE(db.IsOpen());  // does not wait
  Insert(3);
  ASSERT_TRUE(trans.Commit());
  other.join();
  EXPECT_EQ(db.Rows("SELECT x FROM t ORDER BY rowid"), "1,3,2,");
}

// Abort interrupts only what runs. A close or an interrupted write ends the transaction around
// it: Commit then fails, and the transaction still lets go of the database for other threads.
TEST_F(SQLiteTest, AbortAndCloseEndWhatRuns) {
  EXPECT_EQ(db.Abort(), 0);  // nothing runs: no effect on what follows
  Insert(1);
  EXPECT_EQ(RunAborted(db, [&] { return db.Execute(kLongSelect); }), 9);
  auto [rc, committed] = RunAborted(db, [&] {
    CSQLiteTransaction trans(db);
    bool begun = trans.BeginTrans();
    Insert(2);
    int rc = db.Execute(kLongInsert);
    return std::pair(rc, begun && trans.Commit());
  });
  EXPECT_EQ(rc, 9);
  EXPECT_FALSE(committed);
  EXPECT_EQ(db.Rows(), "1,");
  {
    CSQLiteTransaction trans(db);
    ASSERT_TRUE(trans.BeginTrans());
    Insert(3);
    db.Close();
    EXPECT_FALSE(trans.Commit());
  }
  auto other = std::async(std::launch::async, [&] { return db.Open(path); });
  ASSERT_EQ(other.wait_for(10s), std::future_status::ready);
  EXPECT_EQ(other.get(), 0);
  EXPECT_EQ(db.Rows(), "1,");
}

}  // namespace
