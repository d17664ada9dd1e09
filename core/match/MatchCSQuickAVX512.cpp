// MatchCSQuick without Rotate and weights with AVX-512BW: 64-byte chunks of 16 cells, half the
// steps of the AVX2 walk, and the cells that Fast leaves out masked off for free.
#include "MatchAvx2.h"
#include "MatchCSQuick.h"

namespace vxmatch {

#ifdef VX_HAVE_AVX2_KERNELS

#define VX_AVX512 __attribute__((target("avx2,avx512f,avx512bw")))

namespace {

// Four columns of 20 cells fill five chunks, so the visited cells repeat every five chunks:
// bit b of mask q marks byte b of chunk q of a run of five when Fast visits its cell, one of
// an even row in an even column.
struct SFastMasks {
  uint64_t Bytes[5];
  constexpr SFastMasks() : Bytes() {
    for (int q = 0; q < 5; ++q) {
      for (int b = 0; b < 64; ++b) {
        const int cell = (64 * q + b) / 4;
        if (cell / 20 % 2 == 0 && cell % 20 % 2 == 0) Bytes[q] |= uint64_t{1} << b;
      }
    }
  }
};
constexpr SFastMasks kFastMasks;

VX_AVX512 inline __m512i MaskedDiff(__mmask64 keep, __m512i x, __m512i y) {
  return _mm512_maskz_sub_epi8(keep, _mm512_max_epu8(x, y), _mm512_min_epu8(x, y));
}

VX_AVX512 inline __m512i MaskedMin(__mmask64 keep, __m512i x, __m512i y) {
  return _mm512_maskz_min_epu8(keep, x, y);
}

// The two 256-bit halves added. They pass through memory: GCC 12 warns falsely of the
// intrinsics that would split the register.
VX_AVX512 inline __m256i Folded(__m512i x) {
  alignas(64) uint8_t halves[64];
  _mm512_store_si512(halves, x);
  return _mm256_add_epi16(Load32(halves), Load32(halves + 32));
}

// The field sums of kChunk over the visited cells; the halves of the 512-bit lanes are added
// into the 256-bit lanes that Reduce takes.
template <bool kFast, __m512i (*kChunk)(__mmask64, __m512i, __m512i)>
VX_AVX512 inline SFieldSums SumChunks(const uint8_t* o, const uint8_t* c) {
  __m512i all = _mm512_setzero_si512(), high = _mm512_setzero_si512();
  for (int v = 0; v < 25; ++v) {
    const __mmask64 keep = kFast ? kFastMasks.Bytes[v % 5] : ~__mmask64{0};
    const __m512i bytes =
        kChunk(keep, _mm512_loadu_si512(o + 64 * v), _mm512_loadu_si512(c + 64 * v));
    all = _mm512_add_epi16(all, bytes);
    high = _mm512_add_epi16(high, _mm512_srli_epi16(bytes, 8));
  }
  return Reduce({Folded(all), Folded(high)});
}

// The minima sums of o against four candidates: o's chunk is read once for the four, and the
// four independent sums keep the core busy while each waits on its last addition.
template <bool kFast>
VX_AVX512 inline void MinimaOfFour(const uint8_t* o, const uint8_t* const c[4],
                                   SFieldSums minima[4]) {
  __m512i all[4], high[4];
  for (int k = 0; k < 4; ++k) all[k] = high[k] = _mm512_setzero_si512();
  for (int v = 0; v < 25; ++v) {
    const __mmask64 keep = kFast ? kFastMasks.Bytes[v % 5] : ~__mmask64{0};
    const __m512i x = _mm512_loadu_si512(o + 64 * v);
    for (int k = 0; k < 4; ++k) {
      const __m512i bytes = MaskedMin(keep, x, _mm512_loadu_si512(c[k] + 64 * v));
      all[k] = _mm512_add_epi16(all[k], bytes);
      high[k] = _mm512_add_epi16(high[k], _mm512_srli_epi16(bytes, 8));
    }
  }
  for (int k = 0; k < 4; ++k) minima[k] = Reduce({Folded(all[k]), Folded(high[k])});
}

VX_AVX512 void Minima4(const uint8_t* o, const uint8_t* const c[4], bool fast,
                       SFieldSums minima[4]) {
  if (fast) {
    MinimaOfFour<true>(o, c, minima);
  } else {
    MinimaOfFour<false>(o, c, minima);
  }
}

template <__m512i (*kChunk)(__mmask64, __m512i, __m512i)>
VX_AVX512 SFieldSums Sums(const uint8_t* o, const uint8_t* c, bool fast) {
  return fast ? SumChunks<true, kChunk>(o, c) : SumChunks<false, kChunk>(o, c);
}

// The scores are made outside the AVX-512 functions, where the compiler could fuse a multiply
// and an add and round otherwise than the other walks.
double Plain(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  return Score(PlainNorm(p), Sums<MaskedDiff>(o, c, p.Fast).Total(p));
}

double Prepared(const uint8_t* o, const uint8_t* c, const SFieldSums& both,
                const SVXMatchParams& p) {
  return Score(PlainNorm(p), Differences(both, Sums<MaskedMin>(o, c, p.Fast)).Total(p));
}

bool CpuHasAvx512() {
  static const bool has = [] {
    __builtin_cpu_init();
    return __builtin_cpu_supports("avx512f") && __builtin_cpu_supports("avx512bw");
  }();
  return has;
}

}  // namespace

KernelFn Avx512PlainQuick() { return CpuHasAvx512() ? Plain : nullptr; }
PreparedFn Avx512PreparedQuick() { return CpuHasAvx512() ? Prepared : nullptr; }
Minima4Fn Avx512PreparedMinima4() { return CpuHasAvx512() ? Minima4 : nullptr; }

#else

KernelFn Avx512PlainQuick() { return nullptr; }
PreparedFn Avx512PreparedQuick() { return nullptr; }
Minima4Fn Avx512PreparedMinima4() { return nullptr; }

#endif

}  // namespace vxmatch
