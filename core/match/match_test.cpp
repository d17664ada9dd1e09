#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <random>
#include <vector>

#include "MatchCSFuzzy.h"
#include "MatchCSQuick.h"
#include "MatchKernels.h"

namespace {

using Rec = SVXDBRec_3;

// ---- Plain references, written from the description of each comparison. ----

int Field(const Rec& r, int cell, int field) {
  return reinterpret_cast<const uint8_t*>(&r)[1 + 4 * cell + field];
}
int D(const Rec& o, int oc, const Rec& c, int cc, int field) {
  return std::abs(Field(o, oc, field) - Field(c, cc, field));
}
int Orientation(int r, int i, int k) {
  switch (r) {
    case 0:
      return i + 20 * k;
    case 1:
      return i + 20 * (19 - k);
    case 2:
      return (19 - i) + 20 * k;
    default:
      return (19 - i) + 20 * (19 - k);
  }
}

double RefDuplicates(const Rec& o, const Rec& c, const SVXMatchParams& p) {
  double sum = 0;
  for (int i = 0; i < 20; i += 4) {
    for (int k = 0; k < 20; k += 4) {
      int best = 1 << 30;
      for (int r = 0; r < (p.Rotate ? 4 : 1); ++r) {
        const int oc = Orientation(r, i, k), cc = i + 20 * k;
        best = std::min(best, D(o, oc, c, cc, 0) + D(o, oc, c, cc, 1) + D(o, oc, c, cc, 2));
      }
      if (best <= 153) sum += 765 - best;
    }
  }
  return sum * 5.22875816993464e-05 * 100;
}

double RefHistogram(const CHist& o, double weight, const CHist& c) {
  double t = 0;
  for (int i = 0; i < 256; ++i) t += std::min(o.Bins[i], c.Bins[i]);
  const double r = std::trunc(t) / weight * 100;
  return r > 100 ? 100 : r;
}

struct Ref {
  const SVXMatchParams& p;
  double a = p.LumaScale, b = p.ColorScale, dmax = (255 * a + 510) * b + 255;
  int s = p.Fast ? 2 : 1;
  int side = 20 / s;  // visited cells per row and column
  bool weighted = p.Weighting != 0;

  double Dist(const Rec& o, int oc, const Rec& c, int cc) const {
    return (D(o, oc, c, cc, 0) * a + D(o, oc, c, cc, 1) + D(o, oc, c, cc, 2)) * b +
           D(o, oc, c, cc, 3);
  }
  double Result(double n, double t) const { return std::max(n - t, 0.0) / n * 100; }

  double Quick(const Rec& o, const Rec& c) const {
    const double* W = p.Weights->W;
    double n = side * side * dmax;
    if (weighted) {
      n = 0;
      for (int i = 0; i < 20; i += s) {
        for (int k = 0; k < 20; k += s) n += dmax * W[i + 20 * k];
      }
    }
    double t[4] = {0, 0, 0, 0};
    for (int i = 0; i < 20; i += s) {
      for (int k = 0; k < 20; k += s) {
        const int j = i + 20 * k;
        if (weighted && !(W[j] > 1e-06)) continue;
        for (int r = 0; r < (p.Rotate ? 4 : 1); ++r) {
          t[r] += Dist(o, Orientation(r, i, k), c, j) * (weighted ? W[j] : 1.0);
        }
      }
      if (!p.Rotate && weighted && p.Fast && i > 10) {
        const double score = Result(n, t[0]);
        if (score >= p.MinScore) return score;
      }
    }
    if (p.Rotate) t[0] = std::min({t[0], t[1], t[2], t[3]});
    return Result(n, t[0]);
  }

  double Fuzzy(const Rec& o, const Rec& c) const {
    const double L = dmax * 0.06666666666666667, n = side * side * dmax;
    double t = 0;
    for (int i = 0; i < 20; i += s) {
      for (int k = 0; k < 20; k += s) {
        const double w = weighted ? p.Weights->W[i + 20 * k] : 1.0;
        if (!(w > 1e-06)) continue;
        t += p.Rotate ? FuzzyRotatedCell(o, c, i, k, w, L) : FuzzyCell(o, c, i, k, w, L);
      }
    }
    return Result(n, t);
  }

  double FuzzyCell(const Rec& o, const Rec& c, int i, int k, double w, double L) const {
    const int j = i + 20 * k;
    const double d1 = D(o, j, c, j, 0) * a, d2 = D(o, j, c, j, 1), d3 = D(o, j, c, j, 2);
    if (d1 * w <= L && d2 * w <= L && d3 * w <= L) return (d1 + d2 + d3) * w * b + D(o, j, c, j, 3);
    for (int x = std::max(i - 2, 0); x <= std::min(i + 2, 20); x += s) {
      for (int y = std::max(k - 2, 0); y <= std::min(k + 2, 20); y += s) {
        const int m = x + 20 * y;
        if (m > 399) continue;  // behind the record: never a match
        if (D(o, j, c, m, 0) * a * w <= L && D(o, j, c, m, 1) * w <= L &&
            D(o, j, c, m, 2) * w <= L) {
          return ((D(o, j, c, m, 0) * a + D(o, j, c, m, 1) + D(o, j, c, m, 2)) * w * b +
                  D(o, j, c, m, 3)) *
                 (std::abs(k - y) + std::abs(i - x) + 1);
        }
      }
    }
    return dmax;
  }

  double FuzzyRotatedCell(const Rec& o, const Rec& c, int i, int k, double w, double L) const {
    auto mins = [&](int cc, double(&m)[4]) {
      for (int f = 0; f < 4; ++f) {
        m[f] = 1e300;
        for (int r = 0; r < 4; ++r) {
          m[f] = std::min(m[f], D(o, Orientation(r, i, k), c, cc, f) * (f < 3 ? a : 1.0) * w);
        }
      }
      return m[0] <= L && m[1] <= L && m[2] <= L;
    };
    double m[4];
    if (mins(i + 20 * k, m)) return (m[0] + m[1] + m[2]) * b + m[3];
    for (int x = std::max(i - 2, 0); x <= std::min(i + 2, 20); ++x) {
      for (int y = std::max(k - 2, 0); y <= std::min(k + 2, 20); ++y) {
        if (x + 20 * y > 399) continue;
        if (mins(x + 20 * y, m)) {
          return (m[0] + m[1] + m[2]) * b + m[3] + (std::abs(k - y) + std::abs(i - x) + 1);
        }
      }
    }
    return dmax;
  }
};

// ---- Records and settings. ----

uint8_t* Bytes(Rec& r) { return reinterpret_cast<uint8_t*>(&r.Info); }
const uint8_t* Bytes(const Rec& r) { return reinterpret_cast<const uint8_t*>(&r.Info); }

Rec Uniform(std::mt19937& rng) {
  Rec r{};
  for (int i = 0; i < 1600; ++i) Bytes(r)[i] = rng() & 0xFF;
  return r;
}

// `o` with each byte moved by up to `amp`, and its cells shifted by dx rows and dy columns.
Rec Near(const Rec& o, std::mt19937& rng, int amp, int dx = 0, int dy = 0) {
  Rec r{};
  for (int i = 0; i < 20; ++i) {
    for (int k = 0; k < 20; ++k) {
      const int from = std::clamp(i + dx, 0, 19) + 20 * std::clamp(k + dy, 0, 19);
      for (int f = 0; f < 4; ++f) {
        const int v = Field(o, from, f) + int(rng() % (2 * amp + 1)) - amp;
        Bytes(r)[4 * (i + 20 * k) + f] = uint8_t(std::clamp(v, 0, 255));
      }
    }
  }
  return r;
}

Rec Turned(const Rec& o) {
  Rec r{};
  for (int j = 0; j < 400; ++j) std::memcpy(Bytes(r) + 4 * j, Bytes(o) + 4 * (399 - j), 4);
  return r;
}

// Weighting 0 to 3 with the matrices of the selection: 3 is a random mask with some zeros, 4 a
// mask of zeros only, which leaves MatchCSQuick without a norm.
SVXWeightMatrix Weights(uint32_t weighting, std::mt19937& rng) {
  SVXWeightMatrix w;
  if (weighting < 3) {
    w.Reset(weighting);
    return w;
  }
  uint8_t mask[400];
  for (uint8_t& m : mask) m = weighting == 4 || rng() % 4 == 0 ? 0 : rng() % 256;
  w.SetMask(mask);
  return w;
}

// Equal but for rounding, or both not a number.
void ExpectSame(double want, double got) {
  EXPECT_TRUE(std::isnan(want) ? std::isnan(got) : std::fabs(want - got) <= 1e-9)
      << want << " " << got;
}

// Every setting of Fast, Rotate and Weighting, with random scales and cut-offs.
template <typename F>
void ForEverySetting(F&& f) {
  std::mt19937 rng(7);
  for (uint32_t weighting = 0; weighting < 5; ++weighting) {
    for (int flags = 0; flags < 4; ++flags) {
      const SVXWeightMatrix w = Weights(weighting, rng);
      SVXMatchParams p;
      p.SetWeights(rng() % 101, rng() % 101);
      p.Fast = flags & 1;
      p.Rotate = flags & 2;
      p.Weighting = std::min(weighting, 3u);
      p.Weights = &w;
      p.MinScore = rng() % 101;
      SCOPED_TRACE(testing::Message() << "weighting " << weighting << " flags " << flags);
      f(p, rng);
    }
  }
}

// Originals, each with candidates from far apart to nearly equal, some shifted so that
// neighbours match; ten of them make two groups of four and a remainder for the walks that take
// four candidates at once. Records of bytes 255 and 0 drive the 16-bit lane sums of the vector
// walks to their largest values.
template <typename F>
void ForRecordGroups(std::mt19937& rng, F&& f) {
  Rec full{};
  std::memset(Bytes(full), 255, 1600);
  f(full, std::vector<Rec>{full, Rec{}, full, Rec{}});
  f(Rec{}, std::vector<Rec>{full});
  for (int round = 0; round < 3; ++round) {
    const Rec o = Uniform(rng);
    std::vector<Rec> candidates;
    for (int twice = 0; twice < 2; ++twice) {
      candidates.insert(candidates.end(), {Uniform(rng), Near(o, rng, 8), Near(o, rng, 40),
                                           Near(o, rng, 12, 1, -1), Near(o, rng, 25, -2, 2)});
    }
    f(o, candidates);
  }
}

// The kernel sets the processor runs; for MatchCSQuick with AVX-512BW also the portable set with
// the 64-byte plain walk in place.
std::vector<const vxmatch::SKernelSet*> QuickImplementations() {
  static const vxmatch::SKernelSet withAvx512 = [] {
    vxmatch::SKernelSet set = vxmatch::PortableQuickKernels();
    if (vxmatch::Avx512PlainQuick()) set.Plain = vxmatch::Avx512PlainQuick();
    return set;
  }();
  std::vector<const vxmatch::SKernelSet*> all = {&vxmatch::PortableQuickKernels()};
  if (vxmatch::Avx2QuickKernels()) all.push_back(vxmatch::Avx2QuickKernels());
  if (vxmatch::Avx512PlainQuick()) all.push_back(&withAvx512);
  return all;
}
std::vector<const vxmatch::SKernelSet*> FuzzyImplementations() {
  std::vector<const vxmatch::SKernelSet*> all = {&vxmatch::PortableFuzzyKernels()};
  if (vxmatch::Avx2FuzzyKernels()) all.push_back(vxmatch::Avx2FuzzyKernels());
  return all;
}

TEST(MatchKernels, AgreeWithReferenceForEverySetting) {
  ForEverySetting([](const SVXMatchParams& p, std::mt19937& rng) {
    const Ref ref{p};
    ForRecordGroups(rng, [&](const Rec& o, const std::vector<Rec>& candidates) {
      // Prepared records must give MatchCSQuick's result to the bit, in every implementation,
      // one by one and many at once.
      const bool prepared = !p.Rotate && !p.Weighted();
      const SVXQuickCells po = PrepareQuick(o, p.Fast);
      std::vector<SVXQuickCells> pc(candidates.size());
      std::vector<const SVXQuickCells*> pointers;
      for (size_t j = 0; j < candidates.size(); ++j) {
        pc[j] = PrepareQuick(candidates[j], p.Fast);
        pointers.push_back(&pc[j]);
      }
      std::vector<double> many(candidates.size(), -1);
      if (prepared) MatchCSQuickPreparedMany(po, pointers.data(), pc.size(), p, many.data());
      for (size_t j = 0; j < candidates.size(); ++j) {
        const Rec& c = candidates[j];
        SCOPED_TRACE(testing::Message() << "candidate " << j);
        const double quick = ref.Quick(o, c);
        ExpectSame(quick, MatchCSQuick(o, c, p));
        for (const auto* k : QuickImplementations()) {
          ExpectSame(quick, k->Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p));
        }
        if (prepared) {
          const double want = MatchCSQuick(o, c, p);
          EXPECT_EQ(want, many[j]);
          EXPECT_EQ(want, MatchCSQuickPrepared(po, pc[j], p));
          const vxmatch::SFieldSums both{po.Luma + pc[j].Luma, po.Color + pc[j].Color,
                                         po.Shape + pc[j].Shape};
          for (vxmatch::PreparedFn k :
               {vxmatch::PortablePreparedQuick(), vxmatch::Avx2PreparedQuick(),
                vxmatch::Avx512PreparedQuick()}) {
            if (k) {
              EXPECT_EQ(want, k(vxmatch::CellBytes(o), vxmatch::CellBytes(c), both, p));
            }
          }
        }
        const double fuzzy = ref.Fuzzy(o, c);
        ExpectSame(fuzzy, MatchCSFuzzy(o, c, p));
        for (const auto* k : FuzzyImplementations()) {
          ExpectSame(fuzzy, k->Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p));
        }
        ExpectSame(RefDuplicates(o, c, p), MatchDuplicates(o, c, p));
      }
    });
  });
}

TEST(MatchKernels, HistogramAgreesWithReference) {
  std::mt19937 rng(3);
  ForRecordGroups(rng, [&](const Rec& o, const std::vector<Rec>& candidates) {
    for (uint32_t weighting = 0; weighting < 3; ++weighting) {
      CHist ho;
      ho.Build(o.Info, weighting);
      double sum = 0;
      for (float bin : ho.Bins) sum += bin;
      EXPECT_EQ(100.0, MatchHistogram(ho, std::trunc(sum), ho));
      for (const Rec& c : candidates) {
        CHist hc;
        hc.Build(c.Info, weighting);
        for (double weight : {std::trunc(sum), 50.0}) {  // a small weight must clip to 100
          EXPECT_EQ(RefHistogram(ho, weight, hc), MatchHistogram(ho, weight, hc));
        }
      }
    }
  });
}

// The walks compare byte differences with counts made from the scales; at and around the exact
// boundary d * scale * w == limit the counts must agree with the test in doubles.
TEST(MatchKernels, FitCountAgreesWithTheDirectTest) {
  std::mt19937 rng(9);
  std::uniform_real_distribution<double> scale(0, 25), weight(1e-06, 300);
  for (int round = 0; round < 20000; ++round) {
    const double a = round % 7 == 0 ? 0.0 : scale(rng), w = round % 2 ? 1.0 : weight(rng);
    const int d0 = rng() % 256;
    const double limit = round % 3 ? d0 * a * w : std::ldexp(double(rng() % 100000), -4);
    int want = 0;
    while (want < 256 && want * a * w <= limit) ++want;
    ASSERT_EQ(want, vxmatch::FitCount(a, w, limit)) << a << " " << w << " " << limit;
  }
}

// One cell pair everywhere, worked by hand with a = 6, b = 1.25: Dmax = 2805,
// D = (10 * 6 + 20 + 30) * 1.25 + 40 = 177.5, colour distance 60.
TEST(MatchKernels, HandWorkedScores) {
  Rec o{}, c{};
  for (int j = 0; j < 400; ++j) {
    const uint8_t cell[4] = {10, 20, 30, 40};
    std::memcpy(Bytes(c) + 4 * j, cell, 4);
  }
  SVXMatchParams p;
  EXPECT_DOUBLE_EQ((2805 - 177.5) / 2805 * 100, MatchCSQuick(o, c, p));
  EXPECT_DOUBLE_EQ((2805 - 177.5) / 2805 * 100, MatchCSFuzzy(o, c, p));
  EXPECT_DOUBLE_EQ(705.0 / 765 * 100, MatchDuplicates(o, c, p));
  p.Rotate = true;  // the four fields meet their own minimum: a applies to C2 and C3 too
  EXPECT_DOUBLE_EQ((2805 - ((10 + 20 + 30) * 6 * 1.25 + 40)) / 2805 * 100, MatchCSFuzzy(o, c, p));
  // Weights scale the fit test but not the norm: under a mask of 255 no cell fits, and each
  // costing Dmax brings the score to 0.
  uint8_t mask[400];
  std::memset(mask, 255, sizeof mask);
  SVXWeightMatrix w;
  w.SetMask(mask);
  p.Rotate = false, p.Weighting = 3, p.Weights = &w;
  EXPECT_EQ(0.0, MatchCSFuzzy(o, c, p));
}

TEST(MatchKernels, IdenticalRecordsScore100AndTurnedOnesNeedRotate) {
  ForEverySetting([](const SVXMatchParams& p, std::mt19937& rng) {
    if (p.Weighting == 3) return;  // masks with zeros
    const Rec o = Uniform(rng), turned = Turned(o);
    for (auto* match : {&MatchCSQuick, &MatchCSFuzzy, &MatchDuplicates}) {
      EXPECT_DOUBLE_EQ(100.0, match(o, o, p));  // MatchDuplicates' factor is rounded
      if (p.Rotate) {
        EXPECT_DOUBLE_EQ(100.0, match(o, turned, p));
      } else {
        EXPECT_LT(match(o, turned, p), 100.0);
      }
    }
  });
}

// Rows 0 to 11 equal, rows 12 to 19 as far apart as can be. A Fast weighted walk visits 10
// columns of the even rows; after row 12 it scores 90, over the whole grid 60. Scores only fall
// as rows are added, so the walk stops at row 12 or not at all.
TEST(MatchKernels, WeightedFastQuickStopsOnceTheTopRowsPass) {
  Rec o{}, c{};
  for (int k = 0; k < 20; ++k) {
    for (int i = 12; i < 20; ++i) std::memset(Bytes(c) + 4 * (i + 20 * k), 255, 4);
  }
  SVXWeightMatrix w;  // all ones
  SVXMatchParams p;
  p.Weighting = 1;
  p.Weights = &w;
  const struct {
    bool fast;
    double minScore, want;
  } cases[] = {{true, 85, 90}, {true, 95, 60}, {false, 0, 60}};  // no early stop without Fast
  for (const auto* k : QuickImplementations()) {
    for (const auto& run : cases) {
      p.Fast = run.fast, p.MinScore = run.minScore;
      EXPECT_DOUBLE_EQ(run.want, k->Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p));
    }
  }
}

// Every cell of c is far off but for cell 20, row 0 of column 1. Straight, it is the neighbour
// (0, 1) of the cells with i <= 2 and k <= 3, and the neighbour (20, 0) of those with i >= 18 and
// k <= 2: 12 + 6 - 1 cells match at price 0 (o is black throughout) and cell 20 matches itself.
// The bytes behind c, which a neighbourhood reaching y = 20 would address, match o but are never
// read as cells.
TEST(MatchKernels, FuzzyNeighbourhoodWrapsAtRow20AndStopsAtTheRecordEnd) {
  std::vector<Rec> bank(2);  // c and the next record of a prefetch bank
  Rec& c = bank[0];
  const Rec o{};
  for (const auto* k : FuzzyImplementations()) {
    std::memset(Bytes(c), 255, 1600);
    std::memset(Bytes(c) + 4 * 20, 0, 4);
    SVXMatchParams p;
    auto run = [&] { return k->Pick(p)(vxmatch::CellBytes(o), vxmatch::CellBytes(c), p); };
    EXPECT_DOUBLE_EQ(18.0 / 400 * 100, run());

    std::memset(Bytes(c) + 4 * 20, 255, 4);
    EXPECT_EQ(0.0, run());
    p.Rotate = true;
    EXPECT_EQ(0.0, run());
  }
}

}  // namespace
