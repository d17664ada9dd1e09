// Comparisons per second of one original against candidate shape records lying back to back,
// 1601 bytes apart as the prefetch bank holds them, beside a plain read of the same bytes. With
// 20,000 candidates (32 MB, as large as the last cache level) the read bounds what a comparison
// that touches every cell can reach; 64 candidates (100 KB) stay in the core's own cache and
// show the arithmetic alone.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#if defined(__x86_64__)
#include <immintrin.h>
#endif

#include "MatchCSFuzzy.h"
#include "MatchCSQuick.h"
#include "MatchKernels.h"

namespace {

constexpr int kRecords = 20'000;
constexpr int kCached = 64;

// Smooth images, each candidate one of 64 scenes with noise, so that some cells of a pair fit
// and some do not, as with real photographs.
std::vector<uint8_t> MakeBank() {
  std::mt19937 rng(11);
  std::vector<std::vector<uint8_t>> scenes(64, std::vector<uint8_t>(1600));
  for (auto& scene : scenes) {
    double base[4], slope[4][2];
    for (int f = 0; f < 4; ++f) {
      base[f] = rng() % 256;
      slope[f][0] = int(rng() % 21) - 10;
      slope[f][1] = int(rng() % 21) - 10;
    }
    for (int j = 0; j < 400; ++j) {
      for (int f = 0; f < 4; ++f) {
        const double v = base[f] + slope[f][0] * (j % 20) + slope[f][1] * (j / 20);
        scene[4 * j + f] = uint8_t(std::clamp(int(std::lround(v)), 0, 255));
      }
    }
  }
  std::vector<uint8_t> bank(size_t{kRecords} * sizeof(SVXDBRec_3));
  for (int r = 0; r < kRecords; ++r) {
    const auto& scene = scenes[rng() % scenes.size()];
    uint8_t* cells = bank.data() + size_t(r) * sizeof(SVXDBRec_3) + 1;
    for (int b = 0; b < 1600; ++b) {
      cells[b] = uint8_t(std::clamp(scene[b] + int(rng() % 41) - 20, 0, 255));
    }
  }
  return bank;
}

const std::vector<uint8_t>& Bank() {
  static const std::vector<uint8_t> bank = MakeBank();
  return bank;
}

const SVXDBRec_3& Record(int r) {
  return *reinterpret_cast<const SVXDBRec_3*>(Bank().data() + size_t(r) * sizeof(SVXDBRec_3));
}

// Candidates are records 0 to state.range(0) - 1.
void Count(benchmark::State& state) {
  state.SetItemsProcessed(state.iterations() * state.range(0));
  state.SetBytesProcessed(state.iterations() * state.range(0) * int64_t{sizeof(SVXDBRec_3)});
}

// The sum of all bytes of the records, 32 at a time: as fast as the data can be read.
#if defined(__x86_64__)
__attribute__((target("avx2"))) uint64_t SumBytes(const uint8_t* data, size_t size) {
  __m256i sum = _mm256_setzero_si256();
  size_t at = 0;
  for (; at + 32 <= size; at += 32) {
    const __m256i bytes = _mm256_loadu_si256(reinterpret_cast<const __m256i*>(data + at));
    sum = _mm256_add_epi64(sum, _mm256_sad_epu8(bytes, _mm256_setzero_si256()));
  }
  uint64_t lanes[4];
  _mm256_storeu_si256(reinterpret_cast<__m256i*>(lanes), sum);
  uint64_t total = lanes[0] + lanes[1] + lanes[2] + lanes[3];
  for (; at < size; ++at) total += data[at];
  return total;
}
#else
uint64_t SumBytes(const uint8_t* data, size_t size) {
  uint64_t total = 0;
  for (size_t at = 0; at < size; ++at) total += data[at];
  return total;
}
#endif

void BM_PlainRead(benchmark::State& state) {
  const uint8_t* bank = Bank().data();
  const size_t size = size_t(state.range(0)) * sizeof(SVXDBRec_3);
  for (auto _ : state) benchmark::DoNotOptimize(SumBytes(bank, size));
  Count(state);
}
BENCHMARK(BM_PlainRead)->Arg(kRecords)->Arg(kCached);

SVXMatchParams Params(bool fast, bool rotate, uint32_t weighting) {
  static SVXWeightMatrix weights[3];
  weights[weighting].Reset(weighting);
  SVXMatchParams p;
  p.SetWeights(30, 25);
  p.Fast = fast;
  p.Rotate = rotate;
  p.Weighting = weighting;
  p.Weights = &weights[weighting];
  p.MinScore = 101;  // the early stop never applies: every candidate costs the whole walk
  return p;
}

// Sums the scores of the candidates, which `score` gives by record number.
template <typename F>
void Loop(benchmark::State& state, F&& score) {
  for (auto _ : state) {
    double sum = 0;
    for (int r = 0; r < state.range(0); ++r) sum += score(r);
    benchmark::DoNotOptimize(sum);
  }
  Count(state);
}

using MatchFn = double (*)(const SVXDBRec_3&, const SVXDBRec_3&, const SVXMatchParams&);

void BM_Record(benchmark::State& state, MatchFn match, SVXMatchParams p) {
  Loop(state, [&](int r) { return match(Record(0), Record(r), p); });
}

// The portable kernels, which machines without AVX2 run.
void BM_Portable(benchmark::State& state, const vxmatch::SKernelSet* set, SVXMatchParams p) {
  const vxmatch::KernelFn kernel = set->Pick(p);
  const uint8_t* original = vxmatch::CellBytes(Record(0));
  Loop(state, [&](int r) { return kernel(original, vxmatch::CellBytes(Record(r)), p); });
}

const bool kRegistered = [] {
  struct {
    const char* name;
    MatchFn match;
    bool fast, rotate;
    uint32_t weighting;
  } const kernels[] = {
      {"Duplicates", MatchDuplicates, false, false, 0},
      {"DuplicatesRotate", MatchDuplicates, false, true, 0},
      {"CSQuick", MatchCSQuick, false, false, 0},
      {"CSQuickRotate", MatchCSQuick, false, true, 0},
      {"CSQuickWeighted", MatchCSQuick, false, false, 1},
      {"CSQuickWeightedRotate", MatchCSQuick, false, true, 1},
      {"CSQuickFast", MatchCSQuick, true, false, 0},
      {"CSQuickFastWeighted", MatchCSQuick, true, false, 1},
      {"CSFuzzy", MatchCSFuzzy, false, false, 0},
      {"CSFuzzyRotate", MatchCSFuzzy, false, true, 0},
      {"CSFuzzyWeighted", MatchCSFuzzy, false, false, 1},
  };
  for (const auto& k : kernels) {
    const SVXMatchParams p = Params(k.fast, k.rotate, k.weighting);
    benchmark::RegisterBenchmark((std::string("BM_Record/") + k.name).c_str(), BM_Record, k.match,
                                 p)
        ->Arg(kRecords)
        ->Arg(kCached);
  }
  const struct {
    const char* name;
    const vxmatch::SKernelSet* set;
    bool rotate;
    uint32_t weighting;
  } portable[] = {
      {"CSQuick", &vxmatch::PortableQuickKernels(), false, 0},
      {"CSQuickRotate", &vxmatch::PortableQuickKernels(), true, 0},
      {"CSQuickWeighted", &vxmatch::PortableQuickKernels(), false, 1},
      {"CSFuzzy", &vxmatch::PortableFuzzyKernels(), false, 0},
  };
  for (const auto& k : portable) {
    const SVXMatchParams p = Params(false, k.rotate, k.weighting);
    benchmark::RegisterBenchmark((std::string("BM_Portable/") + k.name).c_str(), BM_Portable, k.set,
                                 p)
        ->Arg(kRecords)
        ->Arg(kCached);
  }
  return true;
}();

// Histograms of the candidates built beforehand, as the run builds each once per candidate;
// the bytes counted are the histograms'.
void BM_Histogram(benchmark::State& state) {
  std::vector<CHist> hists(state.range(0));
  for (int r = 0; r < state.range(0); ++r) hists[r].Build(Record(r).Info, 0);
  double weight = 0;
  for (float bin : hists[0].Bins) weight += bin;
  weight = std::trunc(weight);
  Loop(state, [&](int r) { return MatchHistogram(hists[0], weight, hists[r]); });
  state.SetBytesProcessed(state.iterations() * state.range(0) * int64_t{sizeof(CHist)});
}
BENCHMARK(BM_Histogram)->Arg(kRecords)->Arg(kCached);

// MatchCSQuick without Rotate and weights on prepared records, as a run over many originals
// compares them: each record's sums are made once, outside the loop.
void BM_Prepared(benchmark::State& state) {
  const SVXMatchParams p = Params(false, false, 0);
  std::vector<SVXQuickCells> prepared;
  for (int r = 0; r < state.range(0); ++r) prepared.push_back(PrepareQuick(Record(r), false));
  Loop(state, [&](int r) { return MatchCSQuickPrepared(prepared[0], prepared[r], p); });
}
BENCHMARK(BM_Prepared)->Arg(kRecords)->Arg(kCached);

// The same comparisons through MatchCSQuickPreparedMany, one original against all candidates.
void BM_PreparedMany(benchmark::State& state) {
  const SVXMatchParams p = Params(false, false, 0);
  std::vector<SVXQuickCells> prepared;
  for (int r = 0; r < state.range(0); ++r) prepared.push_back(PrepareQuick(Record(r), false));
  std::vector<const SVXQuickCells*> candidates;
  for (const SVXQuickCells& c : prepared) candidates.push_back(&c);
  std::vector<double> scores(prepared.size());
  for (auto _ : state) {
    MatchCSQuickPreparedMany(prepared[0], candidates.data(), candidates.size(), p, scores.data());
    benchmark::DoNotOptimize(scores.data());
  }
  Count(state);
}
BENCHMARK(BM_PreparedMany)->Arg(kRecords)->Arg(kCached);

}  // namespace

BENCHMARK_MAIN();
