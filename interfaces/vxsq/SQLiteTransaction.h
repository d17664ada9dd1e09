#pragma once

class CVXSQLite;

// A transaction on a CVXSQLite, atomic with respect to other threads: from BeginTrans until
// Commit or rollback it holds the database's recursive mutex, so other threads' calls on that
// database wait, while calls on this thread (operations of the database, nested transactions)
// go on. BeginTrans, Commit and the destructor must run on one thread.
//
// Built on SQLite savepoints, so transactions nest: an inner Commit keeps its changes inside the
// outer transaction, which alone makes them durable; an inner rollback undoes the inner part only.
// The destructor rolls back what was not committed. If the database is closed meanwhile, or an
// Abort took the transaction back, Commit answers false and the destructor only lets go of the
// mutex.
class CSQLiteTransaction {
 public:
  explicit CSQLiteTransaction(CVXSQLite& db) : db_(db) {}
  CSQLiteTransaction(const CSQLiteTransaction&) = delete;
  CSQLiteTransaction& operator=(const CSQLiteTransaction&) = delete;
  ~CSQLiteTransaction();

  // False when the database is closed, when this object already holds a transaction, or when
  // SQLite refuses; the reason is in the database's GetLastErrorMsg.
  bool BeginTrans();
  // False when no transaction is open or the commit failed; a failed commit is rolled back.
  bool Commit();
  // Undoes everything since BeginTrans and ends the transaction; nothing when none is open.
  void Rollback();
  bool IsActive() const { return level_ != 0; }

 private:
  bool Exec_(const char* verb);
  void End_();

  CVXSQLite& db_;
  int level_ = 0;  // this transaction's savepoint depth; 0 when none is open
};
