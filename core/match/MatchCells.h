#pragma once

// Inside of the match kernels, shared by the portable and the AVX2 code and open to the tests;
// not installed.

#include <algorithm>
#include <cstdint>
#include <cstdlib>

#include "MatchKernels.h"

namespace vxmatch {

// The 1600 bytes of the cells of a record: C1, C2, C3, Shape per cell.
inline const uint8_t* CellBytes(const SVXDBRec_3& r) {
  return reinterpret_cast<const uint8_t*>(&r) + 1;
}

// Index of o's cell that meets c's cell (i, k) in orientation r: 0 as it is, 1 flipped in k,
// 2 flipped in i, 3 turned by 180 degrees.
inline int Oriented(int r, int i, int k) {
  const int x = (r & 2) ? 19 - i : i;
  const int y = (r & 1) ? 19 - k : k;
  return x + 20 * y;
}

inline int AbsDiff(uint8_t x, uint8_t y) { return std::abs(int{x} - int{y}); }

// max(N - T, 0) / N * 100; not a number when N is 0.
inline double Score(double norm, double total) { return std::max(norm - total, 0.0) / norm * 100; }

// N of the unweighted comparisons: Dmax for each visited cell.
inline double PlainNorm(const SVXMatchParams& p) {
  const int side = p.Fast ? 10 : 20;
  return side * side * p.MaxDistance();
}

// A comparison on the cell bytes of o and c.
using KernelFn = double (*)(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p);

// A comparison written out four times, so that the inner loops test neither the weights nor
// the orientations.
struct SKernelSet {
  KernelFn Plain;
  KernelFn Weighted;
  KernelFn Rotated;
  KernelFn WeightedRotated;

  KernelFn Pick(const SVXMatchParams& p) const {
    if (p.Rotate) return p.Weighted() ? WeightedRotated : Rotated;
    return p.Weighted() ? Weighted : Plain;
  }
};

// A kernel that runs kSlow, or kFast when Fast is set.
template <KernelFn kSlow, KernelFn kFast>
double ByStep(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  return p.Fast ? kFast(o, c, p) : kSlow(o, c, p);
}

// Whether the processor runs the AVX2 kernels.
bool CpuHasAvx2();

}  // namespace vxmatch
