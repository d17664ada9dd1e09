#include "Shape.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <new>
#include <utility>
#include <vector>

#if defined(__SSE2__)
#include <emmintrin.h>
#endif

namespace {

constexpr uint32_t kGrid = 20;
constexpr uint32_t kCells = kGrid * kGrid;

// Accumulators of one calculation, by cell index x cell * 20 + y cell. 64 bits throughout: a
// cell of a large image holds more than 2^32 / 255 pixels.
struct SCellSums {
  uint64_t R[kCells] = {};
  uint64_t G[kCells] = {};
  uint64_t B[kCells] = {};
  uint64_t Count[kCells] = {};
  uint64_t Bright[kCells] = {};
  // Four interleaved histograms, so that runs of equal luminance do not wait on each other's
  // increments; summed before use.
  uint64_t Hist[4][256] = {};
};

// The image and its cells: cw by ch pixels, at least enough of them to cover the image.
struct SGrid {
  const SVXColor* Pixels;
  uint32_t W;
  uint32_t H;
  uint32_t CW;
  uint32_t CH;
};

uint32_t CellSize(uint32_t extent) { return static_cast<uint32_t>((uint64_t{extent} + 19) / 20); }

// (30000 r + 59000 g + 11000 b) / 100000 with the common factor 1000 cancelled, which leaves the
// truncated quotient unchanged; the divisor is a constant, so no division is executed.
inline uint8_t Luma(SVXColor p) {
  return static_cast<uint8_t>((30u * p.R + 59u * p.G + 11u * p.B) / 100u);
}

#if defined(__SSE2__)
// 30 r + 59 g + 11 b of four pixels given as 16-bit lanes r g b a r g b a (two vectors), as four
// 32-bit lanes.
inline __m128i WeightedSum4(__m128i lo, __m128i hi) {
  const __m128i weights = _mm_setr_epi16(30, 59, 11, 0, 30, 59, 11, 0);
  // Each pixel gives two lanes, 30 r + 59 g and 11 b; adding the even lanes to the odd ones
  // completes it.
  const __m128 a = _mm_castsi128_ps(_mm_madd_epi16(lo, weights));
  const __m128 b = _mm_castsi128_ps(_mm_madd_epi16(hi, weights));
  return _mm_add_epi32(_mm_castps_si128(_mm_shuffle_ps(a, b, _MM_SHUFFLE(2, 0, 2, 0))),
                       _mm_castps_si128(_mm_shuffle_ps(a, b, _MM_SHUFFLE(3, 1, 3, 1))));
}

inline uint64_t Lanes(__m128i v) {
  uint64_t lanes[2];
  _mm_storeu_si128(reinterpret_cast<__m128i*>(lanes), v);
  return lanes[0] + lanes[1];
}
#endif

// The first pass over `n` pixels: adds their red, green and blue to `sums` and stores their
// luminance in `luma`.
void ScanPixels(const SVXColor* px, uint32_t n, uint8_t* luma, uint64_t (&sums)[3]) {
  uint32_t x = 0;
#if defined(__SSE2__)
  const __m128i zero = _mm_setzero_si128();
  // x / 100 = (x * 5243) >> 19 for every x up to 25500, the largest weighted sum.
  const __m128i div100 = _mm_set1_epi16(5243);
  while (n - x >= 8) {
    // The colour sums run in 16-bit lanes r g b a r g b a. Eight pixels add at most 4 * 255 to
    // a lane, so a block of 64 such steps stays below 65536 before it is folded into `sums`.
    const uint32_t steps = std::min<uint32_t>((n - x) / 8, 64);
    __m128i acc = zero;
    for (uint32_t i = 0; i < steps; ++i, x += 8) {
      const __m128i p0 = _mm_loadu_si128(reinterpret_cast<const __m128i*>(px + x));
      const __m128i p1 = _mm_loadu_si128(reinterpret_cast<const __m128i*>(px + x + 4));
      const __m128i a = _mm_unpacklo_epi8(p0, zero), b = _mm_unpackhi_epi8(p0, zero);
      const __m128i c = _mm_unpacklo_epi8(p1, zero), d = _mm_unpackhi_epi8(p1, zero);
      acc = _mm_add_epi16(acc, _mm_add_epi16(_mm_add_epi16(a, b), _mm_add_epi16(c, d)));
      const __m128i weighted = _mm_packs_epi32(WeightedSum4(a, b), WeightedSum4(c, d));
      const __m128i l = _mm_srli_epi16(_mm_mulhi_epu16(weighted, div100), 3);
      _mm_storel_epi64(reinterpret_cast<__m128i*>(luma + x), _mm_packus_epi16(l, zero));
    }
    uint16_t lanes[8];
    _mm_storeu_si128(reinterpret_cast<__m128i*>(lanes), acc);
    sums[0] += uint32_t{lanes[0]} + lanes[4];
    sums[1] += uint32_t{lanes[1]} + lanes[5];
    sums[2] += uint32_t{lanes[2]} + lanes[6];
  }
#endif
  for (; x < n; ++x) {
    sums[0] += px[x].R;
    sums[1] += px[x].G;
    sums[2] += px[x].B;
    luma[x] = Luma(px[x]);
  }
}

// Number of the `n` bytes at `p` that are at least `t`.
uint64_t CountAtLeast(const uint8_t* p, uint32_t n, uint8_t t) {
  uint64_t count = 0;
  uint32_t x = 0;
#if defined(__SSE2__)
  const __m128i threshold = _mm_set1_epi8(static_cast<char>(t));
  while (n - x >= 16) {
    // Byte-wide counters, folded into 64 bits before any of them can pass 255.
    const uint32_t blocks = std::min<uint32_t>((n - x) / 16, 255);
    __m128i counters = _mm_setzero_si128();
    for (uint32_t i = 0; i < blocks; ++i, x += 16) {
      const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + x));
      counters = _mm_sub_epi8(counters, _mm_cmpeq_epi8(_mm_max_epu8(v, threshold), v));
    }
    count += Lanes(_mm_sad_epu8(counters, _mm_setzero_si128()));
  }
#endif
  for (; x < n; ++x) count += p[x] >= t;
  return count;
}

void LumaRow(const SVXColor* row, uint32_t w, uint8_t* luma) {
  uint64_t unused[3] = {};
  ScanPixels(row, w, luma, unused);
}

// First pass over one row of cell row `yCell`: colour sums per cell, luminance into `luma` and
// into the histogram.
void SumRow(const SGrid& g, const SVXColor* row, uint32_t yCell, uint8_t* luma, SCellSums& s) {
  uint32_t cell = yCell;
  for (uint64_t x0 = 0; x0 < g.W; x0 += g.CW, cell += kGrid) {
    const uint32_t n = static_cast<uint32_t>(std::min<uint64_t>(g.W - x0, g.CW));
    uint64_t sums[3] = {};
    ScanPixels(row + x0, n, luma + x0, sums);
    s.R[cell] += sums[0];
    s.G[cell] += sums[1];
    s.B[cell] += sums[2];
    s.Count[cell] += n;
  }
  uint32_t x = 0;
  for (; g.W - x >= 4; x += 4) {
    ++s.Hist[0][luma[x]];
    ++s.Hist[1][luma[x + 1]];
    ++s.Hist[2][luma[x + 2]];
    ++s.Hist[3][luma[x + 3]];
  }
  for (; x < g.W; ++x) ++s.Hist[0][luma[x]];
}

// Second pass over one row: pixels at or above `minBright` count as bright in their cell.
void CountRow(const SGrid& g, const uint8_t* luma, uint32_t yCell, uint8_t minBright,
              SCellSums& s) {
  uint32_t cell = yCell;
  for (uint64_t x0 = 0; x0 < g.W; x0 += g.CW, cell += kGrid) {
    const uint32_t n = static_cast<uint32_t>(std::min<uint64_t>(g.W - x0, g.CW));
    s.Bright[cell] += CountAtLeast(luma + x0, n, minBright);
  }
}

// A pixel is bright when its equalised luminance 255 / n * cum[l], in double, exceeds the
// threshold. That value never falls as l rises, so the bright pixels are exactly those at or
// above the first bright l; returns 256 when no l is bright.
uint32_t FirstBrightLuma(const SCellSums& s, uint64_t n, unsigned char threshold) {
  const double scale = 255.0 / static_cast<double>(n);
  uint64_t cum = 0;
  for (uint32_t l = 0; l < 256; ++l) {
    cum += s.Hist[0][l] + s.Hist[1][l] + s.Hist[2][l] + s.Hist[3][l];
    if (scale * static_cast<double>(cum) > threshold) return l;
  }
  return 256;
}

// Means truncated to bytes and converted; the integer quotient equals the truncated double one
// for every count an image can have. Shape is the bright count over one percent of the nominal
// cell area, in double and truncated: that is the definition of the stored value, kept although
// a wholly bright cell of area 7, 14, 17 and others comes out just below 100 and is stored as 99.
void FinishCells(const SGrid& g, const SCellSums& s, SVXMatchInfo& info) {
  const double percent = static_cast<double>(uint64_t{g.CW} * g.CH) * 0.01;
  for (uint32_t i = 0; i < kCells; ++i) {
    const uint64_t count = std::max<uint64_t>(s.Count[i], 1);
    SVXMatchInfo::SCell& c = info.Cells[i];
    RGB2C3(static_cast<unsigned>(s.R[i] / count), static_cast<unsigned>(s.G[i] / count),
           static_cast<unsigned>(s.B[i] / count), c.C1, c.C2, c.C3);
    c.Shape = static_cast<uint8_t>(static_cast<double>(s.Bright[i]) / percent);
  }
}

}  // namespace

CShape::CShape() {
  std::memset(&Original, 0, sizeof Original);
  std::memset(ColorInfo, 0, sizeof ColorInfo);
}

CShape::CShape(const CShape& other) : CVXBase(other) {
  std::memcpy(&Original, &other.Original, sizeof Original);
  std::memcpy(ColorInfo, other.ColorInfo, sizeof ColorInfo);
}

CShape::CShape(CShape&& other) noexcept
    : CVXBase(other),
      Scratch(std::move(other.Scratch)),
      ScratchSize(std::exchange(other.ScratchSize, 0)) {
  std::memcpy(&Original, &other.Original, sizeof Original);
  std::memcpy(ColorInfo, other.ColorInfo, sizeof ColorInfo);
}

CShape& CShape::operator=(const CShape& other) {
  if (this != &other) {
    std::memcpy(&Original, &other.Original, sizeof Original);
    std::memcpy(ColorInfo, other.ColorInfo, sizeof ColorInfo);
  }
  return *this;
}

CShape& CShape::operator=(CShape&& other) noexcept {
  if (this != &other) {
    *this = static_cast<const CShape&>(other);
    Scratch = std::move(other.Scratch);
    ScratchSize = std::exchange(other.ScratchSize, 0);
  }
  return *this;
}

CShape::~CShape() = default;

uint8_t* CShape::ReserveScratch_(uint64_t pixels) {
  if (pixels > std::numeric_limits<uint32_t>::max()) return nullptr;
  if (!Scratch || pixels > ScratchSize) {
    Scratch.reset();  // the old buffer goes before the larger one is asked for
    ScratchSize = 0;
    Scratch.reset(new (std::nothrow) uint8_t[pixels]);
    if (Scratch) ScratchSize = static_cast<uint32_t>(pixels);
  }
  return Scratch.get();
}

bool CShape::CalcShapeInfo(const CVXBitmap& bitmap, SVXMatchInfo& info, unsigned char threshold) {
  std::memset(&info, 0, sizeof info);
  const uint64_t n = bitmap.GetPixelCount();
  if (n == 0) return false;
  const SGrid g{bitmap.GetColorMatrix(), bitmap.GetWidth(), bitmap.GetHeight(),
                CellSize(bitmap.GetWidth()), CellSize(bitmap.GetHeight())};

  // The luminance of every pixel is kept for the second pass. An image beyond the scratch
  // buffer's capacity, or one that cannot be allocated, has it recomputed row by row instead.
  uint8_t* scratch = ReserveScratch_(n);
  std::vector<uint8_t> rowLuma;
  try {
    if (!scratch) rowLuma.resize(g.W);
  } catch (const std::bad_alloc&) {
    return false;
  }
  auto sums = std::make_unique<SCellSums>();
  auto lumaOf = [&](uint32_t y) { return scratch ? scratch + uint64_t{y} * g.W : rowLuma.data(); };

  for (uint32_t y = 0, yCell = 0, inBand = 0; y < g.H; ++y) {
    SumRow(g, g.Pixels + uint64_t{y} * g.W, yCell, lumaOf(y), *sums);
    if (++inBand == g.CH) inBand = 0, ++yCell;
  }
  const uint32_t minBright = FirstBrightLuma(*sums, n, threshold);
  if (minBright < 256) {
    for (uint32_t y = 0, yCell = 0, inBand = 0; y < g.H; ++y) {
      uint8_t* luma = lumaOf(y);
      if (!scratch) LumaRow(g.Pixels + uint64_t{y} * g.W, g.W, luma);
      CountRow(g, luma, yCell, static_cast<uint8_t>(minBright), *sums);
      if (++inBand == g.CH) inBand = 0, ++yCell;
    }
  }
  FinishCells(g, *sums, info);
  return true;
}

void CShape::SetOriginal(const SVXMatchInfo& info) {
  std::memcpy(&Original, &info, sizeof Original);
}

void CShape::SetColorInfo(const SColPercMatchInfo (*cells)[20]) {
  if (!cells) return;
  static_assert(sizeof ColorInfo == 2800);
  std::memcpy(ColorInfo, cells, sizeof ColorInfo);
  for (auto& column : ColorInfo) {
    for (ShapeColorInfo& c : column) RGB2C(c.R, c.G, c.B, c);
  }
}

void CShape::RGB2C(unsigned char r, unsigned char g, unsigned char b, ShapeColorInfo& info) {
  RGB2C3(r, g, b, info.C1, info.C2, info.C3);
}
