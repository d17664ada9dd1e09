// Set operations on sets of 1,000,000 OIDs, half of them set at random, against the cost of
// merely copying and scanning the same number of bytes: the word-at-a-time loops should come
// within a small factor of that limit.
#include <benchmark/benchmark.h>

#include <cstring>
#include <random>
#include <vector>

#include "bitvector.h"

namespace {

constexpr uint32_t kOids = 1'000'000;
constexpr size_t kBytes = kOids / 8;

CBitVector HalfFull(unsigned seed) {
  std::mt19937 rng(seed);
  CBitVector v;
  v.Resize(kOids);
  for (uint32_t i = 0; i < kOids; ++i) {
    if (rng() & 1) v.Set(i);
  }
  return v;
}

const CBitVector& A() {
  static const CBitVector a = HalfFull(1);
  return a;
}
const CBitVector& B() {
  static const CBitVector b = HalfFull(2);
  return b;
}

void BM_Memcpy(benchmark::State& state) {
  std::vector<uint8_t> src(kBytes, 0x5A), dst(kBytes);
  for (auto _ : state) {
    std::memcpy(dst.data(), src.data(), kBytes);
    benchmark::DoNotOptimize(dst.data());
    benchmark::ClobberMemory();
  }
  state.SetBytesProcessed(state.iterations() * kBytes);
}
BENCHMARK(BM_Memcpy);

void BM_Scan(benchmark::State& state) {
  std::vector<uint64_t> words(kBytes / 8, 0x5A5A);
  for (auto _ : state) {
    uint64_t acc = 0;
    for (uint64_t w : words) acc |= w;
    benchmark::DoNotOptimize(acc);
  }
  state.SetBytesProcessed(state.iterations() * kBytes);
}
BENCHMARK(BM_Scan);

// a &= b or a |= b: the same work every round, since the bounds stay near both ends.
void BM_InPlace(benchmark::State& state, CBitVector& (CBitVector::*op)(const CBitVector&)) {
  CBitVector a = A();
  for (auto _ : state) {
    (a.*op)(B());
    benchmark::DoNotOptimize(a);
  }
  state.SetBytesProcessed(state.iterations() * kBytes);
}
BENCHMARK_CAPTURE(BM_InPlace, And, &CBitVector::operator&=);
BENCHMARK_CAPTURE(BM_InPlace, Or, &CBitVector::operator|=);

void BM_Not(benchmark::State& state) {
  for (auto _ : state) {
    CBitVector n = ~A();
    benchmark::DoNotOptimize(n);
  }
  state.SetBytesProcessed(state.iterations() * kBytes);
}
BENCHMARK(BM_Not);

void BM_Count(benchmark::State& state) {
  for (auto _ : state) benchmark::DoNotOptimize(A().Count());
  state.SetBytesProcessed(state.iterations() * kBytes);
}
BENCHMARK(BM_Count);

void BM_Convert(benchmark::State& state) {
  std::vector<uint32_t> out;
  for (auto _ : state) {
    A().Convert(out);
    benchmark::DoNotOptimize(out.data());
  }
  state.SetItemsProcessed(state.iterations() * A().Count());
}
BENCHMARK(BM_Convert);

void BM_SetIteratorWalk(benchmark::State& state) {
  for (auto _ : state) {
    uint64_t sum = 0;
    for (uint32_t oid : A()) sum += oid;
    benchmark::DoNotOptimize(sum);
  }
  state.SetItemsProcessed(state.iterations() * A().Count());
}
BENCHMARK(BM_SetIteratorWalk);

}  // namespace

BENCHMARK_MAIN();
