#include "MatchCSFuzzy.h"

namespace vxmatch {
namespace {

// The first fitting cell of c around (i, k), x outer; Dmax when none fits.
template <bool kWeighted, bool kRotated>
double Neighbour(const CFuzzyRules<kWeighted, kRotated>& rules,
                 const COriginalCells<kRotated>& original, const uint8_t* c, int i, int k,
                 double w) {
  const int step = rules.Reach();
  for (int x = std::max(i - 2, 0); x <= std::min(i + 2, 20); x += step) {
    for (int y = std::max(k - 2, 0); y <= std::min(k + 2, 20); y += step) {
      const int n = x + 20 * y;
      if (n > 399) break;  // behind the record; n only grows with y
      const SDiffs d = original.Against(c + 4 * n);
      if (rules.Fits(d, w)) return rules.NeighbourPrice(d, w, std::abs(k - y) + std::abs(i - x));
    }
  }
  return rules.MaxDistance();
}

template <bool kWeighted, bool kRotated>
double Walk(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  const CFuzzyRules<kWeighted, kRotated> rules(p);
  double total = 0;
  rules.ForCounted([&](int i, int k, int j, double w) {
    const COriginalCells<kRotated> original(o, i, k);
    const SDiffs d = original.Against(c + 4 * j);
    total += rules.Fits(d, w) ? rules.Price(d, w) : Neighbour(rules, original, c, i, k, w);
  });
  return rules.Result(total);
}

}  // namespace

const SKernelSet& PortableFuzzyKernels() {
  static const SKernelSet kernels = {Walk<false, false>, Walk<true, false>, Walk<false, true>,
                                     Walk<true, true>};
  return kernels;
}

}  // namespace vxmatch

double MatchCSFuzzy(const SVXDBRec_3& o, const SVXDBRec_3& c, const SVXMatchParams& p) {
  static const vxmatch::SKernelSet& kernels =
      vxmatch::Avx2FuzzyKernels() ? *vxmatch::Avx2FuzzyKernels() : vxmatch::PortableFuzzyKernels();
  return kernels.Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p);
}
