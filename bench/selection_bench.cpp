// Selection runs at scale: one original against 200,000 candidates beside a raw batched read of
// the same shape records from the same store, and finding duplicates among 20,000 files with
// every file an original.
#include <benchmark/benchmark.h>

#include <filesystem>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "VXEngine.h"
#include "VXFileSystem.h"
#include "VXMatchInfo.h"
#include "VXResult.h"
#include "VXSelEngine.h"
#include "VXSelImageFeatures.h"
#include "VXSelector.h"
#include "bench_db.h"

namespace {

using Sel = CQRLBlobDB::SSelector;

// Shape records that look like images: smooth grids with noise, so that scores spread.
SVXDBRec_3 Shape(std::mt19937& rng) {
  SVXDBRec_3 r{};
  const int base = static_cast<int>(rng() % 200);
  for (int i = 0; i < 400; ++i) {
    auto& cell = r.Info.Cells[i];
    cell.C1 = static_cast<uint8_t>(base + (i % 20) + rng() % 40);
    cell.C2 = static_cast<uint8_t>(100 + rng() % 60);
    cell.C3 = static_cast<uint8_t>(100 + rng() % 60);
    cell.Shape = static_cast<uint8_t>(rng() % 101);
  }
  return r;
}

// A database of `files` files with shape records, made once per size.
std::string Database(uint32_t files) {
  std::string path = vxbench::Scratch("sel" + std::to_string(files) + ".vxm");
  if (std::filesystem::exists(path)) return path;
  {
    CVXEngine engine;
    SVXCreateInfo info;
    info.Name = path;
    engine.Create(info);
    engine.Close();
  }
  vxbench::WriteCatalog(CVXFileSystem::ChangeExt(path, ".vxc"), files, files / 100);
  std::mt19937 rng(42);
  vxbench::InTransaction(path, [&](CQRLBlobDB& db) {
    for (uint32_t oid = 1; oid <= files; ++oid) {
      SVXDBRec_3 shape = Shape(rng);
      db.Set(Sel(2, oid), &shape, sizeof shape);
    }
  });
  return path;
}

CVXSelector QuickMatch(uint32_t maxResults) {
  CVXSelector selector;
  SSelMatch match;
  match.Reset();
  match.Active = true;
  match.NeedsOriginals = true;
  SSelLimits limits;
  limits.Reset();
  limits.Active = true;
  limits.Mode = 0;  // rank only: every candidate is scored
  limits.MaxResults = maxResults;
  auto put = [&](const char* key, SSelCoreData& record) {
    CVXMemFile blob;
    record.Store(&blob, true);
    selector.SetFeature(key, blob);
  };
  put(SSelMatch::kKey, match);
  put(SSelLimits::kKey, limits);
  selector.Properties().NeedsOriginals = true;
  return selector;
}

std::unique_ptr<CVXEngine> OpenEngine(const std::string& path) {
  auto engine = std::make_unique<CVXEngine>();
  SVXCreateInfo info;
  info.Name = path;
  info.ReadOnly = true;
  engine->Open(info);
  return engine;
}

constexpr uint32_t kCandidates = 200000;

void BM_SelectionRun(benchmark::State& state) {
  auto engine = OpenEngine(Database(kCandidates));
  CVXSelEngine run(engine.get());
  run.InitSelection(QuickMatch(100), {{1, 0, CVXURI()}});
  for (auto _ : state) {
    CVXResultSet result;
    if (run.Run(result) != VX_OK) state.SkipWithError("run failed");
  }
  state.SetItemsProcessed(state.iterations() * kCandidates);
  state.counters["cores"] = std::thread::hardware_concurrency();
}

// The floor of the run: the same records read in batches of 2000 in store order.
void BM_RawBatchedRead(benchmark::State& state) {
  auto engine = OpenEngine(Database(kCandidates));
  std::vector<uint8_t> buffer(2000 * sizeof(SVXDBRec_3));
  std::vector<Sel> batch;
  for (auto _ : state) {
    for (uint32_t first = 1; first <= kCandidates; first += 2000) {
      batch.clear();
      for (uint32_t oid = first; oid < first + 2000 && oid <= kCandidates; ++oid) {
        batch.emplace_back(2, oid);
      }
      engine->GetShapeData(batch, buffer.data());
      benchmark::DoNotOptimize(buffer.data());
    }
  }
  state.SetItemsProcessed(state.iterations() * kCandidates);
}

// A selection engine whose scoring threads the benchmark sets.
class CThreadedSelEngine : public CVXSelEngine {
 public:
  using CVXSelEngine::CVXSelEngine;
  using CVXSelEngine::SetScoringThreads;
};

// Every file an original against every file, ten best hits each, scored on range(1) threads.
void BM_FindDuplicates(benchmark::State& state) {
  const uint32_t files = static_cast<uint32_t>(state.range(0));
  auto engine = OpenEngine(Database(files));
  std::vector<SVXFileDescriptor> originals;
  for (uint32_t oid = 1; oid <= files; ++oid) originals.push_back({oid, 0, CVXURI()});
  CThreadedSelEngine run(engine.get());
  run.SetScoringThreads(static_cast<unsigned>(state.range(1)));
  run.InitSelection(QuickMatch(10), originals);
  for (auto _ : state) {
    CVXResultSet result;
    if (run.Run(result) != VX_OK) state.SkipWithError("run failed");
  }
  state.counters["comparisons"] = static_cast<double>(files) * files;
  state.counters["cores"] = std::thread::hardware_concurrency();
}

}  // namespace

BENCHMARK(BM_SelectionRun)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_RawBatchedRead)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK(BM_FindDuplicates)
    ->Args({4000, 1})
    ->Args({4000, 2})
    ->Args({20000, 1})
    ->Args({20000, 2})
    ->Unit(benchmark::kSecond)
    ->Iterations(1)
    ->UseRealTime();

BENCHMARK_MAIN();
