#pragma once

// The comparisons of two shape records that score a selection's candidates: each returns a
// similarity from 0 to 100, higher being closer. They read nothing but their arguments and
// allocate nothing, so one selection worker can call them per candidate and original.

#include <cstddef>
#include <cstdint>

#include "Hist.h"
#include "VXMatchInfo.h"
#include "WeightMatrix.h"

// What a comparison takes from the selection's match feature and worker.
struct SVXMatchParams {
  double LumaScale = 6.0;    // a: LumaWeight * 0.2, weight of C1 against C2 and C3
  double ColorScale = 1.25;  // b: ColorWeight * 0.05, weight of colour against Shape
  bool Fast = false;         // every second row and column; MatchCSQuick may stop early
  bool Rotate = false;       // also try o flipped in rows, in columns and turned by 180 degrees
  uint32_t Weighting = 0;    // 0: cells weigh alike; else by Weights
  const SVXWeightMatrix* Weights = nullptr;  // not owned; read when Weighting is not 0
  double MinScore = 0;  // running cut-off; ends the weighted Fast MatchCSQuick early

  // Sets LumaScale and ColorScale from the percent weights of the match feature.
  void SetWeights(uint32_t lumaWeight, uint32_t colorWeight) {
    LumaScale = lumaWeight * 0.2;
    ColorScale = colorWeight * 0.05;
  }
  bool Weighted() const { return Weighting != 0 && Weights != nullptr; }
  // Largest distance of two cells: Dmax.
  double MaxDistance() const { return (255 * LumaScale + 510) * ColorScale + 255; }
};

// The scales are taken as non-negative, as SetWeights makes them: the kernels rely on the
// products growing with the byte differences.

// Colour only, on a 5 by 5 sample of cells, with a fixed limit per cell. Reads Rotate.
double MatchDuplicates(const SVXDBRec_3& o, const SVXDBRec_3& c, const SVXMatchParams& p);

// Shared mass of the original's histogram `o` (whose bins sum to `weight`, truncated) and the
// candidate's `c`, in percent of `weight`; never above 100.
double MatchHistogram(const CHist& o, double weight, const CHist& c);

// Colour and shape distance of every visited cell pair against the largest possible.
double MatchCSQuick(const SVXDBRec_3& o, const SVXDBRec_3& c, const SVXMatchParams& p);

// One record made ready for MatchCSQuickPrepared: its cells and the sums of their fields over
// the cells that an unweighted, unrotated MatchCSQuick visits. Points into the record, which must
// outlive it.
struct SVXQuickCells {
  const SVXDBRec_3* Record = nullptr;
  uint32_t Luma = 0;   // sum of C1
  uint32_t Color = 0;  // sum of C2 and C3
  uint32_t Shape = 0;  // sum of Shape
};

// `r` made ready; `fast` must be the Fast of the comparisons it will take part in.
SVXQuickCells PrepareQuick(const SVXDBRec_3& r, bool fast);

// MatchCSQuick without Rotate and weights, to the bit, for records prepared once and compared
// many times: since |x - y| = x + y - 2 min(x, y), the comparison itself sums only the minima.
double MatchCSQuickPrepared(const SVXQuickCells& o, const SVXQuickCells& c,
                            const SVXMatchParams& p);
// MatchCSQuickPrepared of o against each of `count` candidates, into scores[j], to the bit. One
// original against many at once reads the original once for several candidates.
void MatchCSQuickPreparedMany(const SVXQuickCells& o, const SVXQuickCells* const* c, size_t count,
                              const SVXMatchParams& p, double* scores);

// As MatchCSQuick, but a cell whose colour is too far off may match a neighbour of the
// candidate's cell at a price. The norm is never weighted, so weights above 1 can bring the score
// to 0. Neighbours outside the record never match (see MatchCSFuzzy.h).
double MatchCSFuzzy(const SVXDBRec_3& o, const SVXDBRec_3& c, const SVXMatchParams& p);
