#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <string>
#include <string_view>

// A prepared SQLite statement, finalized on destruction. Internal to the stores; not installed.
// Bind indices and column indices follow SQLite (binds from 1, columns from 0).
class CSQLiteStatement {
 public:
  CSQLiteStatement() = default;
  CSQLiteStatement(sqlite3* db, const char* sql) { Prepare(db, sql); }
  CSQLiteStatement(const CSQLiteStatement&) = delete;
  CSQLiteStatement& operator=(const CSQLiteStatement&) = delete;
  CSQLiteStatement(CSQLiteStatement&& o) noexcept : stmt_(o.stmt_) { o.stmt_ = nullptr; }
  CSQLiteStatement& operator=(CSQLiteStatement&& o) noexcept;
  ~CSQLiteStatement() { Finalize(); }

  // Returns the SQLite result code; on failure the statement stays empty.
  int Prepare(sqlite3* db, const char* sql);
  void Finalize();
  bool Ok() const { return stmt_ != nullptr; }
  sqlite3_stmt* Get() const { return stmt_; }

  CSQLiteStatement& Bind(int i, int64_t v) {
    sqlite3_bind_int64(stmt_, i, v);
    return *this;
  }
  CSQLiteStatement& Bind(int i, double v) {
    sqlite3_bind_double(stmt_, i, v);
    return *this;
  }
  CSQLiteStatement& Bind(int i, std::string_view v) {
    sqlite3_bind_text(stmt_, i, v.data(), static_cast<int>(v.size()), SQLITE_TRANSIENT);
    return *this;
  }
  // The blob is not copied: it must outlive the next Step.
  CSQLiteStatement& BindBlob(int i, const void* data, size_t size) {
    sqlite3_bind_blob(stmt_, i, data ? data : "", static_cast<int>(size), SQLITE_STATIC);
    return *this;
  }
  CSQLiteStatement& BindNull(int i) {
    sqlite3_bind_null(stmt_, i);
    return *this;
  }

  // SQLITE_ROW, SQLITE_DONE or an error code.
  int Step() { return sqlite3_step(stmt_); }
  // Resets for the next execution and clears the bindings.
  void Reset() {
    sqlite3_reset(stmt_);
    sqlite3_clear_bindings(stmt_);
  }

  int64_t Int64(int c) const { return sqlite3_column_int64(stmt_, c); }
  double Double(int c) const { return sqlite3_column_double(stmt_, c); }
  bool IsNull(int c) const { return sqlite3_column_type(stmt_, c) == SQLITE_NULL; }
  std::string_view Text(int c) const {
    const auto* p = reinterpret_cast<const char*>(sqlite3_column_text(stmt_, c));
    return p ? std::string_view(p, sqlite3_column_bytes(stmt_, c)) : std::string_view();
  }
  const void* Blob(int c) const { return sqlite3_column_blob(stmt_, c); }
  int Bytes(int c) const { return sqlite3_column_bytes(stmt_, c); }

 private:
  sqlite3_stmt* stmt_ = nullptr;
};

// Runs SQL text that returns no rows; the SQLite result code. `error` gets SQLite's message.
int SQLiteExec(sqlite3* db, const char* sql, std::string* error = nullptr);
