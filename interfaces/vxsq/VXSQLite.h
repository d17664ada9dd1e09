#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>

#include "VXBase.h"

class CQRLLogfile;
class CSQLiteStatement;

// One SQLite database file, held by this object alone from Create or Open until Close.
//
// Results: every int operation returns 0 on success; on failure an SQLite result code, or -1 for
// a failure of this layer (not open, bad argument, missing record, not a database of the right
// kind), and GetLastErrorMsg() tells why. Failures are logged when a log is set, except a
// missing record.
// Durability: WAL journal with synchronous=NORMAL: what a returned call wrote survives a crash
// of the process.
// Exclusivity: Create and Open take flock(LOCK_EX | LOCK_NB) on the file, held until Close. A
// second opener, in this process or another, fails at once with 5 (SQLite's busy code) and a
// text saying that the database is held by another user.
// Threads: every operation takes the database's recursive mutex, so operations of one object may
// be called from any thread; CSQLiteTransaction holds the same mutex for its whole length. Abort,
// IsOpen, GetFileSize and GetLastErrorMsg do not wait for a running statement.
class CVXSQLite : public CVXBase {
 public:
  CVXSQLite();
  CVXSQLite(const CVXSQLite&) = delete;
  CVXSQLite& operator=(const CVXSQLite&) = delete;
  ~CVXSQLite() override;

  // Creates the file, replacing an existing one (with its WAL) unless another opener holds it.
  // An object that is open is closed first.
  virtual int Create(const std::string& path);
  // Opens an existing file; a missing file fails (14, SQLite's cannot-open code), so does a file
  // that is not an SQLite database (26). An object that is open is closed first.
  virtual int Open(const std::string& path);
  // Checkpoints, closes the connection, then releases the file lock. Closing a closed object
  // succeeds. A transaction still open is rolled back.
  virtual int Close();

  // Runs SQL text that returns no rows. Use CSQLiteTransaction rather than BEGIN/COMMIT here:
  // the transaction bookkeeping does not see SQL text.
  int Execute(const std::string& sql);
  // Interrupts the statement running on another thread, which then fails with 9 (SQLite's
  // interrupt code); a statement inside a transaction may take the whole transaction back with
  // it. Does nothing when no statement runs. -1 when closed.
  int Abort();
  // Rebuilds the file compactly and truncates the WAL. Fails inside a transaction.
  int Vacuum();
  // The text of the most recent failure on this object, from whichever thread; a caller inside
  // a CSQLiteTransaction reads its own. Empty if nothing failed yet.
  std::string GetLastErrorMsg() const;
  // The log is owned by the caller and must outlive its use here; null turns logging off.
  void SetLogFile(CQRLLogfile* log);
  // Bytes on disk of the database and its WAL; 0 when closed.
  int64_t GetFileSize() const;
  bool IsOpen() const;

 protected:
  std::recursive_mutex& Mutex() const;
  // Runs one statement, cached by the address of `sql` (pass string literals). `bind` sets the
  // parameters; `row` is called for each result row and returns false to stop early. The
  // statement is reset before return, so no read stays open. Takes the mutex; fails with -1 when
  // closed.
  using Binder = std::function<void(CSQLiteStatement&)>;
  using RowReader = std::function<bool(const CSQLiteStatement&)>;
  int Query(const char* sql, const Binder& bind, const RowReader& row = nullptr);
  // Records `text` as the last error, logs it, and returns `code`.
  int Fail(int code, const std::string& text);
  // Records `text` as the last error without logging it (an expected miss), returns -1.
  int Miss(const std::string& text);
  // Fail with -1 and "the database is not open".
  int NotOpen();

 private:
  friend class CSQLiteTransaction;
  struct Impl;

  int Lock_(const std::string& path, bool create);
  int Connect_(const std::string& path);
  int FailSQLite_(int rc);
  void Release_();

  std::unique_ptr<Impl> impl_;
};
