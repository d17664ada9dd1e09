#include "MatchCSQuick.h"

namespace vxmatch {
namespace {

// Visited cells: rows i and columns k in steps of kStep from 0, in memory order. Where only
// the early stop needs the walk's own order, rows outer, the order changes no more than the
// rounding of the sums.
template <int kStep, typename F>
void ForVisited(F&& f) {
  for (int k = 0; k < 20; k += kStep) {
    for (int i = 0; i < 20; i += kStep) f(i, k);
  }
}

template <int kStep>
double Plain(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  SFieldSums sums;
  ForVisited<kStep>([&](int i, int k) {
    const int j = i + 20 * k;
    sums.Add(o + 4 * j, c + 4 * j);
  });
  return Score(PlainNorm(p), sums.Total(p));
}

template <int kStep>
double Rotated(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  SFieldSums sums[4];
  ForVisited<kStep>([&](int i, int k) {
    const uint8_t* cell = c + 4 * (i + 20 * k);
    for (int r = 0; r < 4; ++r) sums[r].Add(o + 4 * Oriented(r, i, k), cell);
  });
  double total = sums[0].Total(p);
  for (int r = 1; r < 4; ++r) total = std::min(total, sums[r].Total(p));
  return Score(PlainNorm(p), total);
}

// N of the weighted comparisons: Dmax times the weights of the visited cells, small ones too.
template <int kStep>
double WeightedNorm(const SVXMatchParams& p) {
  double sum = 0;
  ForVisited<kStep>([&](int i, int k) { sum += p.Weights->W[i + 20 * k]; });
  return sum * p.MaxDistance();
}

// The walk is written out by rows so that a Fast walk can accept the candidate once the rows
// up to one above 10 already score MinScore.
template <int kStep>
double Weighted(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  const double* w = p.Weights->W;
  const double norm = WeightedNorm<kStep>(p);
  double total = 0;
  for (int i = 0; i < 20; i += kStep) {
    for (int k = 0; k < 20; k += kStep) {
      const int j = i + 20 * k;
      if (w[j] > 1e-06) total += Distance(o + 4 * j, c + 4 * j, p) * w[j];
    }
    if (kStep == 2 && i > 10) {
      const double score = Score(norm, total);
      if (score >= p.MinScore) return score;
    }
  }
  return Score(norm, total);
}

template <int kStep>
double WeightedRotated(const uint8_t* o, const uint8_t* c, const SVXMatchParams& p) {
  const double* w = p.Weights->W;
  double totals[4] = {};
  ForVisited<kStep>([&](int i, int k) {
    const int j = i + 20 * k;
    if (!(w[j] > 1e-06)) return;
    for (int r = 0; r < 4; ++r) {
      totals[r] += Distance(o + 4 * Oriented(r, i, k), c + 4 * j, p) * w[j];
    }
  });
  const double total = std::min(std::min(totals[0], totals[1]), std::min(totals[2], totals[3]));
  return Score(WeightedNorm<kStep>(p), total);
}

template <int kStep>
double Prepared(const uint8_t* o, const uint8_t* c, const SFieldSums& both,
                const SVXMatchParams& p) {
  SFieldSums minima;
  ForVisited<kStep>([&](int i, int k) {
    const uint8_t* x = o + 4 * (i + 20 * k);
    const uint8_t* y = c + 4 * (i + 20 * k);
    minima.Luma += std::min(x[0], y[0]);
    minima.Color += std::min(x[1], y[1]) + std::min(x[2], y[2]);
    minima.Shape += std::min(x[3], y[3]);
  });
  return Score(PlainNorm(p), Differences(both, minima).Total(p));
}

double PortablePrepared(const uint8_t* o, const uint8_t* c, const SFieldSums& both,
                        const SVXMatchParams& p) {
  return p.Fast ? Prepared<2>(o, c, both, p) : Prepared<1>(o, c, both, p);
}

}  // namespace

SFieldSums VisitedSums(const uint8_t* cells, int step) {
  SFieldSums sums;
  for (int k = 0; k < 20; k += step) {
    for (int i = 0; i < 20; i += step) {
      const uint8_t* x = cells + 4 * (i + 20 * k);
      sums.Luma += x[0];
      sums.Color += x[1] + x[2];
      sums.Shape += x[3];
    }
  }
  return sums;
}

PreparedFn PortablePreparedQuick() { return PortablePrepared; }

const SKernelSet& PortableQuickKernels() {
  static const SKernelSet kernels = {ByStep<Plain<1>, Plain<2>>, ByStep<Weighted<1>, Weighted<2>>,
                                     ByStep<Rotated<1>, Rotated<2>>,
                                     ByStep<WeightedRotated<1>, WeightedRotated<2>>};
  return kernels;
}

}  // namespace vxmatch

double MatchCSQuick(const SVXDBRec_3& o, const SVXDBRec_3& c, const SVXMatchParams& p) {
  static const vxmatch::SKernelSet kernels = [] {
    vxmatch::SKernelSet best = vxmatch::Avx2QuickKernels() ? *vxmatch::Avx2QuickKernels()
                                                           : vxmatch::PortableQuickKernels();
    if (vxmatch::Avx512PlainQuick()) best.Plain = vxmatch::Avx512PlainQuick();
    return best;
  }();
  return kernels.Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p);
}

namespace {

// The visited sums of o and of c added.
vxmatch::SFieldSums BothSums(const SVXQuickCells& o, const SVXQuickCells& c) {
  vxmatch::SFieldSums both;
  both.Luma = o.Luma + c.Luma;
  both.Color = o.Color + c.Color;
  both.Shape = o.Shape + c.Shape;
  return both;
}

}  // namespace

void MatchCSQuickPreparedMany(const SVXQuickCells& o, const SVXQuickCells* const* c, size_t count,
                              const SVXMatchParams& p, double* scores) {
  static const vxmatch::Minima4Fn minima4 = vxmatch::Avx512PreparedMinima4();
  size_t j = 0;
  if (minima4) {
    const double norm = vxmatch::PlainNorm(p);
    for (; j + 4 <= count; j += 4) {
      const uint8_t* cells[4];
      for (int k = 0; k < 4; ++k) cells[k] = vxmatch::CellBytes(*c[j + k]->Record);
      vxmatch::SFieldSums minima[4];
      minima4(vxmatch::CellBytes(*o.Record), cells, p.Fast, minima);
      for (int k = 0; k < 4; ++k) {
        const vxmatch::SFieldSums both = BothSums(o, *c[j + k]);
        scores[j + k] = vxmatch::Score(norm, vxmatch::Differences(both, minima[k]).Total(p));
      }
    }
  }
  for (; j < count; ++j) scores[j] = MatchCSQuickPrepared(o, *c[j], p);
}

SVXQuickCells PrepareQuick(const SVXDBRec_3& r, bool fast) {
  const vxmatch::SFieldSums sums = vxmatch::VisitedSums(vxmatch::CellBytes(r), fast ? 2 : 1);
  return {&r, sums.Luma, sums.Color, sums.Shape};
}

double MatchCSQuickPrepared(const SVXQuickCells& o, const SVXQuickCells& c,
                            const SVXMatchParams& p) {
  static const vxmatch::PreparedFn kernel =
      vxmatch::Avx512PreparedQuick() ? vxmatch::Avx512PreparedQuick()
      : vxmatch::Avx2PreparedQuick() ? vxmatch::Avx2PreparedQuick()
                                     : vxmatch::PortablePreparedQuick();
  return kernel(vxmatch::CellBytes(*o.Record), vxmatch::CellBytes(*c.Record), BothSums(o, c), p);
}
