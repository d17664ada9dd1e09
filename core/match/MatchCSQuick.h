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

// D of one cell pair.
inline double Distance(const uint8_t* x, const uint8_t* y, const SVXMatchParams& p) {
  const int luma = AbsDiff(x[0], y[0]);
  const int color = AbsDiff(x[1], y[1]) + AbsDiff(x[2], y[2]);
  return (luma * p.LumaScale + color) * p.ColorScale + AbsDiff(x[3], y[3]);
}

// MatchCSQuick. Each kernel reads Fast once and runs a loop made for it.
const SKernelSet& PortableQuickKernels();
// Null unless both the build and the processor have AVX2.
const SKernelSet* Avx2QuickKernels();

}  // namespace vxmatch
