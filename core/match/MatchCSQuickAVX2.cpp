// MatchCSQuick with AVX2.
#include "MatchAvx2.h"
#include "MatchCSQuick.h"

namespace vxmatch {

#ifdef VX_HAVE_AVX2_KERNELS

namespace {

// ---- Unweighted: byte differences summed per field in 16-bit lanes (SLaneSums). ----

// Fast visits even rows of even columns. Chunk q of each run of five (40 cells, two columns)
// holds: q 0 and 1, rows 0-15 of the even column; q 2, rows 16-19 of it and 4 cells of the odd
// column; q 3 and 4, the odd column only. Masks of the visited cells of chunks 0 to 2, and the
// same reversed.
VX_AVX2 inline __m256i FastMask(int q) {
  return q < 2 ? _mm256_setr_epi32(-1, 0, -1, 0, -1, 0, -1, 0)
               : _mm256_setr_epi32(-1, 0, -1, 0, 0, 0, 0, 0);
}
VX_AVX2 inline __m256i ReversedFastMask(int q) {
  return q < 2 ? _mm256_setr_epi32(0, -1, 0, -1, 0, -1, 0, -1)
               : _mm256_setr_epi32(0, 0, 0, 0, 0, -1, 0, -1);
}

// Adds the differences of the cells visited, by mask under Fast.
template <bool kFast>
VX_AVX2 inline void AddVisited(SLaneSums& s, __m256i diff, __m256i visited) {
  Add(s, kFast ? _mm256_and_si256(diff, visited) : diff);
}

VX_AVX2 inline __m256i ChunkDiff(const uint8_t* o, const uint8_t* c, int v) {
  return AbsDiff(Load32(o + 32 * v), Load32(c + 32 * v));
}

VX_AVX2 inline __m256i ChunkMin(const uint8_t* o, const uint8_t* c, int v) {
  return _mm256_min_epu8(Load32(o + 32 * v), Load32(c + 32 * v));
}

// The field sums of chunk(o, c, v) over the visited cells. Without Fast two sets of sums over
// alternate chunks keep more additions in flight.
template <bool kFast, __m256i (*kChunk)(const uint8_t*, const uint8_t*, int)>
VX_AVX2 inline SFieldSums SumChunks(const uint8_t* o, const uint8_t* c) {
  if constexpr (kFast) {
    SLaneSums sums = ZeroSums();
    const __m256i rows = FastMask(0), top = FastMask(2);
    for (int run = 0; run < 50; run += 5) {
      Add(sums, _mm256_and_si256(kChunk(o, c, run), rows));
      Add(sums, _mm256_and_si256(kChunk(o, c, run + 1), rows));
      Add(sums, _mm256_and_si256(kChunk(o, c, run + 2), top));
    }
    return Reduce(sums);
  } else {
    SLaneSums even = ZeroSums(), odd = ZeroSums();
    for (int v = 0; v < 50; v += 2) {
      Add(even, kChunk(o, c, v));
      Add(odd, kChunk(o, c, v + 1));
    }
    return Reduce(Joined(even, odd));
  }
}

template <bool kFast>
VX_AVX2 double Plain(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  return Score(PlainNorm(p), SumChunks<kFast, ChunkDiff>(o, c).Total(p));
}

template <bool kFast>
VX_AVX2 double Prepared(const uint8_t* o, const uint8_t* c, const SFieldSums& both,
                        const SVXMatchParams& p) {
  return Score(PlainNorm(p), Differences(both, SumChunks<kFast, ChunkMin>(o, c)).Total(p));
}

VX_AVX2 double AnyPrepared(const uint8_t* o, const uint8_t* c, const SFieldSums& both,
                           const SVXMatchParams& p) {
  return p.Fast ? Prepared<true>(o, c, both, p) : Prepared<false>(o, c, both, p);
}

// Byte offsets of the 4 cells of o that o flipped in k shows at cells 4h to 4h + 3: the same
// rows of the mirrored column. Four cells never straddle a column.
struct SFlippedOffsets {
  int At[100];
  constexpr SFlippedOffsets() : At() {
    for (int h = 0; h < 100; ++h) At[h] = 4 * (4 * h % 20 + 20 * (19 - 4 * h / 20));
  }
};
constexpr SFlippedOffsets kFlipped;

VX_AVX2 inline __m256i LoadFlipped(const uint8_t* o, int v) {
  const __m128i low = Load16(o + kFlipped.At[2 * v]);
  return _mm256_inserti128_si256(_mm256_castsi128_si256(low), Load16(o + kFlipped.At[2 * v + 1]),
                                 1);
}

// Adds the four orientations of c's chunk v, with c's cells j = 8v to 8v + 7:
//   O1 is o's chunk v; O2 is o flipped in k (LoadFlipped);
//   O4 at j is o[399 - j]: o's chunk 49 - v against c's chunk reversed;
//   O3 at j is o flipped in k at 399 - j: the flipped chunk 49 - v against c's chunk reversed.
// Under Fast `visited` masks the visited cells, and `reversed_visited` the same reversed.
template <bool kFast>
VX_AVX2 inline void AddRotated(SLaneSums (&sums)[4], const uint8_t* o, const uint8_t* c, int v,
                               __m256i visited, __m256i reversed_visited) {
  const __m256i cell = Load32(c + 32 * v);
  const __m256i reversed =
      _mm256_permutevar8x32_epi32(cell, _mm256_setr_epi32(7, 6, 5, 4, 3, 2, 1, 0));
  AddVisited<kFast>(sums[0], AbsDiff(Load32(o + 32 * v), cell), visited);
  AddVisited<kFast>(sums[1], AbsDiff(LoadFlipped(o, v), cell), visited);
  AddVisited<kFast>(sums[2], AbsDiff(LoadFlipped(o, 49 - v), reversed), reversed_visited);
  AddVisited<kFast>(sums[3], AbsDiff(Load32(o + 32 * (49 - v)), reversed), reversed_visited);
}

template <bool kFast>
VX_AVX2 double Rotated(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  SLaneSums sums[4] = {ZeroSums(), ZeroSums(), ZeroSums(), ZeroSums()};
  if constexpr (kFast) {
    const __m256i rows = FastMask(0), top = FastMask(2);
    const __m256i reversed_rows = ReversedFastMask(0), reversed_top = ReversedFastMask(2);
    for (int run = 0; run < 50; run += 5) {
      AddRotated<true>(sums, o, c, run, rows, reversed_rows);
      AddRotated<true>(sums, o, c, run + 1, rows, reversed_rows);
      AddRotated<true>(sums, o, c, run + 2, top, reversed_top);
    }
  } else {
    for (int v = 0; v < 50; ++v) AddRotated<false>(sums, o, c, v, __m256i{}, __m256i{});
  }
  double total = Reduce(sums[0]).Total(p);
  for (int r = 1; r < 4; ++r) total = std::min(total, Reduce(sums[r]).Total(p));
  return Score(PlainNorm(p), total);
}

// ---- Weighted: D per cell in doubles, four cells (rows 4g to 4g + 3 of a column) at once. ----

// o's cells at 4 rows from `first` downwards, reversed: a column read upwards.
VX_AVX2 inline __m128i LoadUpwards(const uint8_t* first) {
  return _mm_shuffle_epi32(Load16(first), _MM_SHUFFLE(0, 1, 2, 3));
}

struct SScales {
  __m256d Luma;
  __m256d Color;
};

// D of four cell pairs from their byte differences, each converted to double once.
VX_AVX2 inline __m256d Distance4(__m128i diff, const SScales& s) {
  const __m128i luma = _mm_and_si128(diff, _mm_set1_epi32(0xFF));
  // Bytes weighted 0, 1, 1, 0 add C2 and C3 into 16 bits, then into the 32-bit lane.
  const __m128i color =
      _mm_madd_epi16(_mm_maddubs_epi16(diff, _mm_set1_epi32(0x00010100)), _mm_set1_epi16(1));
  const __m128i shape = _mm_srli_epi32(diff, 24);
  const __m256d mixed =
      _mm256_add_pd(_mm256_mul_pd(_mm256_cvtepi32_pd(luma), s.Luma), _mm256_cvtepi32_pd(color));
  return _mm256_add_pd(_mm256_mul_pd(mixed, s.Color), _mm256_cvtepi32_pd(shape));
}

// Fast keeps the even rows: lanes 0 and 2 of four.
template <bool kFast>
VX_AVX2 inline __m256d VisitedWeights(const double* w) {
  const __m256d weights = _mm256_loadu_pd(w);
  if (!kFast) return weights;
  return _mm256_and_pd(weights, _mm256_castsi256_pd(_mm256_setr_epi64x(-1, 0, -1, 0)));
}

// Weights not above 1e-06 (and not numbers) become 0, so their cells add nothing.
VX_AVX2 inline __m256d CountedWeights(__m256d w) {
  return _mm256_and_pd(w, _mm256_cmp_pd(w, _mm256_set1_pd(1e-06), _CMP_GT_OQ));
}

VX_AVX2 inline double HorizontalSum(__m256d v) {
  __m128d x = _mm_add_pd(_mm256_castpd256_pd128(v), _mm256_extractf128_pd(v, 1));
  return _mm_cvtsd_f64(_mm_add_sd(x, _mm_unpackhi_pd(x, x)));
}

template <bool kFast>
VX_AVX2 double WeightedNorm(const SVXMatchParams& p) {
  __m256d sum = _mm256_setzero_pd();
  for (int k = 0; k < 20; k += kFast ? 2 : 1) {
    for (int g = 0; g < 5; ++g) {
      sum = _mm256_add_pd(sum, VisitedWeights<kFast>(p.Weights->W + 20 * k + 4 * g));
    }
  }
  return HorizontalSum(sum) * p.MaxDistance();
}

// Walks groups of four rows outer, so that a Fast walk may stop after the rows that it has
// summed, as the row-by-row walk does: the rows of a group are added to the total one by one.
template <bool kFast>
VX_AVX2 double Weighted(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  constexpr int kStep = kFast ? 2 : 1;
  const SScales scales = {_mm256_set1_pd(p.LumaScale), _mm256_set1_pd(p.ColorScale)};
  const double* w = p.Weights->W;
  const double norm = WeightedNorm<kFast>(p);
  double total = 0;
  for (int g = 0; g < 5; ++g) {
    __m256d rows[2] = {_mm256_setzero_pd(), _mm256_setzero_pd()};  // even and odd k
    for (int k = 0; k < 20; k += kStep) {
      const int j = 20 * k + 4 * g;
      const __m256d d = Distance4(AbsDiff(Load16(o + 4 * j), Load16(c + 4 * j)), scales);
      __m256d& row = rows[(k / kStep) & 1];
      row = _mm256_add_pd(row, _mm256_mul_pd(d, CountedWeights(VisitedWeights<kFast>(w + j))));
    }
    double sums[4];
    _mm256_storeu_pd(sums, _mm256_add_pd(rows[0], rows[1]));
    for (int l = 0; l < 4; l += kStep) {
      total += sums[l];
      if (kFast && 4 * g + l > 10) {
        const double score = Score(norm, total);
        if (score >= p.MinScore) return score;
      }
    }
  }
  return Score(norm, total);
}

// With c's cells at rows 4g to 4g + 3 of column k: O1 the same cells of o, O2 those of column
// 19 - k, O3 and O4 rows 19 - 4g upwards of columns k and 19 - k.
template <bool kFast>
VX_AVX2 double WeightedRotated(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  const SScales scales = {_mm256_set1_pd(p.LumaScale), _mm256_set1_pd(p.ColorScale)};
  __m256d totals[4] = {_mm256_setzero_pd(), _mm256_setzero_pd(), _mm256_setzero_pd(),
                       _mm256_setzero_pd()};
  for (int k = 0; k < 20; k += kFast ? 2 : 1) {
    for (int g = 0; g < 5; ++g) {
      const int j = 20 * k + 4 * g;
      const __m256d w = CountedWeights(VisitedWeights<kFast>(p.Weights->W + j));
      const __m128i cell = Load16(c + 4 * j);
      const int column = 4 * 20 * k, mirrored = 4 * 20 * (19 - k);
      const __m128i oriented[4] = {Load16(o + column + 16 * g), Load16(o + mirrored + 16 * g),
                                   LoadUpwards(o + column + 4 * (16 - 4 * g)),
                                   LoadUpwards(o + mirrored + 4 * (16 - 4 * g))};
      for (int r = 0; r < 4; ++r) {
        const __m256d d = Distance4(AbsDiff(oriented[r], cell), scales);
        totals[r] = _mm256_add_pd(totals[r], _mm256_mul_pd(d, w));
      }
    }
  }
  double total = HorizontalSum(totals[0]);
  for (int r = 1; r < 4; ++r) total = std::min(total, HorizontalSum(totals[r]));
  return Score(WeightedNorm<kFast>(p), total);
}

}  // namespace

const SKernelSet* Avx2QuickKernels() {
  static const SKernelSet kernels = {
      ByStep<Plain<false>, Plain<true>>, ByStep<Weighted<false>, Weighted<true>>,
      ByStep<Rotated<false>, Rotated<true>>, ByStep<WeightedRotated<false>, WeightedRotated<true>>};
  return CpuHasAvx2() ? &kernels : nullptr;
}

PreparedFn Avx2PreparedQuick() { return CpuHasAvx2() ? AnyPrepared : nullptr; }

#else

const SKernelSet* Avx2QuickKernels() { return nullptr; }
PreparedFn Avx2PreparedQuick() { return nullptr; }

#endif

}  // namespace vxmatch
