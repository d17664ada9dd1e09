// The catalog at scale: opening a catalog of 1,000,000 files in 10,000 folders with 1,000
// categories beside a raw SQLite read of the same records; calculating a formula over all of
// them; adding files one by one; and the folder linking that every addition runs.
#include <benchmark/benchmark.h>
#include <sqlite3.h>
#include <stdlib.h>
#include <sys/resource.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "QRLBlobDB.h"
#include "VXCatFile.h"
#include "VXEngine.h"
#include "VXFolder.h"
#include "VXGroup.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "VXURI.h"
#include "bench_db.h"
#include "vxcatalog.h"

namespace {

constexpr uint32_t kFiles = 1000000;
constexpr uint32_t kFolders = 10000;
constexpr uint32_t kGroups = 1000;

using vxbench::Scratch;

// Writes the large catalog straight into its store: files round-robin over the folders;
// categories 1 to 3 hold every 7th file from their own offset, the others ten files each.
const std::string& LargeCatalog() {
  static const std::string path = [] {
    std::string p = Scratch("large.vxc");
    {
      CVXEngine engine;
      engine.Catalog().Create(p);
      engine.Catalog().Close();
    }
    vxbench::WriteCatalog(p, kFiles, kFolders);
    vxbench::InTransaction(p, [](CQRLBlobDB& db) {
      for (uint32_t g = 1; g <= kGroups; ++g) {
        CVXGroup group(g);
        group.Name() = "Category " + std::to_string(g);
        if (g <= 3) {
          for (uint32_t oid = g; oid <= kFiles; oid += 7) group.Images().SetBulk(oid);
        } else {
          for (uint32_t oid = g * 10; oid < g * 10 + 10; ++oid) group.Images().Set(oid);
        }
        vxbench::Put(db, CVXCatalog::rtGroup, g, group);
      }
    });
    return p;
  }();
  return path;
}

long PeakRssMiB() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss / 1024;
}

void BM_OpenLargeCatalog(benchmark::State& state) {
  const std::string& path = LargeCatalog();
  for (auto _ : state) {
    auto engine = std::make_unique<CVXEngine>();
    engine->Catalog().Open(path, true);
    benchmark::DoNotOptimize(engine->Catalog().NumberOfFiles());
    state.PauseTiming();  // freeing the maps is not part of opening
    engine.reset();
    state.ResumeTiming();
  }
  state.counters["files"] = kFiles;
  state.counters["peak_rss_MiB"] = static_cast<double>(PeakRssMiB());
}

// The same records read with raw SQLite in one pass: the floor for any loader.
void BM_RawReadLargeCatalog(benchmark::State& state) {
  const std::string& path = LargeCatalog();
  for (auto _ : state) {
    sqlite3* db = nullptr;
    sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READONLY, nullptr);
    sqlite3_stmt* stmt = nullptr;
    sqlite3_prepare_v2(db, "SELECT data FROM blobdb_records", -1, &stmt, nullptr);
    size_t bytes = 0;
    while (sqlite3_step(stmt) == SQLITE_ROW) bytes += sqlite3_column_bytes(stmt, 0);
    sqlite3_finalize(stmt);
    sqlite3_close(db);
    benchmark::DoNotOptimize(bytes);
  }
}

// "Category 1" OR "Category 2" AND NOT "Category 3", with a recursive folder, over 1M files.
void BM_CalculateFormula(benchmark::State& state) {
  CVXEngine engine;
  engine.Catalog().Open(LargeCatalog(), true);
  CVXGroup g(999999);
  g.Name() = "Formula";
  SError e = g.SetExpression(engine.Catalog(),
                             "(\"Category 1\" OR \"Category 2\" OR \"RFolder@/photos/f1/\") NOT "
                             "\"Category 3\"");
  if (e.code != VX_OK) state.SkipWithError("formula refused");
  CBitVector out;
  for (auto _ : state) {
    unsigned rc = g.Calculate(engine.Catalog(), out);
    benchmark::DoNotOptimize(rc);
  }
  state.counters["files_in_result"] = out.Count();
}

// Files go to 1,000 folders in turn, about a hundred each as in the large catalog: every
// addition rewrites its folder's record, whose file list grows with the folder.
void BM_AddFile(benchmark::State& state) {
  std::string path = Scratch("add.vxc");
  std::filesystem::remove(path);
  CVXEngine engine;
  CVXCatalog& cat = engine.Catalog();
  cat.Create(path);
  std::vector<uint32_t> folders;
  for (int i = 0; i < 1000; ++i) {
    CVXFolder folder(CVXURI("/photos/f" + std::to_string(i) + "/", true), cat.GenerateFolderOID(),
                     0);
    cat.AddFolder(folder);
    folders.push_back(folder.Oid());
  }
  size_t next = 0;
  for (auto _ : state) {
    uint32_t oid = cat.GenerateFileOID();
    uint32_t folder = folders[next++ % folders.size()];
    cat.AddFile(folder, CVXCatFile(oid, "IMG_" + std::to_string(oid) + ".JPG", folder));
  }
  state.SetItemsProcessed(state.iterations());
}

// Adding root folders: each addition links every parentless folder again.
void BM_AddRootFolders(benchmark::State& state) {
  for (auto _ : state) {
    std::string path = Scratch("folders.vxc");
    std::filesystem::remove(path);
    CVXEngine engine;
    CVXCatalog& cat = engine.Catalog();
    cat.Create(path);
    for (int64_t i = 0; i < state.range(0); ++i) {
      cat.AddFolder(
          CVXFolder(CVXURI("/r" + std::to_string(i) + "/", true), cat.GenerateFolderOID(), 0));
    }
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}

}  // namespace

BENCHMARK(BM_OpenLargeCatalog)->Unit(benchmark::kMillisecond)->Iterations(3)->UseRealTime();
BENCHMARK(BM_RawReadLargeCatalog)->Unit(benchmark::kMillisecond)->Iterations(3)->UseRealTime();
BENCHMARK(BM_CalculateFormula)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_AddFile)->Iterations(100000)->UseRealTime();
BENCHMARK(BM_AddRootFolders)->Arg(1000)->Arg(10000)->Unit(benchmark::kSecond)->Iterations(1);

BENCHMARK_MAIN();
