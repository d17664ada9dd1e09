// The shape record of a 6000 x 4000 image against the least work any two-pass reading of the
// same pixels must do: one pass summing the pixels' bytes into their cells, one over a byte per
// pixel. CalcShapeInfo should stay within twice the time of that pair.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <random>
#include <vector>

#include "Shape.h"

namespace {

constexpr uint32_t kWidth = 6000;
constexpr uint32_t kHeight = 4000;

// Seconds of one plain pass pair, for the ratio of the run that follows it.
double plainSeconds = 0;

const CVXBitmap& Photo() {
  static const CVXBitmap bitmap = [] {
    CVXBitmap b(kWidth, kHeight);
    std::mt19937 rng(7);
    SVXColor* p = b.GetColorMatrix();
    for (uint64_t i = 0; i < uint64_t{kWidth} * kHeight; ++i) p[i].Value = rng();
    return b;
  }();
  return bitmap;
}

void BM_PlainTwoPasses(benchmark::State& state) {
  const CVXBitmap& bitmap = Photo();
  const SVXColor* pixels = bitmap.GetColorMatrix();
  const uint32_t cw = (kWidth + 19) / 20;
  const uint32_t ch = (kHeight + 19) / 20;
  std::vector<uint8_t> bytes(uint64_t{kWidth} * kHeight, 1);
  auto start = std::chrono::steady_clock::now();
  for (auto _ : state) {
    uint64_t sums[400] = {};
    for (uint32_t y = 0; y < kHeight; ++y) {
      const SVXColor* row = pixels + uint64_t{y} * kWidth;
      for (uint32_t x0 = 0, cell = y / ch; x0 < kWidth; x0 += cw, cell += 20) {
        uint64_t sum = 0;
        for (uint32_t x = x0; x < std::min(kWidth, x0 + cw); ++x) {
          sum += row[x].R + row[x].G + row[x].B;
        }
        sums[cell] += sum;
      }
    }
    for (uint32_t y = 0; y < kHeight; ++y) {
      const uint8_t* row = bytes.data() + uint64_t{y} * kWidth;
      for (uint32_t x0 = 0, cell = y / ch; x0 < kWidth; x0 += cw, cell += 20) {
        uint32_t sum = 0;
        for (uint32_t x = x0; x < std::min(kWidth, x0 + cw); ++x) sum += row[x];
        sums[cell] += sum;
      }
    }
    benchmark::DoNotOptimize(sums);
  }
  const double seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  if (state.iterations() > 0) plainSeconds = seconds / static_cast<double>(state.iterations());
}
// The plain passes first, so that the calculation's run can state the ratio (vs_plain).
BENCHMARK(BM_PlainTwoPasses)->Unit(benchmark::kMillisecond);

void BM_CalcShapeInfo(benchmark::State& state) {
  const CVXBitmap& bitmap = Photo();
  CShape shape;
  SVXMatchInfo info;
  shape.CalcShapeInfo(bitmap, info, 127);  // the scratch buffer is allocated once per run
  auto start = std::chrono::steady_clock::now();
  for (auto _ : state) {
    shape.CalcShapeInfo(bitmap, info, 127);
    benchmark::DoNotOptimize(info);
  }
  const double seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  if (plainSeconds > 0 && state.iterations() > 0) {
    state.counters["vs_plain"] = seconds / static_cast<double>(state.iterations()) / plainSeconds;
  }
}
BENCHMARK(BM_CalcShapeInfo)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
