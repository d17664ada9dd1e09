#pragma once

#include <sqlite3.h>

#include <mutex>
#include <string>
#include <unordered_map>

#include "SQLiteStatement.h"
#include "VXSQLite.h"

// The state of a CVXSQLite, shared with CSQLiteTransaction. Internal; not installed.
// Lock order: mutex (recursive, the connection), then handleMutex (the pointer itself, so that
// Abort never touches a connection being closed), then errorMutex.
struct CVXSQLite::Impl {
  mutable std::recursive_mutex mutex;
  mutable std::mutex handleMutex;
  mutable std::mutex errorMutex;
  sqlite3* db = nullptr;
  std::string path;
  int lockFd = -1;
  std::string lastError;
  CQRLLogfile* log = nullptr;
  // Prepared statements by the address of their SQL text; finalized before the connection closes.
  std::unordered_map<const char*, CSQLiteStatement> statements;
  // Savepoints open on the connection (CSQLiteTransaction nesting).
  int depth = 0;
};
