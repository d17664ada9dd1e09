#include "SQLiteTransaction.h"

#include <string>

#include "SQLiteStatement.h"
#include "VXSQLite.h"
#include "VXSQLiteImpl.h"

CSQLiteTransaction::~CSQLiteTransaction() { Rollback(); }

bool CSQLiteTransaction::BeginTrans() {
  if (level_) return false;
  db_.impl_->mutex.lock();
  if (!db_.impl_->db) {
    db_.NotOpen();
    db_.impl_->mutex.unlock();
    return false;
  }
  level_ = ++db_.impl_->depth;
  if (!Exec_("SAVEPOINT")) {
    --db_.impl_->depth;
    End_();
    return false;
  }
  return true;
}

bool CSQLiteTransaction::Commit() {
  if (!level_) return false;
  // A close, or an interrupt that rolled the whole transaction back, has taken our savepoint.
  bool lost = !db_.impl_->db || db_.impl_->depth < level_ || sqlite3_get_autocommit(db_.impl_->db);
  if (lost) {
    db_.Fail(-1, "the transaction was ended by a close or an abort");
    Rollback();
    return false;
  }
  if (!Exec_("RELEASE")) {
    Rollback();
    return false;
  }
  db_.impl_->depth = level_ - 1;
  End_();
  return true;
}

void CSQLiteTransaction::Rollback() {
  if (!level_) return;
  auto& impl = *db_.impl_;
  if (impl.db && impl.depth >= level_ && !sqlite3_get_autocommit(impl.db)) {
    Exec_("ROLLBACK TO");
    Exec_("RELEASE");
  }
  if (impl.depth >= level_) impl.depth = level_ - 1;
  End_();
}

bool CSQLiteTransaction::Exec_(const char* verb) {
  std::string sql = std::string(verb) + " vxsp" + std::to_string(level_);
  std::string error;
  int rc = SQLiteExec(db_.impl_->db, sql.c_str(), &error);
  if (rc != SQLITE_OK) db_.Fail(rc, error);
  return rc == SQLITE_OK;
}

void CSQLiteTransaction::End_() {
  level_ = 0;
  db_.impl_->mutex.unlock();
}
