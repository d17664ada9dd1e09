#pragma once

#include "MatchCells.h"

namespace vxmatch {

// Byte differences of many cell pairs, summed by field. Without weights the distance is linear
// in them, so the sums are kept in integers and converted once at the end.
struct SFieldSums {
  uint32_t Luma = 0;   // |dC1|
  uint32_t Color = 0;  // |dC2| + |dC3|
  uint32_t Shape = 0;  // |dShape|

  void Add(const uint8_t* x, const uint8_t* y) {
    Luma += AbsDiff(x[0], y[0]);
    Color += AbsDiff(x[1], y[1]) + AbsDiff(x[2], y[2]);
    Shape += AbsDiff(x[3], y[3]);
  }
  // The sum of D over the cell pairs.
  double Total(const SVXMatchParams& p) const {
    return (Luma * p.LumaScale + Color) * p.ColorScale + Shape;
  }
};

// Field sums of the cells visited by an unweighted walk with `step` 1 or 2.
SFieldSums VisitedSums(const uint8_t* cells, int step);

// |x - y| summed by field over many cell pairs, from the sums of x, of y (`both`) and of
// min(x, y) (`minima`): x + y - 2 min(x, y).
inline SFieldSums Differences(const SFieldSums& both, const SFieldSums& minima) {
  SFieldSums d;
  d.Luma = both.Luma - 2 * minima.Luma;
  d.Color = both.Color - 2 * minima.Color;
  d.Shape = both.Shape - 2 * minima.Shape;
  return d;
}

// D of one cell pair.
inline double Distance(const uint8_t* x, const uint8_t* y, const SVXMatchParams& p) {
  const int luma = AbsDiff(x[0], y[0]);
  const int color = AbsDiff(x[1], y[1]) + AbsDiff(x[2], y[2]);
  return (luma * p.LumaScale + color) * p.ColorScale + AbsDiff(x[3], y[3]);
}

// The comparison of MatchCSQuickPrepared on the cell bytes; `both` holds the visited sums of o
// and c added.
using PreparedFn = double (*)(const uint8_t* o, const uint8_t* c, const SFieldSums& both,
                              const SVXMatchParams& p);
PreparedFn PortablePreparedQuick();
// Null unless both the build and the processor have AVX2.
PreparedFn Avx2PreparedQuick();
// The unweighted, unrotated walks on 64-byte chunks; null unless both the build and the
// processor have AVX-512BW.
KernelFn Avx512PlainQuick();
PreparedFn Avx512PreparedQuick();
// The minima sums of o against four candidates at once, for MatchCSQuickPreparedMany; null
// unless both the build and the processor have AVX-512BW.
using Minima4Fn = void (*)(const uint8_t* o, const uint8_t* const c[4], bool fast,
                           SFieldSums minima[4]);
Minima4Fn Avx512PreparedMinima4();

// MatchCSQuick. Each kernel reads Fast once and runs a loop made for it.
const SKernelSet& PortableQuickKernels();
// Null unless both the build and the processor have AVX2.
const SKernelSet* Avx2QuickKernels();

}  // namespace vxmatch
