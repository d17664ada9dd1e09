// The blob store beside raw SQLite on an equal table (rowid key, blob value, WAL journal with
// synchronous=NORMAL, prepared statements, batch reads in one transaction), so that the cost of
// the store's own layer shows as the ratio of the two in one run.
#include <benchmark/benchmark.h>
#include <sqlite3.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "QRLBlobDB.h"
#include "VXResult.h"

namespace {

using Sel = CQRLBlobDB::SSelector;

constexpr uint32_t kRecords = 20000;
constexpr uint32_t kRecordSize = 1601;  // a shape record
constexpr uint32_t kBatch = 5000;
constexpr uint16_t kType = 2;

// A scattered but fixed visiting order over OIDs 1..kRecords.
uint32_t OidAt(uint64_t i) { return static_cast<uint32_t>((i * 7919) % kRecords) + 1; }
int64_t RowId(uint32_t oid) { return (int64_t{kType} << 32) | oid; }

const std::vector<uint8_t>& Payload() {
  static const std::vector<uint8_t> bytes = [] {
    std::vector<uint8_t> b(kRecordSize);
    for (size_t i = 0; i < b.size(); ++i) b[i] = static_cast<uint8_t>(i * 13);
    return b;
  }();
  return bytes;
}

struct TempDir {
  std::string path;
  TempDir() {
    char tmpl[] = "/tmp/blobdb_bench_XXXXXX";
    path = mkdtemp(tmpl);
  }
  ~TempDir() { std::filesystem::remove_all(path); }
};

TempDir& Dir() {
  static TempDir dir;
  return dir;
}

// --- the blob store ---

std::string StorePath() { return Dir().path + "/store.vxc"; }

void FillStore() {
  static bool filled = false;
  if (filled) return;
  CQRLBlobDB db;
  if (db.Create(StorePath(), 0) != VX_OK) std::abort();
  sqlite3_exec(db.Handle(), "BEGIN", nullptr, nullptr, nullptr);
  for (uint32_t oid = 1; oid <= kRecords; ++oid)
    db.Set({kType, oid}, Payload().data(), kRecordSize);
  sqlite3_exec(db.Handle(), "COMMIT", nullptr, nullptr, nullptr);
  filled = true;
}

void OpenStore(CQRLBlobDB& db, benchmark::State& state) {
  FillStore();
  if (db.Open(StorePath(), false) != VX_OK) state.SkipWithError("open failed");
}

void BM_StoreSet(benchmark::State& state) {
  CQRLBlobDB db;
  OpenStore(db, state);
  uint64_t i = 0;
  for (auto _ : state)
    if (db.Set({kType, OidAt(i++)}, Payload().data(), kRecordSize) != VX_OK)
      state.SkipWithError("set failed");
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

void BM_StoreSetBatch(benchmark::State& state) {
  CQRLBlobDB db;
  OpenStore(db, state);
  uint64_t i = 0;
  for (auto _ : state) {
    sqlite3_exec(db.Handle(), "BEGIN", nullptr, nullptr, nullptr);
    for (uint32_t k = 0; k < kBatch; ++k)
      db.Set({kType, OidAt(i++)}, Payload().data(), kRecordSize);
    sqlite3_exec(db.Handle(), "COMMIT", nullptr, nullptr, nullptr);
  }
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

void BM_StoreGet(benchmark::State& state) {
  CQRLBlobDB db;
  OpenStore(db, state);
  std::vector<uint8_t> buffer(kRecordSize);
  uint64_t i = 0;
  for (auto _ : state)
    if (db.Get({kType, OidAt(i++)}, buffer.data(), kRecordSize) != VX_OK)
      state.SkipWithError("get failed");
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

void BM_StoreGetBatch(benchmark::State& state) {
  CQRLBlobDB db;
  OpenStore(db, state);
  std::vector<uint8_t> buffer(uint64_t{kBatch} * kRecordSize);
  std::vector<Sel> sels(kBatch);
  uint64_t i = 0;
  for (auto _ : state) {
    for (Sel& sel : sels) sel = {kType, OidAt(i++)};
    if (db.Get(sels, buffer.data(), buffer.size()) != VX_OK) state.SkipWithError("get failed");
  }
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

// --- raw SQLite ---

struct Raw {
  sqlite3* db = nullptr;
  sqlite3_stmt* get = nullptr;
  sqlite3_stmt* set = nullptr;
  Raw() {
    std::string path = Dir().path + "/raw.db";
    bool fresh = !std::filesystem::exists(path);
    sqlite3_open(path.c_str(), &db);
    Exec("PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL");
    Exec("CREATE TABLE IF NOT EXISTS records(id INTEGER PRIMARY KEY, data BLOB NOT NULL)");
    sqlite3_prepare_v2(db, "INSERT OR REPLACE INTO records VALUES(?1, ?2)", -1, &set, nullptr);
    sqlite3_prepare_v2(db, "SELECT data FROM records WHERE id=?1", -1, &get, nullptr);
    if (!fresh) return;
    Exec("BEGIN");
    for (uint32_t oid = 1; oid <= kRecords; ++oid) Set(oid);
    Exec("COMMIT");
  }
  ~Raw() {
    sqlite3_finalize(get);
    sqlite3_finalize(set);
    sqlite3_close(db);
  }
  void Exec(const char* sql) { sqlite3_exec(db, sql, nullptr, nullptr, nullptr); }
  bool Set(uint32_t oid) {
    sqlite3_bind_int64(set, 1, RowId(oid));
    sqlite3_bind_blob(set, 2, Payload().data(), kRecordSize, SQLITE_STATIC);
    bool ok = sqlite3_step(set) == SQLITE_DONE;
    sqlite3_reset(set);
    return ok;
  }
  bool Get(uint32_t oid, uint8_t* out) {
    sqlite3_bind_int64(get, 1, RowId(oid));
    bool ok = sqlite3_step(get) == SQLITE_ROW;
    if (ok) std::memcpy(out, sqlite3_column_blob(get, 0), sqlite3_column_bytes(get, 0));
    sqlite3_reset(get);
    return ok;
  }
};

void BM_RawSet(benchmark::State& state) {
  Raw raw;
  uint64_t i = 0;
  for (auto _ : state)
    if (!raw.Set(OidAt(i++))) state.SkipWithError("set failed");
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

void BM_RawSetBatch(benchmark::State& state) {
  Raw raw;
  uint64_t i = 0;
  for (auto _ : state) {
    raw.Exec("BEGIN");
    for (uint32_t k = 0; k < kBatch; ++k) raw.Set(OidAt(i++));
    raw.Exec("COMMIT");
  }
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

void BM_RawGet(benchmark::State& state) {
  Raw raw;
  std::vector<uint8_t> buffer(kRecordSize);
  uint64_t i = 0;
  for (auto _ : state)
    if (!raw.Get(OidAt(i++), buffer.data())) state.SkipWithError("get failed");
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

void BM_RawGetBatch(benchmark::State& state) {
  Raw raw;
  std::vector<uint8_t> buffer(uint64_t{kBatch} * kRecordSize);
  uint64_t i = 0;
  for (auto _ : state) {
    raw.Exec("BEGIN");
    for (uint32_t k = 0; k < kBatch; ++k)
      if (!raw.Get(OidAt(i++), buffer.data() + uint64_t{k} * kRecordSize))
        state.SkipWithError("get failed");
    raw.Exec("COMMIT");
  }
  state.SetItemsProcessed(static_cast<int64_t>(i));
}

}  // namespace

BENCHMARK(BM_StoreSet);
BENCHMARK(BM_RawSet);
BENCHMARK(BM_StoreSetBatch);
BENCHMARK(BM_RawSetBatch);
BENCHMARK(BM_StoreGet);
BENCHMARK(BM_RawGet);
BENCHMARK(BM_StoreGetBatch);
BENCHMARK(BM_RawGetBatch);

BENCHMARK_MAIN();
