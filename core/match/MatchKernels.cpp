#include "MatchKernels.h"

#include <cmath>

#include "MatchCells.h"

using vxmatch::AbsDiff;

namespace {

// |dC1| + |dC2| + |dC3| of two cells.
int ColorDistance(const uint8_t* x, const uint8_t* y) {
  return AbsDiff(x[0], y[0]) + AbsDiff(x[1], y[1]) + AbsDiff(x[2], y[2]);
}

}  // namespace

double MatchDuplicates(const SVXDBRec_3& o, const SVXDBRec_3& c, const SVXMatchParams& p) {
  const uint8_t* oc = vxmatch::CellBytes(o);
  const uint8_t* cc = vxmatch::CellBytes(c);
  const int orientations = p.Rotate ? 4 : 1;
  uint32_t sum = 0;
  for (int i = 0; i < 20; i += 4) {
    for (int k = 0; k < 20; k += 4) {
      const uint8_t* cell = cc + 4 * (i + 20 * k);
      int d = 765;
      for (int r = 0; r < orientations; ++r) {
        d = std::min(d, ColorDistance(oc + 4 * vxmatch::Oriented(r, i, k), cell));
      }
      if (d <= 153) sum += 765 - d;  // a fifth of the largest distance
    }
  }
  return sum * 5.22875816993464e-05 * 100;  // 1 / (25 * 765)
}

// The bins of histograms built from records are floats of at least 0.5, so multiples of 2^-24,
// and their sum stays far below 2^29: every partial sum is exact in double, and four running
// sums give the same t as one.
double MatchHistogram(const CHist& o, double weight, const CHist& c) {
  double sums[4] = {};
  for (int bin = 0; bin < 256; bin += 4) {
    for (int l = 0; l < 4; ++l) sums[l] += std::min(o.Bins[bin + l], c.Bins[bin + l]);
  }
  const double shared = (sums[0] + sums[1]) + (sums[2] + sums[3]);
  const double r = std::trunc(shared) / weight * 100;
  return r > 100 ? 100 : r;
}

bool vxmatch::CpuHasAvx2() {
#if defined(__x86_64__) && (defined(__GNUC__) || defined(__clang__))
  static const bool has = [] {
    __builtin_cpu_init();
    return __builtin_cpu_supports("avx2") != 0;
  }();
  return has;
#else
  return false;
#endif
}
