// MatchCSFuzzy with AVX2. Most cells of two unlike images do not fit, and the portable walk then
// tests up to 25 neighbours one by one. Here a first pass marks, for every visited cell, which of
// its neighbours fit, eight cells and one offset at a time; the walk then takes the first mark in
// search order and prices that one neighbour as the portable walk does.
#include <cstring>

#include "MatchAvx2.h"
#include "MatchCSFuzzy.h"

namespace vxmatch {

#ifdef VX_HAVE_AVX2_KERNELS

namespace {

// The neighbour (i + dx, k + dy) is bit q = (dx + 2) * 5 + (dy + 2): ascending bits follow the
// search order, x outer.
constexpr int kCentre = 12;
constexpr int OffsetX(int q) { return q / 5 - 2; }
constexpr int OffsetY(int q) { return q % 5 - 2; }

// Does the search around (i, k) with this step visit the neighbour q? x runs from max(i - 2, 0)
// to min(i + 2, 20) in steps from its start, y likewise; indices above 399 are left out.
bool Searched(int i, int k, int step, int q) {
  const int x = i + OffsetX(q), y = k + OffsetY(q);
  const int x0 = std::max(i - 2, 0), y0 = std::max(k - 2, 0);
  if (x < x0 || x > std::min(i + 2, 20) || (x - x0) % step != 0) return false;
  if (y < y0 || y > std::min(k + 2, 20) || (y - y0) % step != 0) return false;
  return x + 20 * y <= 399;
}

// The neighbours that the search visits, by step (1 or 2) and cell.
struct SSearchMasks {
  uint32_t Bits[2][400];
};

const SSearchMasks& SearchMasks() {
  static const SSearchMasks masks = [] {
    SSearchMasks m{};
    for (int step = 1; step <= 2; ++step) {
      for (int j = 0; j < 400; ++j) {
        for (int q = 0; q < 25; ++q) {
          if (Searched(j % 20, j / 20, step, q)) m.Bits[step - 1][j] |= 1u << q;
        }
      }
    }
    return m;
  }();
  return masks;
}

// Cells before and after the copy of c: more than the 42 of the farthest neighbour.
constexpr int kPad = 48;

// Per cell of c, the largest byte difference of each field that fits: C1, C2, C3, and any
// Shape. A cell where even a difference of 0 would not fit is blocked.
template <bool kWeighted, bool kRotated>
void SetLimits(const CFuzzyRules<kWeighted, kRotated>& rules, uint8_t* limits, bool* blocked) {
  auto set = [&](int j, int luma, int color) {
    blocked[j] = luma == 0 || color == 0;
    const uint8_t cell[4] = {uint8_t(luma - 1), uint8_t(color - 1), uint8_t(color - 1), 255};
    std::memcpy(limits + 4 * j, cell, 4);
  };
  if (!kWeighted) {
    for (int j = 0; j < 400; ++j) set(j, rules.LumaFit(1.0), rules.ColorFit(1.0));
    return;
  }
  double last = 0;
  int luma = 0, color = 0;
  rules.ForCounted([&](int, int, int j, double w) {
    if (w != last) {  // weights repeat across a matrix: count once per run of one value
      luma = rules.LumaFit(w);
      color = rules.ColorFit(w);
      last = w;
    }
    set(j, luma, color);
  });
}

// o's cells that meet c's cell j in orientation r, laid out by j.
void Orient(const uint8_t* o, uint8_t (*oriented)[1600]) {
  for (int k = 0; k < 20; ++k) {
    for (int i = 0; i < 20; ++i) {
      for (int r = 1; r < 4; ++r) {
        std::memcpy(oriented[r - 1] + 4 * (i + 20 * k), o + 4 * Oriented(r, i, k), 4);
      }
    }
  }
}

// Bit q of fit[j]: c's cell j + dx + 20 * dy fits o's cells that meet j. A field fits when c's
// byte lies within o's byte plus or minus its limit; with four orientations, when it lies within
// the range of any of them. Written for the chunks of eight cells that hold a visited cell, as
// MatchCSQuick's Fast walk picks them.
template <int kSides>
VX_AVX2 void MapFits(const uint8_t* const* sides, const uint8_t* limits, const uint8_t* padded,
                     int reach, bool fast, uint32_t* fit) {
  int bits[25], deltas[25], count = 0;
  for (int q = 0; q < 25; ++q) {
    if (reach == 2 && ((OffsetX(q) | OffsetY(q)) & 1)) continue;
    bits[count] = 1 << q;
    deltas[count++] = OffsetX(q) + 20 * OffsetY(q);
  }
  const __m256i zero = _mm256_setzero_si256();
  for (int run = 0; run < 50; run += 5) {
    for (int v = run; v < run + (fast ? 3 : 5); ++v) {
      const __m256i limit = Load32(limits + 32 * v);
      __m256i low[kSides], high[kSides];
      for (int r = 0; r < kSides; ++r) {
        const __m256i side = Load32(sides[r] + 32 * v);
        low[r] = _mm256_subs_epu8(side, limit);
        high[r] = _mm256_adds_epu8(side, limit);
      }
      __m256i found = zero;
      for (int t = 0; t < count; ++t) {
        const __m256i cell = Load32(padded + 4 * (kPad + 8 * v + deltas[t]));
        // Non-zero bytes lie outside the range.
        __m256i outside =
            _mm256_or_si256(_mm256_subs_epu8(low[0], cell), _mm256_subs_epu8(cell, high[0]));
        for (int r = 1; r < kSides; ++r) {
          outside = _mm256_min_epu8(outside, _mm256_or_si256(_mm256_subs_epu8(low[r], cell),
                                                             _mm256_subs_epu8(cell, high[r])));
        }
        const __m256i within = _mm256_cmpeq_epi32(outside, zero);
        found = _mm256_or_si256(found, _mm256_and_si256(within, _mm256_set1_epi32(bits[t])));
      }
      _mm256_storeu_si256(reinterpret_cast<__m256i*>(fit + 8 * v), found);
    }
  }
}

template <bool kWeighted, bool kRotated>
VX_AVX2 double Walk(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  constexpr int kSides = kRotated ? 4 : 1;
  const CFuzzyRules<kWeighted, kRotated> rules(p);
  alignas(32) uint8_t limits[1600] = {};
  bool blocked[400] = {};
  SetLimits(rules, limits, blocked);
  alignas(32) uint8_t oriented[kSides - 1 ? kSides - 1 : 1][1600];
  const uint8_t* sides[kSides] = {o};
  if constexpr (kRotated) {
    Orient(o, oriented);
    for (int r = 1; r < kSides; ++r) sides[r] = oriented[r - 1];
  }
  alignas(32) uint8_t padded[4 * (kPad + 400 + kPad)] = {};
  std::memcpy(padded + 4 * kPad, c, 1600);
  alignas(32) uint32_t fit[400];
  MapFits<kSides>(sides, limits, padded, rules.Reach(), rules.Step() == 2, fit);

  const uint32_t* searched = SearchMasks().Bits[rules.Reach() - 1];
  double total = 0;
  rules.ForCounted([&](int i, int k, int j, double w) {
    const COriginalCells<kRotated> original(o, i, k);
    const uint32_t fits = blocked[j] ? 0 : fit[j];
    if (fits >> kCentre & 1) {
      total += rules.Price(original.Against(c + 4 * j), w);
      return;
    }
    const uint32_t found = fits & searched[j];
    if (found == 0) {
      total += rules.MaxDistance();
      return;
    }
    const int q = __builtin_ctz(found), dx = OffsetX(q), dy = OffsetY(q);
    const SDiffs d = original.Against(c + 4 * (j + dx + 20 * dy));
    total += rules.NeighbourPrice(d, w, std::abs(dx) + std::abs(dy));
  });
  return rules.Result(total);
}

}  // namespace

const SKernelSet* Avx2FuzzyKernels() {
  static const SKernelSet kernels = {Walk<false, false>, Walk<true, false>, Walk<false, true>,
                                     Walk<true, true>};
  return CpuHasAvx2() ? &kernels : nullptr;
}

#else

const SKernelSet* Avx2FuzzyKernels() { return nullptr; }

#endif

}  // namespace vxmatch
