#include "SQLiteStatement.h"

CSQLiteStatement& CSQLiteStatement::operator=(CSQLiteStatement&& o) noexcept {
  if (this != &o) {
    Finalize();
    stmt_ = o.stmt_;
    o.stmt_ = nullptr;
  }
  return *this;
}

int CSQLiteStatement::Prepare(sqlite3* db, const char* sql) {
  Finalize();
  return sqlite3_prepare_v3(db, sql, -1, SQLITE_PREPARE_PERSISTENT, &stmt_, nullptr);
}

void CSQLiteStatement::Finalize() {
  if (stmt_) sqlite3_finalize(stmt_);
  stmt_ = nullptr;
}

int SQLiteExec(sqlite3* db, const char* sql, std::string* error) {
  char* message = nullptr;
  int rc = sqlite3_exec(db, sql, nullptr, nullptr, &message);
  if (error) *error = message ? message : "";
  sqlite3_free(message);
  return rc;
}
