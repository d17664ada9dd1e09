#pragma once

// Helpers of the AVX2 kernels. Only functions marked VX_AVX2 use the wider instructions, so the
// library still loads and runs on any x86-64; the kernels are picked at run time.

#if defined(__x86_64__) && (defined(__GNUC__) || defined(__clang__))
#define VX_HAVE_AVX2_KERNELS 1

#include <immintrin.h>

#include <cstdint>

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

}  // namespace vxmatch

#endif
