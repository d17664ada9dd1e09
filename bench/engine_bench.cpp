// Adding a file through the engine: CVXEngine::AddFile with a ready 12 KB thumbnail and shape
// record, then AddImageProperties with a row of 20 values. Beside it the honest limit: the same
// number of raw SQLite inserts of the same bytes into as many WAL files (match store, thumbnail
// store, catalog, properties), one autocommit statement each, as the engine's stores make them.
//
// Counters: items_per_second is files per second; median_us the median latency of one file (both
// calls), addfile_median_us that of the AddFile call alone; engine_vs_raw how many times longer
// the engine takes than the raw inserts.
#include <benchmark/benchmark.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include "PropCodec.h"
#include "VXCatFile.h"
#include "VXEngine.h"
#include "VXFolder.h"
#include "VXMatchInfo.h"
#include "VXMemFile.h"
#include "VXPropDB.h"
#include "VXProperty.h"
#include "VXResult.h"
#include "VXTable.h"
#include "VXThumb.h"
#include "VXURI.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kFiles = 3000;
constexpr int kFilesPerFolder = 500;
constexpr uint32_t kThumbBytes = 12 * 1024;
constexpr size_t kColumns = 20;

double rawSeconds = 0;  // total of the raw run, for the ratio

struct TempDir {
  std::string path;
  TempDir() {
    char tmpl[] = "/tmp/engine_bench_XXXXXX";
    path = mkdtemp(tmpl);
  }
  ~TempDir() { std::filesystem::remove_all(path); }
};

CVXThumb Thumb() {
  std::vector<uint8_t> bytes(kThumbBytes);
  for (size_t i = 0; i < bytes.size(); ++i) bytes[i] = static_cast<uint8_t>(i * 131);
  CVXThumb thumb;
  thumb.Create(160, 120, 1, kThumbBytes, bytes.data());
  return thumb;
}

SVXDBRec_3 Shape() {
  SVXDBRec_3 shape{};
  auto* cells = reinterpret_cast<uint8_t*>(&shape.Info);
  for (size_t i = 0; i < sizeof shape.Info; ++i) cells[i] = static_cast<uint8_t>(i * 7);
  return shape;
}

// Ten texts and ten numbers, as a host's EXIF row might hold them.
std::vector<CVXProperty> Row(uint32_t seed) {
  std::vector<CVXProperty> row;
  for (size_t c = 0; c < kColumns; ++c) {
    if (c % 2) {
      row.emplace_back(seed * 31 + static_cast<uint32_t>(c));
    } else {
      row.emplace_back("value " + std::to_string(seed) + "/" + std::to_string(c));
    }
  }
  return row;
}

// A new database whose image properties table has the 20 columns.
struct SBenchDb {
  TempDir dir;
  CVXEngine engine;
  SBenchDb() {
    SVXCreateInfo info;
    info.Name = dir.path + "/db.vxm";
    if (engine.Create(info) != VX_OK) std::abort();
    CVXTable table(VX_IMAGE_PROPERTIES_TABLE);
    table.Properties().Name = "Image Properties";
    for (size_t c = 0; c < kColumns; ++c) {
      table.AddColumn("p" + std::to_string(c), c % 2 ? vptUInt32 : vptString);
    }
    if (engine.GetPropertyDatabase().SetTable(table) != VX_OK) std::abort();
  }
};

uint32_t AddFolder(CVXEngine& engine, int n) {
  CVXFolder folder(CVXURI("c:/bench/f" + std::to_string(n) + "/", true), 0, 0);
  folder.MediaID() = "VOL";
  if (engine.AddFolder(folder) != VX_OK) std::abort();
  return folder.Oid();
}

double Median(std::vector<double> v) {
  if (v.empty()) return 0;
  std::nth_element(v.begin(), v.begin() + v.size() / 2, v.end());
  return v[v.size() / 2];
}

void Report(benchmark::State& state, const std::vector<double>& times) {
  state.SetItemsProcessed(static_cast<int64_t>(times.size()));
  state.counters["median_us"] = Median(times) * 1e6;
}

// The bytes the engine stores for one file, measured on a real engine.
struct SRecordSizes {
  unsigned header = sizeof(SVXCatalogHeader);
  unsigned file = 0;
  unsigned folderBase = 0;  // the folder record without its file list
  unsigned thumb = 0;
  unsigned row = 0;
};

SRecordSizes Measure() {
  SBenchDb db;
  CVXEngine& engine = db.engine;
  uint32_t folder = AddFolder(engine, 0);
  CVXCatFile file(0, "img00000.jpg", folder);
  CVXThumb thumb = Thumb();
  if (engine.AddFile(file, thumb, Shape()) != VX_OK) std::abort();
  SRecordSizes s;
  CQRLBlobDB& catalog = engine.Catalog().BlobDB();
  catalog.GetSize({CVXCatalog::rtFile, file.Oid()}, s.file);
  catalog.GetSize({CVXCatalog::rtFolder, folder}, s.folderBase);
  s.folderBase -= 4;
  CVXMemFile mem;
  thumb.Write(mem);
  s.thumb = static_cast<unsigned>(mem.GetFileSize());
  mem.Clear();
  vxprop::WriteRow(mem, Row(1));
  s.row = static_cast<unsigned>(mem.GetFileSize());
  return s;
}

void BM_RawInserts(benchmark::State& state) {
  SRecordSizes sizes = Measure();
  TempDir dir;
  struct Db {
    sqlite3* db = nullptr;
    sqlite3_stmt* set = nullptr;
  };
  Db dbs[4];  // match, thumbnails, catalog, properties
  for (int i = 0; i < 4; ++i) {
    std::string path = dir.path + "/raw" + std::to_string(i) + ".db";
    sqlite3_open(path.c_str(), &dbs[i].db);
    sqlite3_exec(dbs[i].db,
                 "PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL; CREATE TABLE r(id INTEGER "
                 "PRIMARY KEY, data BLOB NOT NULL)",
                 nullptr, nullptr, nullptr);
    sqlite3_prepare_v2(dbs[i].db, "INSERT OR REPLACE INTO r VALUES(?1, ?2)", -1, &dbs[i].set,
                       nullptr);
  }
  std::vector<uint8_t> bytes(kThumbBytes * 2, 0x5A);
  auto insert = [&](int store, int64_t id, size_t size) {
    sqlite3_bind_int64(dbs[store].set, 1, id);
    sqlite3_bind_blob(dbs[store].set, 2, bytes.data(), static_cast<int>(size), SQLITE_STATIC);
    if (sqlite3_step(dbs[store].set) != SQLITE_DONE) std::abort();
    sqlite3_reset(dbs[store].set);
  };
  std::vector<double> times;
  int64_t oid = 0;
  for (auto _ : state) {
    size_t folderFiles = static_cast<size_t>(oid % kFilesPerFolder) + 1;
    auto start = Clock::now();
    ++oid;
    insert(2, 1, sizes.header);  // the catalog's counter, both copies
    insert(2, 21, sizes.header);
    insert(0, (int64_t{2} << 32) | oid, sizeof(SVXDBRec_3));
    insert(1, (int64_t{3} << 32) | oid, sizes.thumb);
    insert(2, (int64_t{3} << 32) | oid, sizes.file);
    insert(2, int64_t{2} << 32, sizes.folderBase + 4 * folderFiles);
    insert(3, oid, sizes.row);
    double seconds = std::chrono::duration<double>(Clock::now() - start).count();
    state.SetIterationTime(seconds);
    times.push_back(seconds);
  }
  for (Db& d : dbs) {
    sqlite3_finalize(d.set);
    sqlite3_close(d.db);
  }
  rawSeconds = 0;
  for (double t : times) rawSeconds += t;
  Report(state, times);
}

void BM_EngineAddFile(benchmark::State& state) {
  SBenchDb db;
  CVXEngine& engine = db.engine;
  CVXThumb thumb = Thumb();
  const SVXDBRec_3 shape = Shape();
  std::vector<double> times;
  std::vector<double> addFileTimes;  // the AddFile call alone
  uint32_t folder = 0;
  int n = 0;
  for (auto _ : state) {
    if (n % kFilesPerFolder == 0) folder = AddFolder(engine, n);
    std::vector<CVXProperty> row = Row(static_cast<uint32_t>(n));
    CVXCatFile file(0, "img" + std::to_string(n++) + ".jpg", folder);
    auto start = Clock::now();
    bool added = engine.AddFile(file, thumb, shape) == VX_OK;
    auto between = Clock::now();
    if (!added || engine.AddImageProperties(file.Oid(), row) != VX_OK) {
      state.SkipWithError("add failed");
      break;
    }
    double seconds = std::chrono::duration<double>(Clock::now() - start).count();
    state.SetIterationTime(seconds);
    times.push_back(seconds);
    addFileTimes.push_back(std::chrono::duration<double>(between - start).count());
  }
  Report(state, times);
  state.counters["addfile_median_us"] = Median(addFileTimes) * 1e6;
  double total = 0;
  for (double t : times) total += t;
  if (rawSeconds > 0) state.counters["engine_vs_raw"] = total / rawSeconds;
}

// The raw run first, so that the engine's run can state the ratio.
BENCHMARK(BM_RawInserts)->UseManualTime()->Iterations(kFiles)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_EngineAddFile)->UseManualTime()->Iterations(kFiles)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
