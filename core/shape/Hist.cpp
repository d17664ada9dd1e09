#include "Hist.h"

#include <cstring>

#include "WeightMatrix.h"

CHist::CHist() : Total(0) { std::memset(Bins, 0, sizeof Bins); }

void CHist::Build(const SVXMatchInfo& cells, uint32_t weighting) {
  std::memset(Bins, 0, sizeof Bins);
  Total = 400;
  SVXWeightMatrix weights;
  weights.Reset(weighting);
  for (int i = 0; i < 400; ++i) {
    const SVXMatchInfo::SCell& c = cells.Cells[i];
    const int bin = (c.C1 >> 6) + 4 * ((c.C2 >> 5) + 8 * (c.C3 >> 5));
    Bins[bin] += weights.W[i];  // 1.0 for every cell under weighting 0
  }
  // An empty bin ends at 1.0 and a filled one is not rounded to an integer: the comparisons of
  // stored histograms rely on exactly these values.
  for (float& bin : Bins) {
    const float p = bin * 100 / Total;
    const float f = p - static_cast<float>(static_cast<int>(p));
    bin = f < 0.5 ? p + 1.0 : p;
  }
}
