#include "QRLBlobDB.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <cstring>
#include <filesystem>
#include <map>
#include <ostream>
#include <unordered_map>

#include "BlobFileLock.h"
#include "QRLLogfile.h"
#include "SQLiteStatement.h"
#include "VXMemFile.h"
#include "VXResult.h"

namespace {

using SSelector = CQRLBlobDB::SSelector;

// Format marker in the settings table: tells a store from any other SQLite file.
constexpr const char* kFormatName = "QRLBlobDB";
constexpr int64_t kFormatVersion = 1;

constexpr unsigned kDefaultCacheKB = 32 * 1024;
constexpr unsigned kSqliteDefaultCacheKB = 2000;
constexpr int64_t kMmapBytes = int64_t{256} << 20;
constexpr unsigned kSelfTestSteps = 2;  // integrity check, settings; then one per record
constexpr unsigned kProgressEvery = 4096;

// Records are keyed by the rowid (type << 32) | oid: a lookup is a rowid lookup, and rowid
// order is (type, OID) order, so all records of one type are one key range.
int64_t Key(const SSelector& sel) { return (int64_t{sel.Type} << 32) | sel.Oid; }
int64_t FirstKey(uint16_t type) { return int64_t{type} << 32; }
int64_t LastKey(uint16_t type) { return FirstKey(type) | 0xFFFFFFFF; }

std::string SelText(const SSelector& sel) {
  return std::to_string(sel.Type) + "/" + std::to_string(sel.Oid);
}

uint32_t BigEndian(const unsigned char* p, int bytes) {
  uint32_t v = 0;
  for (int i = 0; i < bytes; ++i) v = (v << 8) | p[i];
  return v;
}

bool WalHasContent(const std::string& path) {
  struct stat st {};
  return ::stat((path + "-wal").c_str(), &st) == 0 && st.st_size > 0;
}

// Rejects zero-byte files, junk and truncated databases before SQLite reads (and might recover
// into) them. The page count of the header is only trusted when it is current and no WAL may
// hold pages beyond the main file.
bool LooksLikeWholeDatabase(int fd, const std::string& path) {
  unsigned char h[100];
  if (::pread(fd, h, sizeof h, 0) != static_cast<ssize_t>(sizeof h)) return false;
  if (std::memcmp(h, "SQLite format 3", 16) != 0) return false;
  uint32_t pageSize = BigEndian(h + 16, 2);
  if (pageSize == 1) pageSize = 65536;
  if (pageSize < 512 || pageSize > 65536 || (pageSize & (pageSize - 1)) != 0) return false;
  struct stat st {};
  if (::fstat(fd, &st) != 0) return false;
  bool countCurrent = std::memcmp(h + 24, h + 92, 4) == 0;
  uint64_t bytes = uint64_t{BigEndian(h + 28, 4)} * pageSize;
  return !countCurrent || WalHasContent(path) || bytes <= static_cast<uint64_t>(st.st_size);
}

void RemoveSidecars(const std::string& path) {
  for (const char* suffix : {"-wal", "-shm", "-journal"}) ::unlink((path + suffix).c_str());
}

// Makes a rename or a new file in the directory of `path` durable.
void SyncDirectory(const std::string& path) {
  std::string dir = std::filesystem::path(path).parent_path().string();
  int fd = ::open(dir.empty() ? "." : dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return;
  ::fsync(fd);
  ::close(fd);
}

void Progress(CQRLBlobDB::Callback callback, void* user, unsigned long done, unsigned long total) {
  if (callback) callback(CQRLBlobDB::cbProgress, done, total, user, nullptr);
}

}  // namespace

struct CQRLBlobDB::Impl {
  // A read transaction around a batch, so that its records come from one snapshot and the
  // statement need not open one per record. Inside a caller's transaction it does nothing.
  class ReadTransaction {
   public:
    explicit ReadTransaction(Impl& impl) : impl_(impl) {
      began_ = sqlite3_get_autocommit(impl_.db) && impl_.Run(impl_.begin) == SQLITE_DONE;
    }
    ~ReadTransaction() {
      if (began_) impl_.Run(impl_.commit);
    }
    ReadTransaction(const ReadTransaction&) = delete;
    ReadTransaction& operator=(const ReadTransaction&) = delete;

   private:
    Impl& impl_;
    bool began_ = false;
  };

  // Sizes of every record of one type. Unloaded until first use after enable or release.
  struct SizeCache {
    bool loaded = false;
    std::unordered_map<uint32_t, unsigned> sizes;
  };

  sqlite3* db = nullptr;
  CBlobFileLock lock;
  std::string path;
  bool readOnly = false;
  // Remove the WAL index at close: set when this connection made it, or the file is our store.
  // SQLite only needs one for read-only opens, and it is rebuilt from the WAL on demand.
  bool dropShm = false;
  CQRLLogfile* log = nullptr;
  bool caching = false;
  unsigned cacheKB = 0;
  std::map<uint16_t, SizeCache> sizeCaches;
  std::string lastError;
  // Reads select (id, data) or (id, length(data)), by one key or by a range of keys; getFrom
  // walks on from a key to wherever the caller stops.
  CSQLiteStatement get, size, getRange, sizeRange, getFrom, set, remove, begin, commit;

  unsigned Fail(unsigned code, const char* op, const std::string& what);
  unsigned SqlFail(const char* op, const std::string& what);
  unsigned CheckWritable(const char* op);
  int Run(CSQLiteStatement& st);
  int Exec(const char* sql);

  unsigned Connect(const std::string& file, bool ro, bool create, unsigned flags);
  std::string CreateSchema(unsigned flags);
  std::string CheckSettings();
  bool PrepareStatements();
  bool Disconnect(bool force);
  void ApplyCaching();
  SizeCache* LoadedCache(uint16_t type);
  bool LoadCache(uint16_t type, SizeCache& cache);
  void UnloadCaches();

  template <class Sink>
  unsigned ReadRecord(const SSelector& sel, const char* op, Sink&& sink);
  template <class Sink>
  unsigned SinkBlob(CSQLiteStatement& st, const char* op, const SSelector& sel, Sink&& sink);
  template <class Row>
  unsigned StepOne(CSQLiteStatement& st, const SSelector& sel, const char* op, Row&& row);
  static size_t RunLength(const std::vector<SSelector>& sels, size_t at);
  template <class Row>
  unsigned ForEachRecord(const std::vector<SSelector>& sels, CSQLiteStatement& one,
                         CSQLiteStatement& range, const char* op, Row&& row);
  template <class Row>
  unsigned StepRange(CSQLiteStatement& st, const std::vector<SSelector>& sels, size_t at, size_t n,
                     const char* op, Row&& row);
  unsigned ReadBatch(const std::vector<SSelector>& sels, uint8_t* out, uint64_t capacity);
  unsigned SizeBatch(const std::vector<SSelector>& sels, uint64_t& total);
  unsigned RecordSize(const SSelector& sel, unsigned& bytes, const char* op);

  unsigned long SelfTestRecords(std::ostream& report, Callback callback, void* user,
                                unsigned long total);
  unsigned ReplaceWith(const std::string& tmp, CBlobFileLock& tmpLock);
};

// ---------------------------------------------------------------------------------------------
// Failures and statements

unsigned CQRLBlobDB::Impl::Fail(unsigned code, const char* op, const std::string& what) {
  if (log) {
    std::string text = std::string("CQRLBlobDB::") + op + " " + what;
    log->AddError(code, text.c_str(), __LINE__, __FILE__);
  }
  return code;
}

unsigned CQRLBlobDB::Impl::SqlFail(const char* op, const std::string& what) {
  return Fail(VX_NOT_FOUND, op, what + ": " + lastError);
}

unsigned CQRLBlobDB::Impl::CheckWritable(const char* op) {
  if (!db) return Fail(VX_NOT_FOUND, op, "store not open");
  if (readOnly) return Fail(VX_NOT_FOUND, op, path + " is read-only");
  return VX_OK;
}

int CQRLBlobDB::Impl::Run(CSQLiteStatement& st) {
  int rc = st.Step();
  if (rc != SQLITE_DONE && rc != SQLITE_ROW) lastError = sqlite3_errmsg(db);
  st.Reset();
  return rc;
}

int CQRLBlobDB::Impl::Exec(const char* sql) { return SQLiteExec(db, sql, &lastError); }

// ---------------------------------------------------------------------------------------------
// Connection

unsigned CQRLBlobDB::Impl::Connect(const std::string& file, bool ro, bool create, unsigned flags) {
  int openFlags = (ro ? SQLITE_OPEN_READONLY : SQLITE_OPEN_READWRITE) | SQLITE_OPEN_NOMUTEX |
                  (create ? SQLITE_OPEN_CREATE : 0);
  path = file;
  dropShm = !std::filesystem::exists(file + "-shm");
  readOnly = ro;
  if (sqlite3_open_v2(file.c_str(), &db, openFlags, nullptr) != SQLITE_OK) {
    lastError = db ? sqlite3_errmsg(db) : "out of memory";
    Disconnect(true);
    return SqlFail("Open", file);
  }
  // Until the file is known to be a store, and always when read-only, closing must not
  // checkpoint a WAL into the file.
  sqlite3_db_config(db, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
  // The flock keeps other processes out; exclusive locking spares the shared-memory index. A
  // read-only descriptor cannot take SQLite's write lock, so read-only opens lock normally.
  std::string problem = !ro && Exec("PRAGMA locking_mode=EXCLUSIVE") != SQLITE_OK ? lastError
                        : create ? CreateSchema(flags)
                                 : CheckSettings();
  if (problem.empty() && !ro &&
      Exec("PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL") != SQLITE_OK) {
    problem = lastError;
  }
  if (problem.empty() && !PrepareStatements()) problem = lastError;
  if (!problem.empty()) {
    Disconnect(true);
    return Fail(VX_NOT_FOUND, "Open", file + ": " + problem);
  }
  if (!ro) sqlite3_db_config(db, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 0, nullptr);
  dropShm = true;
  ApplyCaching();
  return VX_OK;
}

std::string CQRLBlobDB::Impl::CreateSchema(unsigned flags) {
  std::string sql =
      "PRAGMA journal_mode=WAL;"
      "BEGIN;"
      "CREATE TABLE blobdb_settings(name TEXT PRIMARY KEY NOT NULL, value NOT NULL) "
      "WITHOUT ROWID;"
      "CREATE TABLE blobdb_records(id INTEGER PRIMARY KEY, data BLOB NOT NULL);"
      "INSERT INTO blobdb_settings VALUES('format', '" +
      std::string(kFormatName) + "'), ('version', " + std::to_string(kFormatVersion) +
      "), ('flags', " + std::to_string(flags) + ");COMMIT;";
  return Exec(sql.c_str()) == SQLITE_OK ? std::string() : lastError;
}

// Empty when the settings table names this format in a version we read; else the problem.
std::string CQRLBlobDB::Impl::CheckSettings() {
  CSQLiteStatement st(db, "SELECT name, value, typeof(value) FROM blobdb_settings");
  if (!st.Ok()) return std::string("no settings table: ") + sqlite3_errmsg(db);
  bool format = false, version = false;
  int rc;
  while ((rc = st.Step()) == SQLITE_ROW) {
    if (st.Text(0) == "format") format = st.Text(1) == kFormatName;
    if (st.Text(0) == "version") {
      version = st.Text(2) == "integer" && st.Int64(1) >= 1 && st.Int64(1) <= kFormatVersion;
    }
  }
  if (rc != SQLITE_DONE) return std::string("settings unreadable: ") + sqlite3_errmsg(db);
  if (!format) return "settings lack the store's format marker";
  if (!version) return "settings name no readable format version";
  return std::string();
}

bool CQRLBlobDB::Impl::PrepareStatements() {
  auto prepare = [this](CSQLiteStatement& st, const char* sql) {
    if (st.Prepare(db, sql) == SQLITE_OK) return true;
    lastError = sqlite3_errmsg(db);
    return false;
  };
  return prepare(get, "SELECT id, data FROM blobdb_records WHERE id=?1") &&
         prepare(size, "SELECT id, length(data) FROM blobdb_records WHERE id=?1") &&
         prepare(getRange, "SELECT id, data FROM blobdb_records WHERE id BETWEEN ?1 AND ?2") &&
         prepare(sizeRange,
                 "SELECT id, length(data) FROM blobdb_records WHERE id BETWEEN ?1 AND ?2") &&
         prepare(getFrom, "SELECT id, data FROM blobdb_records WHERE id >= ?1") &&
         prepare(set, "INSERT OR REPLACE INTO blobdb_records(id, data) VALUES(?1, ?2)") &&
         prepare(remove, "DELETE FROM blobdb_records WHERE id=?1") && prepare(begin, "BEGIN") &&
         prepare(commit, "COMMIT");
}

// Closes the connection. Without `force` it fails (and keeps the connection whole) while
// statements prepared by others on Handle() are still alive.
bool CQRLBlobDB::Impl::Disconnect(bool force) {
  for (CSQLiteStatement* st :
       {&get, &size, &getRange, &sizeRange, &getFrom, &set, &remove, &begin, &commit}) {
    st->Finalize();
  }
  if (!db) return true;
  if (sqlite3_close(db) != SQLITE_OK) {
    lastError = sqlite3_errmsg(db);
    if (!force) {
      PrepareStatements();
      return false;
    }
    Fail(VX_NOT_FOUND, "Close", path + ": " + lastError);
    sqlite3_close_v2(db);
    dropShm = false;  // the connection may live on as a zombie
  }
  db = nullptr;
  if (dropShm) ::unlink((path + "-shm").c_str());
  return true;
}

void CQRLBlobDB::Impl::ApplyCaching() {
  if (!db) return;
  unsigned kb = caching ? (cacheKB ? cacheKB : kDefaultCacheKB) : kSqliteDefaultCacheKB;
  std::string sql = "PRAGMA cache_size=-" + std::to_string(kb) +
                    "; PRAGMA mmap_size=" + std::to_string(caching ? kMmapBytes : 0);
  if (Exec(sql.c_str()) != SQLITE_OK) Fail(VX_NOT_FOUND, "EnableCaching", lastError);
}

// ---------------------------------------------------------------------------------------------
// Selector caches

CQRLBlobDB::Impl::SizeCache* CQRLBlobDB::Impl::LoadedCache(uint16_t type) {
  auto it = sizeCaches.find(type);
  if (it == sizeCaches.end() || !db) return nullptr;
  if (!it->second.loaded && !LoadCache(type, it->second)) return nullptr;
  return &it->second;
}

bool CQRLBlobDB::Impl::LoadCache(uint16_t type, SizeCache& cache) {
  cache.sizes.clear();
  CSQLiteStatement st(db, "SELECT id, length(data) FROM blobdb_records WHERE id BETWEEN ?1 AND ?2");
  st.Bind(1, FirstKey(type)).Bind(2, LastKey(type));
  int rc = st.Ok() ? SQLITE_ROW : SQLITE_ERROR;
  while (st.Ok() && (rc = st.Step()) == SQLITE_ROW) {
    cache.sizes[static_cast<uint32_t>(st.Int64(0))] = static_cast<unsigned>(st.Int64(1));
  }
  cache.loaded = rc == SQLITE_DONE;
  if (!cache.loaded) {
    cache.sizes = {};
    Fail(VX_NOT_FOUND, "EnableSelectorCache", std::to_string(type) + ": " + sqlite3_errmsg(db));
  }
  return cache.loaded;
}

void CQRLBlobDB::Impl::UnloadCaches() {
  for (auto& [type, cache] : sizeCaches) {
    cache.loaded = false;
    cache.sizes = {};  // gives the memory back, unlike clear()
  }
}

// ---------------------------------------------------------------------------------------------
// Reads

// Looks the record up and hands its bytes to `sink`, whose code is the result. 10020 when the
// record is missing (not logged: callers probe) or SQLite fails (logged).
template <class Sink>
unsigned CQRLBlobDB::Impl::ReadRecord(const SSelector& sel, const char* op, Sink&& sink) {
  if (!db) return Fail(VX_NOT_FOUND, op, "store not open");
  return StepOne(get, sel, op, [&](CSQLiteStatement& st) { return SinkBlob(st, op, sel, sink); });
}

// Hands the blob of the current row (column 1) to `sink`. A null pointer for a non-empty blob
// is SQLite out of memory.
template <class Sink>
unsigned CQRLBlobDB::Impl::SinkBlob(CSQLiteStatement& st, const char* op, const SSelector& sel,
                                    Sink&& sink) {
  const void* data = st.Blob(1);
  size_t bytes = static_cast<size_t>(st.Bytes(1));
  if (!data && bytes) return Fail(VX_NOT_FOUND, op, SelText(sel) + ": out of memory");
  return sink(static_cast<const uint8_t*>(data), bytes);
}

// Steps a statement keyed by one record. `row` sees the row; a missing record is 10020.
template <class Row>
unsigned CQRLBlobDB::Impl::StepOne(CSQLiteStatement& st, const SSelector& sel, const char* op,
                                   Row&& row) {
  st.Bind(1, Key(sel));
  int rc = st.Step();
  unsigned result = VX_NOT_FOUND;
  if (rc == SQLITE_ROW) {
    result = row(st);
  } else if (rc != SQLITE_DONE) {
    lastError = sqlite3_errmsg(db);
    result = SqlFail(op, SelText(sel));
  }
  st.Reset();
  return result;
}

// Number of selectors from `at` on whose keys rise by one: such a run is read with one range
// scan instead of a lookup per record.
size_t CQRLBlobDB::Impl::RunLength(const std::vector<SSelector>& sels, size_t at) {
  size_t n = 1;
  while (at + n < sels.size() && Key(sels[at + n]) == Key(sels[at + n - 1]) + 1) ++n;
  return n;
}

// Walks `sels` in order and calls `row(index, statement)` for each record, through `one` for
// scattered keys and `range` (keys BETWEEN ?1 AND ?2) for runs. The first missing record ends
// the walk with 10020, as a lookup would.
template <class Row>
unsigned CQRLBlobDB::Impl::ForEachRecord(const std::vector<SSelector>& sels, CSQLiteStatement& one,
                                         CSQLiteStatement& range, const char* op, Row&& row) {
  constexpr size_t kMinRun = 8;  // below this a range scan costs more than it saves
  for (size_t at = 0; at < sels.size();) {
    size_t n = RunLength(sels, at);
    unsigned rc = VX_OK;
    if (n < kMinRun) {
      n = 1;
      rc = StepOne(one, sels[at], op, [&](CSQLiteStatement& st) { return row(at, st); });
    } else {
      rc = StepRange(range, sels, at, n, op, row);
    }
    if (rc != VX_OK) return rc;
    at += n;
  }
  return VX_OK;
}

template <class Row>
unsigned CQRLBlobDB::Impl::StepRange(CSQLiteStatement& st, const std::vector<SSelector>& sels,
                                     size_t at, size_t n, const char* op, Row&& row) {
  st.Bind(1, Key(sels[at])).Bind(2, Key(sels[at + n - 1]));
  unsigned result = VX_OK;
  for (size_t i = at; i < at + n && result == VX_OK; ++i) {
    int rc = st.Step();
    if (rc == SQLITE_ROW && st.Int64(0) == Key(sels[i])) {
      result = row(i, st);
    } else if (rc == SQLITE_ROW || rc == SQLITE_DONE) {
      result = VX_NOT_FOUND;  // a gap in the run: that record is missing
    } else {
      lastError = sqlite3_errmsg(db);
      result = SqlFail(op, SelText(sels[i]));
    }
  }
  st.Reset();
  return result;
}

unsigned CQRLBlobDB::Impl::ReadBatch(const std::vector<SSelector>& sels, uint8_t* out,
                                     uint64_t capacity) {
  if (!db) return Fail(VX_NOT_FOUND, "Get", "store not open");
  ReadTransaction transaction(*this);
  uint64_t used = 0;
  return ForEachRecord(sels, get, getRange, "Get", [&](size_t i, CSQLiteStatement& st) {
    return SinkBlob(st, "Get", sels[i], [&](const uint8_t* data, size_t bytes) {
      if (bytes > capacity - used) {
        return Fail(VX_NOT_FOUND, "Get", "buffer too small at " + SelText(sels[i]));
      }
      if (bytes) std::memcpy(out + used, data, bytes);
      used += bytes;
      return unsigned{VX_OK};
    });
  });
}

unsigned CQRLBlobDB::Impl::SizeBatch(const std::vector<SSelector>& sels, uint64_t& total) {
  if (!db) return Fail(VX_NOT_FOUND, "GetSize", "store not open");
  ReadTransaction transaction(*this);
  total = 0;
  auto add = [&](unsigned bytes) {
    total += bytes;
    return total > UINT_MAX ? Fail(VX_NOT_FOUND, "GetSize", "sum exceeds 32 bits")
                            : unsigned{VX_OK};
  };
  if (!sels.empty() && LoadedCache(sels.front().Type)) {
    for (const SSelector& sel : sels) {
      unsigned bytes = 0;
      unsigned rc = RecordSize(sel, bytes, "GetSize");
      if (rc == VX_OK) rc = add(bytes);
      if (rc != VX_OK) return rc;
    }
    return VX_OK;
  }
  return ForEachRecord(sels, size, sizeRange, "GetSize", [&](size_t, CSQLiteStatement& st) {
    return add(static_cast<unsigned>(st.Int64(1)));
  });
}

unsigned CQRLBlobDB::Impl::RecordSize(const SSelector& sel, unsigned& bytes, const char* op) {
  if (!db) return Fail(VX_NOT_FOUND, op, "store not open");
  if (SizeCache* cache = LoadedCache(sel.Type)) {
    auto it = cache->sizes.find(sel.Oid);
    if (it == cache->sizes.end()) return VX_NOT_FOUND;
    bytes = it->second;
    return VX_OK;
  }
  return StepOne(size, sel, op, [&](CSQLiteStatement& st) {
    bytes = static_cast<unsigned>(st.Int64(1));
    return unsigned{VX_OK};
  });
}

// ---------------------------------------------------------------------------------------------
// Lifecycle

CQRLBlobDB::CQRLBlobDB() : impl_(std::make_unique<Impl>()) {}

CQRLBlobDB::~CQRLBlobDB() { Close(); }

unsigned CQRLBlobDB::Create(const std::string& path, unsigned flags) {
  Close();
  Impl& s = *impl_;
  unsigned rc = s.lock.Acquire(path, true, true);
  if (rc != VX_OK) return s.Fail(rc, "Create", path);
  // Only now, holding the lock, may the old content go; a stale WAL would replay into the new
  // file.
  if (::ftruncate(s.lock.Fd(), 0) != 0) {
    s.lock.Release();
    return s.Fail(VX_NOT_FOUND, "Create", path + ": " + std::strerror(errno));
  }
  RemoveSidecars(path);
  rc = s.Connect(path, false, true, flags);
  if (rc != VX_OK) {
    s.lock.Release();
    return rc;
  }
  SyncDirectory(path);
  return VX_OK;
}

unsigned CQRLBlobDB::Open(const std::string& path, bool readOnly) {
  Close();
  Impl& s = *impl_;
  unsigned rc = s.lock.Acquire(path, !readOnly, false);
  if (rc != VX_OK) return s.Fail(rc, "Open", path);
  if (!LooksLikeWholeDatabase(s.lock.Fd(), path)) {
    s.lock.Release();
    return s.Fail(VX_NOT_FOUND, "Open", path + ": not a store, or truncated");
  }
  rc = s.Connect(path, readOnly, false, 0);
  if (rc != VX_OK) s.lock.Release();
  return rc;
}

unsigned CQRLBlobDB::Close() {
  Impl& s = *impl_;
  s.Disconnect(true);
  s.lock.Release();
  s.UnloadCaches();
  s.path.clear();
  s.readOnly = false;
  return VX_OK;
}

unsigned CQRLBlobDB::Flush() {
  Impl& s = *impl_;
  if (!s.db) return s.Fail(VX_NOT_FOUND, "Flush", "store not open");
  if (s.readOnly) return VX_OK;
  // A checkpoint syncs the main file under synchronous=NORMAL; the fsync covers the rest.
  if (s.Exec("PRAGMA wal_checkpoint(TRUNCATE)") != SQLITE_OK) return s.SqlFail("Flush", s.path);
  if (::fsync(s.lock.Fd()) != 0) return s.Fail(VX_NOT_FOUND, "Flush", std::strerror(errno));
  return VX_OK;
}

bool CQRLBlobDB::IsOpen() const { return impl_->db != nullptr; }
bool CQRLBlobDB::IsReadOnly() const { return impl_->db && impl_->readOnly; }
std::string CQRLBlobDB::GetName() const { return impl_->db ? impl_->path : std::string(); }
void CQRLBlobDB::SetLogFile(CQRLLogfile* log) { impl_->log = log; }
sqlite3* CQRLBlobDB::Handle() const { return impl_->db; }

int64_t CQRLBlobDB::GetFileSize() const {
  struct stat st {};
  if (!impl_->db || ::fstat(impl_->lock.Fd(), &st) != 0) return -1;
  int64_t bytes = st.st_size;
  if (::stat((impl_->path + "-wal").c_str(), &st) == 0) bytes += st.st_size;
  return bytes;
}

// ---------------------------------------------------------------------------------------------
// Records

unsigned CQRLBlobDB::Set(const SSelector& sel, const void* data, unsigned size, unsigned) {
  Impl& s = *impl_;
  unsigned rc = s.CheckWritable("Set");
  if (rc != VX_OK) return rc;
  if (sel.Oid == 0) return s.Fail(VX_NOT_FOUND, "Set", SelText(sel) + ": OID 0");
  if ((size && !data) ||
      size > static_cast<unsigned>(sqlite3_limit(s.db, SQLITE_LIMIT_LENGTH, -1))) {
    return s.Fail(VX_NOT_FOUND, "Set", SelText(sel) + ": bad data or size");
  }
  s.set.Bind(1, Key(sel)).BindBlob(2, data, size);
  if (s.Run(s.set) != SQLITE_DONE) return s.SqlFail("Set", SelText(sel));
  auto it = s.sizeCaches.find(sel.Type);
  if (it != s.sizeCaches.end() && it->second.loaded) it->second.sizes[sel.Oid] = size;
  return VX_OK;
}

unsigned CQRLBlobDB::Get(const SSelector& sel, void* buffer) { return Get(sel, buffer, UINT_MAX); }

unsigned CQRLBlobDB::Get(const SSelector& sel, void* buffer, unsigned capacity) {
  return impl_->ReadRecord(sel, "Get", [&](const uint8_t* data, size_t bytes) {
    if (bytes > capacity) {
      return impl_->Fail(VX_NOT_FOUND, "Get", SelText(sel) + ": buffer too small");
    }
    if (bytes) std::memcpy(buffer, data, bytes);
    return unsigned{VX_OK};
  });
}

unsigned CQRLBlobDB::GetExact(const SSelector& sel, void* buffer, unsigned size) {
  unsigned actual = 0;
  unsigned rc = GetSize(sel, actual);
  if (rc != VX_OK) return rc;
  return actual == size ? Get(sel, buffer, size) : VX_NOT_FOUND;
}

unsigned CQRLBlobDB::Get(const SSelector& sel, CVXMemFile& mem) {
  return impl_->ReadRecord(sel, "Get", [&](const uint8_t* data, size_t bytes) {
    uint8_t* out = mem.GetBuffer(bytes);
    if (bytes) std::memcpy(out, data, bytes);
    mem.Rewind();
    return unsigned{VX_OK};
  });
}

unsigned CQRLBlobDB::GetSize(const SSelector& sel, unsigned& size) {
  size = 0;
  return impl_->RecordSize(sel, size, "GetSize");
}

unsigned CQRLBlobDB::Get(const std::vector<SSelector>& sels, void* buffer) {
  return impl_->ReadBatch(sels, static_cast<uint8_t*>(buffer), UINT64_MAX);
}

unsigned CQRLBlobDB::Get(const std::vector<SSelector>& sels, void* buffer, uint64_t capacity) {
  return impl_->ReadBatch(sels, static_cast<uint8_t*>(buffer), capacity);
}

unsigned CQRLBlobDB::GetSize(const std::vector<SSelector>& sels, unsigned& size) {
  uint64_t total = 0;
  unsigned rc = impl_->SizeBatch(sels, total);
  size = rc == VX_OK ? static_cast<unsigned>(total) : 0;
  return rc;
}

bool CQRLBlobDB::HasRecord(const SSelector& sel) {
  unsigned bytes = 0;
  return impl_->db && impl_->RecordSize(sel, bytes, "HasRecord") == VX_OK;
}

unsigned CQRLBlobDB::Remove(const SSelector& sel) {
  Impl& s = *impl_;
  unsigned rc = s.CheckWritable("Remove");
  if (rc != VX_OK) return rc;
  s.remove.Bind(1, Key(sel));
  if (s.Run(s.remove) != SQLITE_DONE) return s.SqlFail("Remove", SelText(sel));
  if (sqlite3_changes(s.db) == 0) return VX_NOT_FOUND;
  auto it = s.sizeCaches.find(sel.Type);
  if (it != s.sizeCaches.end()) it->second.sizes.erase(sel.Oid);
  return VX_OK;
}

unsigned CQRLBlobDB::GetOids(uint16_t type, std::vector<uint32_t>& oids, bool sorted) {
  Impl& s = *impl_;
  oids.clear();
  if (!s.db) return s.Fail(VX_NOT_FOUND, "GetOids", "store not open");
  if (Impl::SizeCache* cache = s.LoadedCache(type)) {
    oids.reserve(cache->sizes.size());
    for (const auto& entry : cache->sizes) oids.push_back(entry.first);
    if (sorted && !std::is_sorted(oids.begin(), oids.end())) std::sort(oids.begin(), oids.end());
    return VX_OK;
  }
  // The key range comes back in key order, so this answer is always sorted.
  CSQLiteStatement st(s.db, "SELECT id FROM blobdb_records WHERE id BETWEEN ?1 AND ?2");
  st.Bind(1, FirstKey(type)).Bind(2, LastKey(type));
  int rc = st.Ok() ? SQLITE_ROW : SQLITE_ERROR;
  while (st.Ok() && (rc = st.Step()) == SQLITE_ROW) {
    oids.push_back(static_cast<uint32_t>(st.Int64(0)));
  }
  if (rc == SQLITE_DONE) return VX_OK;
  oids.clear();
  s.lastError = sqlite3_errmsg(s.db);
  return s.SqlFail("GetOids", std::to_string(type));
}

// One scan walks every record of the type and hands the bytes on as it goes: a bulk load reads
// the type once instead of once to list it and once more in batches.
unsigned CQRLBlobDB::GetAll(uint16_t type, size_t runLength, const RunSink& sink) {
  Impl& s = *impl_;
  // It lists the type, and fails and logs as GetOids does.
  if (!s.db) return s.Fail(VX_NOT_FOUND, "GetOids", "store not open");
  runLength = std::max<size_t>(runLength, 1);
  std::vector<uint32_t> oids;
  std::vector<uint8_t> bytes;
  oids.reserve(runLength);
  // Open-ended, the walk tests one key a row instead of two; it stops at the next type.
  CSQLiteStatement& st = s.getFrom;
  st.Bind(1, FirstKey(type));
  // Also when the sink throws: a statement left stepping would hold the read transaction.
  struct SReset {
    CSQLiteStatement& st;
    ~SReset() { st.Reset(); }
  } reset{st};
  unsigned result = VX_OK;
  int rc = SQLITE_DONE;
  while (result == VX_OK && (rc = st.Step()) == SQLITE_ROW) {
    int64_t key = st.Int64(0);
    if (key > LastKey(type)) {
      rc = SQLITE_DONE;
      break;
    }
    const auto* data = static_cast<const uint8_t*>(st.Blob(1));
    size_t size = static_cast<size_t>(st.Bytes(1));
    if (!data && size) {
      return s.Fail(VX_NOT_FOUND, "GetOids", std::to_string(type) + ": out of memory");
    }
    oids.push_back(static_cast<uint32_t>(key));
    bytes.insert(bytes.end(), data, data + size);
    if (oids.size() == runLength) {
      result = sink(oids, bytes);
      oids.clear();
      bytes.clear();
    }
  }
  if (result != VX_OK) return result;
  if (rc != SQLITE_DONE) {
    s.lastError = sqlite3_errmsg(s.db);
    return s.SqlFail("GetOids", std::to_string(type));
  }
  st.Reset();  // done with the store before the last run goes out
  return oids.empty() ? VX_OK : sink(oids, bytes);
}

unsigned CQRLBlobDB::GetNumberOfRecords(uint16_t type, unsigned& count) {
  Impl& s = *impl_;
  count = 0;
  if (!s.db) return s.Fail(VX_NOT_FOUND, "GetNumberOfRecords", "store not open");
  if (Impl::SizeCache* cache = s.LoadedCache(type)) {
    count = static_cast<unsigned>(cache->sizes.size());
    return VX_OK;
  }
  CSQLiteStatement st(s.db, "SELECT count(*) FROM blobdb_records WHERE id BETWEEN ?1 AND ?2");
  st.Bind(1, FirstKey(type)).Bind(2, LastKey(type));
  if (st.Ok() && st.Step() == SQLITE_ROW) {
    count = static_cast<unsigned>(st.Int64(0));
    return VX_OK;
  }
  s.lastError = sqlite3_errmsg(s.db);
  return s.SqlFail("GetNumberOfRecords", std::to_string(type));
}

// Records lie in the table's b-tree in key order, and the key of one type rises with the OID;
// after Optimize the leaf pages also follow in that order. So rising OIDs walk the file forward.
unsigned CQRLBlobDB::OptimizeOidsForSequentialAccess(uint16_t, std::vector<uint32_t>& oids) {
  if (!impl_->db) {
    return impl_->Fail(VX_NOT_FOUND, "OptimizeOidsForSequentialAccess", "store not open");
  }
  // Key order is file order; lists from GetOids arrive in it already.
  if (!std::is_sorted(oids.begin(), oids.end())) std::sort(oids.begin(), oids.end());
  return VX_OK;
}

// ---------------------------------------------------------------------------------------------
// Caches

void CQRLBlobDB::EnableCaching(bool enable, unsigned size, unsigned) {
  impl_->caching = enable;
  impl_->cacheKB = size;
  impl_->ApplyCaching();
}

bool CQRLBlobDB::CachingEnabled() const { return impl_->caching; }

void CQRLBlobDB::EnableSelectorCache(uint16_t type, bool enable) {
  if (!enable) {
    impl_->sizeCaches.erase(type);
    return;
  }
  Impl::SizeCache& cache = impl_->sizeCaches[type];
  if (impl_->db && !cache.loaded) impl_->LoadCache(type, cache);
}

void CQRLBlobDB::ReleaseCaches() {
  if (impl_->db) sqlite3_db_release_memory(impl_->db);
  impl_->UnloadCaches();
}

// ---------------------------------------------------------------------------------------------
// Self test

// Checks that every key decodes to a (type, OID) with OID != 0 and every value is a blob.
unsigned long CQRLBlobDB::Impl::SelfTestRecords(std::ostream& report, Callback callback, void* user,
                                                unsigned long total) {
  unsigned long errors = 0, done = kSelfTestSteps;
  CSQLiteStatement st(db, "SELECT id, typeof(data) FROM blobdb_records");
  int rc = st.Ok() ? SQLITE_ROW : SQLITE_ERROR;
  while (st.Ok() && (rc = st.Step()) == SQLITE_ROW) {
    int64_t id = st.Int64(0);
    const char* problem = id < 0 || (id >> 32) > 0xFFFF ? "key is no (type, OID) pair"
                          : (id & 0xFFFFFFFF) == 0      ? "OID 0"
                          : st.Text(1) != "blob"        ? "value is not a blob"
                                                        : nullptr;
    if (problem) {
      report << "  ERROR: record key " << id << " (" << (id >> 32) << "/" << (id & 0xFFFFFFFF)
             << "): " << problem << "\n";
      ++errors;
    }
    if (++done % kProgressEvery == 0) Progress(callback, user, std::min(done, total), total);
  }
  if (rc != SQLITE_DONE) {
    report << "  ERROR: records unreadable: " << sqlite3_errmsg(db) << "\n";
    ++errors;
  }
  Progress(callback, user, total, total);
  return errors;
}

unsigned CQRLBlobDB::SelfTest(std::ostream& report, unsigned long& errors, Callback callback,
                              void* user) {
  Impl& s = *impl_;
  if (!s.db) return s.Fail(VX_NOT_FOUND, "SelfTest", "store not open");
  report << "Blob store self test: " << s.path << "\n";
  unsigned long found = 0, total = kSelfTestSteps;
  CSQLiteStatement count(s.db, "SELECT count(*) FROM blobdb_records");
  if (count.Ok() && count.Step() == SQLITE_ROW) total += static_cast<unsigned long>(count.Int64(0));
  count.Finalize();
  CSQLiteStatement check(s.db, "PRAGMA integrity_check");
  int rc = check.Ok() ? SQLITE_ROW : SQLITE_ERROR;
  while (check.Ok() && (rc = check.Step()) == SQLITE_ROW) {
    if (check.Text(0) == "ok") continue;
    report << "  ERROR: " << check.Text(0) << "\n";
    ++found;
  }
  if (rc != SQLITE_DONE) {
    report << "  ERROR: integrity check failed: " << sqlite3_errmsg(s.db) << "\n";
    ++found;
  }
  check.Finalize();
  Progress(callback, user, 1, total);
  std::string settings = s.CheckSettings();
  if (!settings.empty()) {
    report << "  ERROR: " << settings << "\n";
    ++found;
  }
  Progress(callback, user, kSelfTestSteps, total);
  found += s.SelfTestRecords(report, callback, user, total);
  report << "  " << found << (found == 1 ? " error" : " errors") << " found\n";
  errors += found;
  return found ? VX_SELFTEST_ERRORS : VX_OK;
}

// ---------------------------------------------------------------------------------------------
// Optimize

// Swaps the compacted copy at `tmp` in for the store file. The copy's lock is taken over, so the
// path stays locked throughout. On failure before the rename the original is reopened.
unsigned CQRLBlobDB::Impl::ReplaceWith(const std::string& tmp, CBlobFileLock& tmpLock) {
  std::string store = path;
  if (::fsync(tmpLock.Fd()) != 0) return Fail(VX_NOT_FOUND, "Optimize", std::strerror(errno));
  if (!Disconnect(false)) return SqlFail("Optimize", "statements still open on the handle");
  // The WAL was checkpointed empty; a leftover must not replay into the new file.
  RemoveSidecars(store);
  if (::rename(tmp.c_str(), store.c_str()) != 0) {
    std::string reason = std::strerror(errno);
    Connect(store, false, false, 0);
    return Fail(VX_NOT_FOUND, "Optimize", "rename " + tmp + ": " + reason);
  }
  SyncDirectory(store);
  lock = std::move(tmpLock);
  UnloadCaches();
  return Connect(store, false, false, 0);
}

unsigned CQRLBlobDB::Optimize(const std::string& path, Callback callback, void* user) {
  Impl& s = *impl_;
  unsigned rc = s.CheckWritable("Optimize");
  if (rc != VX_OK) return rc;
  if (path == s.path) return s.Fail(VX_NOT_FOUND, "Optimize", path + " is the store itself");
  Progress(callback, user, 0, 3);
  // Locking the target first keeps a file that another store holds from being overwritten.
  CBlobFileLock tmpLock;
  rc = tmpLock.Acquire(path, true, true);
  if (rc != VX_OK) return s.Fail(rc, "Optimize", path);
  RemoveSidecars(path);
  rc = ::ftruncate(tmpLock.Fd(), 0) == 0
           ? Flush()
           : s.Fail(VX_NOT_FOUND, "Optimize", path + ": " + std::strerror(errno));
  Progress(callback, user, 1, 3);
  CSQLiteStatement vacuum(s.db, "VACUUM INTO ?1");
  if (rc == VX_OK) {
    vacuum.Bind(1, std::string_view(path));
    rc = s.Run(vacuum) == SQLITE_DONE ? VX_OK : s.SqlFail("Optimize", "VACUUM INTO " + path);
  }
  vacuum.Finalize();
  Progress(callback, user, 2, 3);
  if (rc == VX_OK) rc = s.ReplaceWith(path, tmpLock);
  if (tmpLock.Held()) {  // not moved into place: drop the partial copy
    ::unlink(path.c_str());
    RemoveSidecars(path);
  }
  Progress(callback, user, 3, 3);
  return rc;
}
