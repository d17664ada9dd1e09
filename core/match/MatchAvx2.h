#pragma once

// Helpers of the AVX2 kernels. Only functions marked VX_AVX2 use the wider instructions, so the
// library still loads and runs on any x86-64; the kernels are picked at run time.

#if defined(__x86_64__) && (defined(__GNUC__) || defined(__clang__))
#define VX_HAVE_AVX2_KERNELS 1

#include <immintrin.h>

#include <cstdint>

#include "MatchCSQuick.h"

#define VX_AVX2 __attribute__((target("avx2")))

namespace vxmatch {

VX_AVX2 inline __m256i Load32(const uint8_t* p) {
  return _mm256_loadu_si256(reinterpret_cast<const __m256i*>(p));
}

VX_AVX2 inline __m128i Load16(const uint8_t* p) {
  return _mm_loadu_si128(reinterpret_cast<const __m128i*>(p));
}

// |x - y| of unsigned bytes.
VX_AVX2 inline __m256i AbsDiff(__m256i x, __m256i y) {
  return _mm256_sub_epi8(_mm256_max_epu8(x, y), _mm256_min_epu8(x, y));
}

VX_AVX2 inline __m128i AbsDiff(__m128i x, __m128i y) {
  return _mm_sub_epi8(_mm_max_epu8(x, y), _mm_min_epu8(x, y));
}

// Byte sums of the chunks of a record in 16-bit lanes. Low bytes of the lanes hold C1 and C3,
// high bytes C2 and Shape, alternately. All adds whole lanes and may wrap; High adds the high
// bytes, at most 50 of 255 per lane over a record, which fits. The low bytes' sum,
// All - 256 * High, fits as well, so it comes out exact although All wrapped: one instruction
// per chunk fewer than masking the low bytes.
struct SLaneSums {
  __m256i All;
  __m256i High;
};

VX_AVX2 inline SLaneSums ZeroSums() { return {_mm256_setzero_si256(), _mm256_setzero_si256()}; }

VX_AVX2 inline SLaneSums Added(SLaneSums s, __m256i bytes) {
  return {_mm256_add_epi16(s.All, bytes), _mm256_add_epi16(s.High, _mm256_srli_epi16(bytes, 8))};
}

VX_AVX2 inline void Add(SLaneSums& s, __m256i bytes) { s = Added(s, bytes); }

VX_AVX2 inline SLaneSums Joined(const SLaneSums& a, const SLaneSums& b) {
  return {_mm256_add_epi16(a.All, b.All), _mm256_add_epi16(a.High, b.High)};
}

VX_AVX2 inline SFieldSums Reduce(const SLaneSums& s) {
  const __m256i low = _mm256_sub_epi16(s.All, _mm256_slli_epi16(s.High, 8));
  const __m256i first = _mm256_set1_epi32(1);         // the even 16-bit lane of each pair
  const __m256i second = _mm256_set1_epi32(1 << 16);  // the odd one
  const __m256i luma = _mm256_madd_epi16(low, first);
  const __m256i color =
      _mm256_add_epi32(_mm256_madd_epi16(low, second), _mm256_madd_epi16(s.High, first));
  const __m256i shape = _mm256_madd_epi16(s.High, second);
  // Pairwise sums down to luma, color, shape, shape in each half.
  const __m256i pairs =
      _mm256_hadd_epi32(_mm256_hadd_epi32(luma, color), _mm256_hadd_epi32(shape, shape));
  const __m128i sums =
      _mm_add_epi32(_mm256_castsi256_si128(pairs), _mm256_extracti128_si256(pairs, 1));
  SFieldSums result;
  result.Luma = static_cast<uint32_t>(_mm_extract_epi32(sums, 0));
  result.Color = static_cast<uint32_t>(_mm_extract_epi32(sums, 1));
  result.Shape = static_cast<uint32_t>(_mm_extract_epi32(sums, 2));
  return result;
}

}  // namespace vxmatch

#endif
