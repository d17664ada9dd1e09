#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <random>

#include "Shape.h"
#include "VexoraSettings.h"

namespace {

using SCell = SVXMatchInfo::SCell;

// Under the default weights a' = 0.7 and b' = 0.9 the largest cell difference D' is 874.65; the
// norms of the quick and the full comparison are 20 and 32 times that.
constexpr double kDMax = 874.65;
constexpr double kQuickNorm = kDMax * 20;
constexpr double kFullNorm = kDMax * 32;

int Cell(int i, int k) { return i + 20 * k; }

std::unique_ptr<SVXMatchInfo> Filled(SCell c) {
  auto info = std::make_unique<SVXMatchInfo>();
  for (SCell& cell : info->Cells) cell = c;
  return info;
}

std::unique_ptr<SVXMatchInfo> Random(std::mt19937& rng) {
  auto info = std::make_unique<SVXMatchInfo>();
  for (SCell& c : info->Cells) {
    c = {uint8_t(rng()), uint8_t(rng()), uint8_t(rng()), uint8_t(rng() % 101)};
  }
  return info;
}

CVexoraSettings Settings(uint32_t method, double max_difference = 1e9) {
  CVexoraSettings s;
  s.Data().Method = method;
  s.Data().MaxDifference = max_difference;
  return s;
}

CShape WithOriginal(const SVXMatchInfo& info) {
  CShape shape;
  shape.SetOriginal(info);
  return shape;
}

TEST(ShapeCompare, IdenticalRecordsGiveZeroAndMethodsDispatch) {
  std::mt19937 rng(7);
  for (int round = 0; round < 20; ++round) {
    auto p = Random(rng), q = Random(rng);
    const CShape shape = WithOriginal(*p);
    for (uint32_t method : {1u, 2u, 3u}) EXPECT_EQ(shape.Compare(*p, Settings(method)), 0);
    EXPECT_EQ(shape.Compare(*q, Settings(1)), shape.MatchDuplicates(*q, Settings(1)));
    EXPECT_EQ(shape.Compare(*q, Settings(2)), shape.MatchShapeColorQuick(*q, Settings(2)));
    EXPECT_EQ(shape.Compare(*q, Settings(3)), shape.MatchShapeColor(*q, Settings(3)));
    EXPECT_GT(shape.Compare(*q, Settings(2)), 0);
    for (uint32_t m : {0u, 4u, 6u, 7u}) EXPECT_EQ(shape.Compare(*q, Settings(m)), 0);
    for (uint32_t m : {1u, 2u, 3u, 8u}) EXPECT_EQ(shape.CompareColor(*q, Settings(m)), 100.0);
  }
}

TEST(ShapeCompare, DuplicatesSampleEveryFourthCellUnderTheMask) {
  auto p = Filled({0, 0, 0, 0});
  auto q = Filled({0, 0, 0, 0});
  q->Cells[Cell(1, 0)] = {255, 255, 255, 0};   // not sampled
  q->Cells[Cell(4, 8)] = {255, 255, 255, 99};  // sampled; Shape is not read
  const CShape shape = WithOriginal(*p);
  EXPECT_NEAR(shape.MatchDuplicates(*q, Settings(1, 1.0)), 1.0, 1e-12);
  EXPECT_EQ(shape.MatchDuplicates(*q, Settings(1, 0.999)), 10000.0);

  CVexoraSettings masked = Settings(1);
  masked.Data().Mask[Cell(4, 8)] = 50;
  EXPECT_NEAR(shape.MatchDuplicates(*q, masked), 1.0, 1e-12);  // mask not in force
  masked.Data().UseMask = 1;
  EXPECT_NEAR(shape.MatchDuplicates(*q, masked), 0.5, 1e-12);
}

TEST(ShapeCompare, QuickWeighsColourAndShape) {
  auto p = Filled({100, 100, 100, 0});
  auto q = Filled({100, 100, 100, 0});
  p->Cells[Cell(3, 17)] = {110, 120, 130, 50};
  q->Cells[Cell(3, 17)] = {100, 100, 100, 40};
  const CShape shape = WithOriginal(*p);
  // (10 * 0.7 + 20 + 30) * 0.9 + 10
  EXPECT_NEAR(shape.MatchShapeColorQuick(*q, Settings(2)), 61.3 / kQuickNorm, 1e-12);
  EXPECT_EQ(shape.MatchShapeColorQuick(*q, Settings(2, 61.2 / kQuickNorm)), 10000.0);

  // The mask scales the query's shape rather than the difference: 57 * 0.5 * 0.9 + |50 - 20|.
  CVexoraSettings masked = Settings(2);
  masked.Data().UseMask = 1, masked.Data().Mask[Cell(3, 17)] = 50;
  EXPECT_NEAR(shape.MatchShapeColorQuick(*q, masked), 55.65 / kQuickNorm, 1e-12);
  // ... and the shape term is truncated toward zero: |trunc(10 - 12.5)| = 2.
  q->Cells[Cell(3, 17)] = {110, 120, 130, 25};
  p->Cells[Cell(3, 17)].Shape = 10;
  EXPECT_NEAR(WithOriginal(*p).MatchShapeColorQuick(*q, masked), 2 / kQuickNorm, 1e-12);

  // So identical records differ under a mask when they have shape.
  auto r = Filled({100, 100, 100, 40});
  std::memset(masked.Data().Mask, 50, sizeof masked.Data().Mask);
  EXPECT_NEAR(WithOriginal(*r).MatchShapeColorQuick(*r, masked), 8000 / kQuickNorm, 1e-12);
}

// MatchShapeColor on two records of 100 in every colour field and 0 in Shape, each test changing a
// few cells: a cell of 100 fits every other such cell, a cell of 200 none of them.
class ShapeColorTest : public ::testing::Test {
 protected:
  double Run(const CVexoraSettings& s = Settings(3)) {
    return WithOriginal(*p).MatchShapeColor(*q, s) * kFullNorm;
  }
  std::unique_ptr<SVXMatchInfo> p = Filled({100, 100, 100, 0});
  std::unique_ptr<SVXMatchInfo> q = Filled({100, 100, 100, 0});
};

TEST_F(ShapeColorTest, NoFittingNeighbourCostsTheMostAndTheFirstFittingOneWins) {
  p->Cells[Cell(5, 5)].C1 = 200;
  EXPECT_NEAR(Run(), kDMax, 1e-9);
  EXPECT_EQ(WithOriginal(*p).MatchShapeColor(*q, Settings(3, 0.031)), 10000.0);
  EXPECT_NEAR(WithOriginal(*p).MatchShapeColor(*q, Settings(3, 0.032)), 1.0 / 32, 1e-12);

  // The first fitting neighbour wins, x in the outer loop.
  q->Cells[Cell(4, 7)] = {190, 100, 100, 5};  // reached first: x = 4 before x = 6
  q->Cells[Cell(6, 3)] = {200, 100, 100, 0};  // would cost nothing
  // The cells of p at (4, 7) and (6, 3) no longer fit their own and find a 100 nearby at no cost.
  // Distance 2 + 1 + 1 multiplies colour and shape alike: (7 * 0.9 + 5) * 4.
  EXPECT_NEAR(Run(), 45.2, 1e-9);
}

TEST_F(ShapeColorTest, MaskScalesTheFitAndThePrice) {
  q->Cells[0].C2 = 180;  // 80 off: p's cell 0 fits q's cell 1 instead, at no cost
  EXPECT_NEAR(Run(), 0, 1e-9);
  CVexoraSettings masked = Settings(3);
  masked.Data().UseMask = 1, masked.Data().Mask[0] = 50;  // 80 * 0.5 fits in place: 80 * 0.9 * 0.5
  EXPECT_NEAR(Run(masked), 36, 1e-9);
}

TEST_F(ShapeColorTest, NeighbourhoodWrapsAtColumnTwentyAndStopsAtTheEndOfTheRecord) {
  // From (19, 5) the search reaches x = 20, y = 3: index 80, the cell (0, 4).
  p->Cells[Cell(19, 5)].C1 = 200;
  q->Cells[Cell(0, 4)].C1 = 190;
  EXPECT_NEAR(Run(), 7 * 0.9 * 4, 1e-9);
  // From (19, 19) x = 20 reaches (0, 18) and (0, 19); y = 20 and x = 20, y = 19 lie behind the
  // record and are not read (q is a heap block of its own, so a sanitizer would notice).
  p->Cells[Cell(19, 5)].C1 = q->Cells[Cell(0, 4)].C1 = 100;
  p->Cells[Cell(19, 19)].C1 = 200;
  EXPECT_NEAR(Run(), kDMax, 1e-9);
  q->Cells[Cell(0, 19)].C1 = 190;  // x = 20, y = 18, distance 3
  EXPECT_NEAR(Run(), 7 * 0.9 * 3, 1e-9);
}

// CompareColor against hand-built colour grids. ColorInfo[k][i] is the cell i + 20 * k.
class CompareColorTest : public ::testing::Test {
 protected:
  static SCell AsCell(uint8_t r, uint8_t g, uint8_t b) {
    SCell c{};
    RGB2C3(r, g, b, c.C1, c.C2, c.C3);
    return c;
  }
  void SetColor(int cell, uint8_t r, uint8_t g, uint8_t b, uint8_t percent = 1) {
    grid[cell / 20][cell % 20] = {{r, g, b, 0, 0, 0, percent}};
  }
  double Run(uint32_t method, uint32_t tolerance = 50) {
    CShape shape;
    shape.SetColorInfo(grid);
    CVexoraSettings s = Settings(method);
    s.Data().ColorTolerance = tolerance;
    return shape.CompareColor(*q, s);
  }
  SColPercMatchInfo grid[20][20] = {};
  std::unique_ptr<SVXMatchInfo> q = Filled(AsCell(255, 255, 255));  // no grid colour fits
  const SCell red = AsCell(255, 0, 0);
  const SCell white = AsCell(255, 255, 255);
};

TEST_F(CompareColorTest, CellsAreFoundInPlaceOrOneStepUpOrLeft) {
  EXPECT_EQ(Run(6), 100.0);  // no colour cell
  SetColor(Cell(5, 5), 255, 0, 0);
  EXPECT_EQ(Run(6), 100.0);
  q->Cells[Cell(6, 6)] = red;  // below and right: not looked at
  SetColor(Cell(6, 6), 255, 0, 0, 0);
  EXPECT_EQ(Run(6), 100.0);
  // (4, 4) is looked at with its own colour, which need not be the cell's nor have a share.
  q->Cells[Cell(4, 4)] = white;
  SetColor(Cell(4, 4), 255, 255, 255, 0);
  EXPECT_EQ(Run(6), 99.75);
  q->Cells[Cell(5, 5)] = red;  // found once only
  EXPECT_EQ(Run(6), 99.75);

  for (int n = 0; n < 400; ++n) {
    SetColor(n, 255, 0, 0);
    q->Cells[n] = red;
  }
  EXPECT_EQ(Run(6), 0.0);
  EXPECT_EQ(Run(5), 100.0);
}

TEST_F(CompareColorTest, ToleranceEdges) {
  SetColor(0, 255, 255, 255);  // C1 255, C2 127, C3 127
  const SCell edges[] = {{155, 127, 127, 0}, {255, 177, 127, 0}, {255, 127, 77, 0}};
  for (SCell c : edges) {
    q->Cells[0] = c;
    EXPECT_EQ(Run(6), 99.75);
    EXPECT_EQ(Run(6, 49), 100.0);
  }
  q->Cells[0] = {154, 127, 127, 0};
  EXPECT_EQ(Run(6), 100.0);
  q->Cells[0] = white;
  EXPECT_EQ(Run(6, 0), 99.75);
}

TEST_F(CompareColorTest, PaletteIsTheFirstRowAndEachColourClaimsTwentyOneCells) {
  SetColor(1, 255, 0, 0);  // not in the palette
  for (SCell& c : q->Cells) c = red;
  EXPECT_EQ(Run(7), 100.0);

  SetColor(0, 255, 0, 0);
  for (int n = 0; n < 400; ++n) q->Cells[n] = n < 5 ? red : white;
  EXPECT_DOUBLE_EQ(Run(7), 75.0);
  q->Cells[5] = red;
  EXPECT_DOUBLE_EQ(Run(7), 70.0);
  for (int n = 0; n < 20; ++n) q->Cells[n] = red;
  EXPECT_EQ(Run(7), 100.0);  // fully claimed: the sum is 0

  SetColor(20, 255, 0, 0);
  SetColor(40, 255, 0, 0, 0);  // no share: not a colour of the palette
  for (int n = 0; n < 400; ++n) q->Cells[n] = n < 25 ? red : white;
  // The first colour claims 21 cells and adds 0; the second finds the other 4 and adds 16.
  EXPECT_DOUBLE_EQ(Run(7), 40.0);
}

}  // namespace
