#include "VXSQLite.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "QRLLogfile.h"
#include "SQLiteStatement.h"
#include "VXSQLiteImpl.h"

namespace {

int64_t SizeOf(const std::string& path) {
  struct stat st {};
  return ::stat(path.c_str(), &st) == 0 ? static_cast<int64_t>(st.st_size) : 0;
}

}  // namespace

CVXSQLite::CVXSQLite() : impl_(std::make_unique<Impl>()) {}

CVXSQLite::~CVXSQLite() { CVXSQLite::Close(); }

int CVXSQLite::Create(const std::string& path) {
  std::lock_guard lock(impl_->mutex);
  Close();
  if (int rc = Lock_(path, true)) return rc;
  // The lock is ours, so nobody uses the old file: empty it and drop its journals, which would
  // otherwise be replayed into the new database.
  if (::ftruncate(impl_->lockFd, 0) != 0) {
    const char* why = std::strerror(errno);
    int rc = Fail(SQLITE_IOERR, "cannot truncate " + path + ": " + why);
    Release_();
    return rc;
  }
  for (const char* suffix : {"-wal", "-shm", "-journal"}) ::unlink((path + suffix).c_str());
  return Connect_(path);
}

int CVXSQLite::Open(const std::string& path) {
  std::lock_guard lock(impl_->mutex);
  Close();
  if (int rc = Lock_(path, false)) return rc;
  return Connect_(path);
}

int CVXSQLite::Close() {
  std::lock_guard lock(impl_->mutex);
  sqlite3* db = nullptr;
  {
    std::lock_guard handle(impl_->handleMutex);
    db = impl_->db;
    impl_->db = nullptr;
    impl_->path.clear();
  }
  int rc = 0;
  if (db) {
    impl_->statements.clear();
    impl_->depth = 0;
    rc = sqlite3_close_v2(db);
    if (rc != SQLITE_OK) rc = Fail(rc, std::string("close failed: ") + sqlite3_errstr(rc));
  }
  Release_();
  return rc;
}

// Takes the file lock before SQLite opens the file. The descriptor stays open until after the
// connection is closed: closing another descriptor of the file would drop SQLite's own POSIX
// locks on it.
int CVXSQLite::Lock_(const std::string& path, bool create) {
  int flags = O_RDWR | O_CLOEXEC | (create ? O_CREAT : 0);
  int fd = ::open(path.c_str(), flags, 0644);
  if (fd < 0) {
    int error = errno;
    if (error == ENOENT) return Fail(SQLITE_CANTOPEN, "no such database: " + path);
    return Fail(SQLITE_IOERR, "cannot open " + path + ": " + std::strerror(error));
  }
  if (::flock(fd, LOCK_EX | LOCK_NB) != 0) {
    ::close(fd);
    return Fail(SQLITE_BUSY, "the database is held by another user: " + path);
  }
  impl_->lockFd = fd;
  return 0;
}

int CVXSQLite::Connect_(const std::string& path) {
  sqlite3* db = nullptr;
  int rc = sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READWRITE, nullptr);
  if (rc == SQLITE_OK) {
    // journal_mode reads the header first, so a file that is no database fails here.
    // The size limit truncates the WAL at checkpoints after a large transaction.
    rc = SQLiteExec(db,
                    "PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL; "
                    "PRAGMA journal_size_limit=67108864;");
  }
  if (rc != SQLITE_OK) {
    std::string text = db ? sqlite3_errmsg(db) : sqlite3_errstr(rc);
    sqlite3_close_v2(db);
    Release_();
    return Fail(rc, text + ": " + path);
  }
  std::lock_guard handle(impl_->handleMutex);
  impl_->db = db;
  impl_->path = path;
  return 0;
}

void CVXSQLite::Release_() {
  if (impl_->lockFd >= 0) ::close(impl_->lockFd);
  impl_->lockFd = -1;
}

int CVXSQLite::Execute(const std::string& sql) {
  std::lock_guard lock(impl_->mutex);
  if (!impl_->db) return NotOpen();
  std::string error;
  int rc = SQLiteExec(impl_->db, sql.c_str(), &error);
  return rc == SQLITE_OK ? 0 : Fail(rc, error);
}

int CVXSQLite::Abort() {
  std::lock_guard handle(impl_->handleMutex);
  if (!impl_->db) return -1;
  sqlite3_interrupt(impl_->db);
  return 0;
}

int CVXSQLite::Vacuum() {
  std::lock_guard lock(impl_->mutex);
  if (!impl_->db) return NotOpen();
  impl_->statements.clear();  // a statement left stepping would make VACUUM refuse
  if (int rc = Execute("VACUUM")) return rc;
  return Execute("PRAGMA wal_checkpoint(TRUNCATE)");
}

std::string CVXSQLite::GetLastErrorMsg() const {
  std::lock_guard lock(impl_->errorMutex);
  return impl_->lastError;
}

void CVXSQLite::SetLogFile(CQRLLogfile* log) {
  std::lock_guard lock(impl_->errorMutex);
  impl_->log = log;
}

int64_t CVXSQLite::GetFileSize() const {
  std::string path;
  {
    std::lock_guard handle(impl_->handleMutex);
    path = impl_->path;
  }
  return path.empty() ? 0 : SizeOf(path) + SizeOf(path + "-wal");
}

bool CVXSQLite::IsOpen() const {
  std::lock_guard handle(impl_->handleMutex);
  return impl_->db != nullptr;
}

std::recursive_mutex& CVXSQLite::Mutex() const { return impl_->mutex; }

int CVXSQLite::Query(const char* sql, const Binder& bind, const RowReader& row) {
  std::lock_guard lock(impl_->mutex);
  if (!impl_->db) return NotOpen();
  CSQLiteStatement& stmt = impl_->statements[sql];
  if (!stmt.Ok()) {
    if (int rc = stmt.Prepare(impl_->db, sql)) {
      impl_->statements.erase(sql);
      return FailSQLite_(rc);
    }
  }
  // Resets on every way out, also when a callback throws.
  struct ResetOnExit {
    CSQLiteStatement& s;
    ~ResetOnExit() { s.Reset(); }
  } reset{stmt};
  if (bind) bind(stmt);
  for (;;) {
    int rc = stmt.Step();
    if (rc == SQLITE_DONE) return 0;
    if (rc != SQLITE_ROW) return FailSQLite_(rc);
    if (!row || !row(stmt)) return 0;
  }
}

// Both take the connection's mutex as well, so that a failure on another thread never
// overwrites the text while a transaction holds the database.
int CVXSQLite::Fail(int code, const std::string& text) {
  std::lock_guard hold(impl_->mutex);
  std::lock_guard lock(impl_->errorMutex);
  impl_->lastError = text;
  if (impl_->log) impl_->log->AddError(("CVXSQLite: " + text).c_str(), __LINE__, __FILE__);
  return code;
}

int CVXSQLite::Miss(const std::string& text) {
  std::lock_guard hold(impl_->mutex);
  std::lock_guard lock(impl_->errorMutex);
  impl_->lastError = text;
  return -1;
}

int CVXSQLite::NotOpen() { return Fail(-1, "the database is not open"); }

int CVXSQLite::FailSQLite_(int rc) { return Fail(rc, sqlite3_errmsg(impl_->db)); }
