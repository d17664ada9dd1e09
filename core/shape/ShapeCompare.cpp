// The comparisons of CShape: a stored record against a query record under CVexoraSettings. They
// return differences, lower being closer, and are not on the selection's hot path, so they are
// written plainly, one cell at a time.

#include "Shape.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>

#include "VexoraSettings.h"

namespace {

using SData = CVexoraSettings::SData;
using SCell = SVXMatchInfo::SCell;

// Returned by the shape comparisons once the running difference passes MaxDifference.
constexpr double kExceeded = 10000.0;
// Returned by CompareColor when nothing was found, or for a method it does not know.
constexpr double kNoColor = 100.0;

int Cell(int i, int k) { return i + 20 * k; }

// Absolute differences of the fields of two cells, as integers.
struct SDiff {
  int C1, C2, C3, Shape;
};

SDiff Diff(const SCell& p, const SCell& q) {
  return {std::abs(p.C1 - q.C1), std::abs(p.C2 - q.C2), std::abs(p.C3 - q.C3),
          std::abs(p.Shape - q.Shape)};
}

// Weight of a cell: its mask entry in percent when the mask is in force.
double MaskWeight(const SData& s, int cell) { return s.UseMask ? s.Mask[cell] * 0.01 : 1.0; }

// The weights a' of C1 and b' of the colour against the shape, and D', the largest difference of
// one cell under them.
struct SShapeWeights {
  explicit SShapeWeights(const SData& s)
      : A(s.LumaWeight * 0.02), B(s.ColorWeight * 0.02), DMax((A * 255 + 510) * B + 255) {}
  double A, B, DMax;
};

// MatchShapeColor's test of a pair of cells: each colour axis, C1 weighted, within 50.
bool ShapeColorFits(const SDiff& d, double a, double m) {
  return d.C1 * a * m <= 50.0 && d.C2 * m <= 50.0 && d.C3 * m <= 50.0;
}

// MatchShapeColor's price of Original's cell (i, k) when it does not fit the query's cell of the
// same index: the first fitting query cell x + 20 * y, x from i - 2 to i + 2 outer and y from
// k - 2 to k + 2, costs its difference times the distance plus one; D' when none fits. The
// ranges reach 20: x = 20 wraps to the top of the next column, which is still in the record and
// is looked at; indices above 399 lie behind the record and are passed over.
double NeighbourPrice(const SVXMatchInfo& p, const SVXMatchInfo& q, int i, int k,
                      const SShapeWeights& w, double m) {
  const SCell& pc = p.Cells[Cell(i, k)];
  for (int x = std::max(i - 2, 0); x <= std::min(i + 2, 20); ++x) {
    for (int y = std::max(k - 2, 0); y <= std::min(k + 2, 20); ++y) {
      const int n = Cell(x, y);
      if (n > 399) break;  // grows with y
      const SDiff d = Diff(pc, q.Cells[n]);
      if (!ShapeColorFits(d, w.A, m)) continue;
      return ((d.C3 + d.C2 + d.C1 * w.A) * w.B + d.Shape) * m *
             (std::abs(k - y) + std::abs(i - x) + 1);
    }
  }
  return w.DMax;
}

// CompareColor's test of a colour against a record cell under the tolerance t.
bool ColorFits(const ShapeColorInfo& c, const SCell& q, double t) {
  return std::abs(c.C1 - q.C1) * 0.5 <= t && std::abs(c.C2 - q.C2) <= t &&
         std::abs(c.C3 - q.C3) <= t;
}

// ColorInfo is in the cell order: ColorInfo[k][i] is the cell i + 20 * k.
using SColorGrid = ShapeColorInfo[20][20];

// Method 6: a colour cell is found when, at its own position or one step up or left (or both),
// the colour of the grid at that position fits the query there.
double MatchColorCells(const SColorGrid& colors, const SVXMatchInfo& q, double t) {
  int found = 0;
  for (int i = 0; i < 20; ++i) {
    for (int k = 0; k < 20; ++k) {
      if (colors[k][i].Percent == 0) continue;
      bool fits = false;
      for (int x = std::max(i - 1, 0); x <= i && !fits; ++x) {
        for (int y = std::max(k - 1, 0); y <= k && !fits; ++y) {
          fits = ColorFits(colors[y][x], q.Cells[Cell(x, y)], t);
        }
      }
      found += fits;
    }
  }
  return found == 0 ? kNoColor : (400 - found) * 0.25;
}

// Method 7: each colour of the palette claims up to 21 fitting query cells that no earlier
// colour claimed; what it could not claim of 20 adds to the difference.
double MatchColorPalette(const SColorGrid& colors, const SVXMatchInfo& q, double t) {
  bool marked[400] = {};
  int sum = 0;
  int count = 0;
  for (const auto& column : colors) {
    const ShapeColorInfo& c = column[0];  // cells 0, 20, ..., 380
    if (c.Percent == 0) continue;
    int r = 20;
    for (int n = 0; n < 400 && r >= 0; ++n) {
      if (marked[n] || !ColorFits(c, q.Cells[n], t)) continue;
      marked[n] = true;
      --r;
    }
    sum += std::max(r, 0);
    ++count;
  }
  return sum != 0 ? sum / (count * 20 * 0.01) : kNoColor;
}

}  // namespace

double CShape::Compare(const SVXMatchInfo& query, const CVexoraSettings& settings) const {
  switch (settings.Data().Method) {
    case 1:
      return MatchDuplicates(query, settings);
    case 2:
      return MatchShapeColorQuick(query, settings);
    case 3:
      return MatchShapeColor(query, settings);
    default:
      return 0;
  }
}

double CShape::MatchDuplicates(const SVXMatchInfo& query, const CVexoraSettings& settings) const {
  const SData& s = settings.Data();
  double sum = 0;
  for (int i = 0; i < 20; i += 4) {
    for (int k = 0; k < 20; k += 4) {
      const int n = Cell(i, k);
      const SDiff d = Diff(Original.Cells[n], query.Cells[n]);
      sum += (d.C1 + d.C2 + d.C3) * MaskWeight(s, n);
      if (sum * 0.00130718954248366 > s.MaxDifference) return kExceeded;
    }
  }
  return sum / 765;
}

double CShape::MatchShapeColorQuick(const SVXMatchInfo& query,
                                    const CVexoraSettings& settings) const {
  const SData& s = settings.Data();
  const SShapeWeights w(s);
  const double norm = w.DMax * 400 * 0.05;
  double sum = 0;
  for (int i = 0; i < 20; ++i) {
    for (int k = 0; k < 20; ++k) {
      const int n = Cell(i, k);
      const double m = MaskWeight(s, n);
      const SCell& p = Original.Cells[n];
      const SDiff d = Diff(p, query.Cells[n]);
      // The mask weighs the query's shape, not the difference of the two.
      sum += (d.C1 * w.A + d.C2 + d.C3) * m * w.B +
             std::abs(std::trunc(p.Shape - query.Cells[n].Shape * m));
    }
    if (sum / norm > s.MaxDifference) return kExceeded;
  }
  return sum > 0 ? sum / norm : 0;
}

double CShape::MatchShapeColor(const SVXMatchInfo& query, const CVexoraSettings& settings) const {
  const SData& s = settings.Data();
  const SShapeWeights w(s);
  const double norm = w.DMax * 800 * 0.04;
  double sum = 0;
  for (int i = 0; i < 20; ++i) {
    for (int k = 0; k < 20; ++k) {
      const int n = Cell(i, k);
      const double m = MaskWeight(s, n);
      const SDiff d = Diff(Original.Cells[n], query.Cells[n]);
      if (ShapeColorFits(d, w.A, m)) {
        sum += (d.Shape + (d.C1 * w.A + d.C2 + d.C3) * w.B) * m;
      } else {
        sum += NeighbourPrice(Original, query, i, k, w, m);
      }
    }
    if (sum / norm > s.MaxDifference) return kExceeded;
  }
  return sum > 0 ? sum / norm : 0;
}

double CShape::CompareColor(const SVXMatchInfo& query, const CVexoraSettings& settings) const {
  const SData& s = settings.Data();
  const double t = s.ColorTolerance;
  switch (s.Method) {
    case 6:
      return MatchColorCells(ColorInfo, query, t);
    case 7:
      return MatchColorPalette(ColorInfo, query, t);
    default:
      return kNoColor;
  }
}
