#pragma once

// The rules of MatchCSFuzzy, shared by its portable and AVX2 walks.
//
// The neighbourhood of a cell (i, k) runs to x = i + 2 and y = k + 2 up to 20. At x = 20 the
// index x + 20 * y is row 0 of the next column, a cell of the record, and is used as such. An
// index above 399 (y = 20, or x = 20 with y = 19) would lie behind the record: such a neighbour
// never matches, so nothing outside the 400 cells is read.

#include "MatchCells.h"

namespace vxmatch {

// Byte differences of the four fields.
struct SDiffs {
  int C1, C2, C3, Shape;
};

inline SDiffs Diffs(const uint8_t* x, const uint8_t* y) {
  return {AbsDiff(x[0], y[0]), AbsDiff(x[1], y[1]), AbsDiff(x[2], y[2]), AbsDiff(x[3], y[3])};
}

// The cells of o that meet one cell (i, k) of c: o's own cell, or with kRotated its four
// orientations.
template <bool kRotated>
class COriginalCells {
 public:
  COriginalCells(const uint8_t* o, int i, int k) {
    for (int r = 0; r < kCount; ++r) cells_[r] = o + 4 * Oriented(r, i, k);
  }
  // Over several orientations each field takes its own smallest difference.
  SDiffs Against(const uint8_t* y) const {
    SDiffs d = Diffs(cells_[0], y);
    for (int r = 1; r < kCount; ++r) {
      const SDiffs e = Diffs(cells_[r], y);
      d = {std::min(d.C1, e.C1), std::min(d.C2, e.C2), std::min(d.C3, e.C3),
           std::min(d.Shape, e.Shape)};
    }
    return d;
  }

 private:
  static constexpr int kCount = kRotated ? 4 : 1;
  const uint8_t* cells_[kCount];
};

// Smallest difference d in 0 to 255 with d * scale * w above limit, 256 if none: the
// differences below it fit. The products grow with d since neither factor is negative, so the
// quotient's guess needs at most a step or two of correction.
inline int FitCount(double scale, double w, double limit) {
  auto fits = [&](int d) { return d * scale * w <= limit; };
  const double guess = limit / (scale * w);
  int d = !(guess >= 0) ? 0 : guess > 256 ? 256 : static_cast<int>(guess);
  while (d < 256 && fits(d)) ++d;
  while (d > 0 && !fits(d - 1)) --d;
  return d;
}

// Straight, a colour field fits within L = Dmax / 15 as |dC1| * a * w, |dC2| * w and |dC3| * w,
// and a neighbour's price is multiplied by its distance. Rotated, a scales all three colour
// fields, Shape is weighted too, and the distance is added.
template <bool kWeighted, bool kRotated>
class CFuzzyRules {
 public:
  explicit CFuzzyRules(const SVXMatchParams& p)
      : a_(p.LumaScale),
        b_(p.ColorScale),
        color_scale_(kRotated ? p.LumaScale : 1.0),
        dmax_(p.MaxDistance()),
        limit_(dmax_ * 0.06666666666666667),
        step_(p.Fast ? 2 : 1),
        luma_fit_(FitCount(a_, 1.0, limit_)),
        color_fit_(FitCount(color_scale_, 1.0, limit_)),
        weights_(kWeighted ? p.Weights->W : nullptr) {}

  int Step() const { return step_; }
  // Step of the neighbourhood: rotated it visits every cell whatever Fast is.
  int Reach() const { return kRotated ? 1 : step_; }
  double Weight(int cell) const { return kWeighted ? weights_[cell] : 1.0; }
  double MaxDistance() const { return dmax_; }

  // Calls f(i, k, j, w) for each visited cell whose weight w counts (is above 1e-06), rows
  // outer; j = i + 20 * k.
  template <typename F>
  void ForCounted(F&& f) const {
    for (int i = 0; i < 20; i += step_) {
      for (int k = 0; k < 20; k += step_) {
        const int j = i + 20 * k;
        const double w = Weight(j);
        if (w > 1e-06) f(i, k, j, w);
      }
    }
  }
  double Result(double total) const {
    const int side = 20 / step_;
    return Score(side * side * dmax_, total);
  }

  // Without weights the test is on the byte differences, against counts made once.
  bool Fits(const SDiffs& d, double w) const {
    if (!kWeighted) return d.C1 < luma_fit_ && d.C2 < color_fit_ && d.C3 < color_fit_;
    return d.C1 * a_ * w <= limit_ && d.C2 * color_scale_ * w <= limit_ &&
           d.C3 * color_scale_ * w <= limit_;
  }
  // The counts that Fits compares with at weight w: C1's, then those of C2 and C3.
  int LumaFit(double w) const { return kWeighted ? FitCount(a_, w, limit_) : luma_fit_; }
  int ColorFit(double w) const {
    return kWeighted ? FitCount(color_scale_, w, limit_) : color_fit_;
  }

  double Price(const SDiffs& d, double w) const {
    const double color = (d.C1 * a_ + (d.C2 + d.C3) * color_scale_) * w * b_;
    return color + (kRotated ? d.Shape * w : d.Shape);
  }
  // The price of a fitting neighbour `steps` grid steps away.
  double NeighbourPrice(const SDiffs& d, double w, int steps) const {
    return kRotated ? Price(d, w) + (steps + 1) : Price(d, w) * (steps + 1);
  }

 private:
  const double a_, b_, color_scale_, dmax_, limit_;
  const int step_, luma_fit_, color_fit_;
  const double* weights_;
};

// MatchCSFuzzy. The portable walk searches a neighbourhood only for a cell that does not fit;
// the AVX2 walk tests all neighbours of all cells at once first.
const SKernelSet& PortableFuzzyKernels();
// Null unless both the build and the processor have AVX2.
const SKernelSet* Avx2FuzzyKernels();

}  // namespace vxmatch
