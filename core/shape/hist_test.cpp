#include "Hist.h"

#include <gtest/gtest.h>

#include "WeightMatrix.h"

namespace {

// The first `count` cells set to (c1, c2, c3), the rest black, whose bin is 4 * (3 + 8 * 3).
SVXMatchInfo Record(int count, uint8_t c1, uint8_t c2, uint8_t c3) {
  SVXMatchInfo info;
  for (int i = 0; i < 400; ++i) {
    info.Cells[i] =
        i < count ? SVXMatchInfo::SCell{c1, c2, c3, 0} : SVXMatchInfo::SCell{0, 127, 127, 0};
  }
  return info;
}

TEST(HistTest, BinsAndTheirFinish) {
  // One cell is 0.25 percent: below a half, so it ends at 1.25.
  const int bins[][4] = {
      {63, 31, 31, 0}, {64, 0, 0, 1}, {0, 32, 0, 4}, {0, 0, 32, 32}, {255, 255, 255, 255}};
  CHist hist;
  for (const auto& c : bins) {
    hist.Build(Record(1, uint8_t(c[0]), uint8_t(c[1]), uint8_t(c[2])), 0);
    EXPECT_FLOAT_EQ(hist.Bins[c[3]], 1.25f) << c[3];
  }
  // n cells in bin 0 are 0.25 n percent: one is added only when the fraction is below a half,
  // and an empty bin ends at 1.0.
  const struct {
    int cells;
    float bin, black;
  } cases[] = {{2, 0.5f, 99.5f}, {3, 0.75f, 100.25f}, {4, 2.0f, 100.0f}, {5, 2.25f, 98.75f}};
  for (const auto& c : cases) {
    hist.Build(Record(c.cells, 0, 0, 0), 0);
    EXPECT_EQ(hist.Total, 400u);
    EXPECT_FLOAT_EQ(hist.Bins[0], c.bin) << c.cells;
    EXPECT_FLOAT_EQ(hist.Bins[108], c.black) << c.cells;
    EXPECT_FLOAT_EQ(hist.Bins[200], 1.0f);
  }
}

TEST(HistTest, WeightingScalesCellsByPosition) {
  SVXMatchInfo info = Record(0, 0, 0, 0);
  info.Cells[10 * 20 + 10] = {0, 0, 0, 0};  // a centre cell in bin 0
  CHist hist;
  hist.Build(info, 1);
  EXPECT_FLOAT_EQ(hist.Bins[0], 1.36f);  // 1.44 / 4 percent, plus one
  hist.Build(info, 2);
  EXPECT_FLOAT_EQ(hist.Bins[0], 0.5625f);  // 2.25 / 4 percent
  hist.Build(info, 3);                     // a mask never reaches the histogram
  EXPECT_FLOAT_EQ(hist.Bins[0], 1.25f);
}

TEST(WeightMatrixTest, KindsAndMask) {
  SVXWeightMatrix m;
  m.Reset(1);
  EXPECT_DOUBLE_EQ(m.W[7 * 20 + 12], 1.44);
  EXPECT_DOUBLE_EQ(m.W[12 * 20 + 0], 1.2);
  EXPECT_EQ(m.W[6 * 20 + 19], 1.0);
  m.Reset(2);
  EXPECT_EQ(m.W[0], 1.0);
  EXPECT_DOUBLE_EQ(m.W[5 * 20 + 3], 1.2 * 1.1);
  EXPECT_DOUBLE_EQ(m.W[16 * 20 + 12], 1.1 * 1.5);
  EXPECT_EQ(m.W[17 * 20 + 19], 1.0);
  m.Reset(7);
  for (double w : m.W) EXPECT_EQ(w, 1.0);
  uint8_t mask[400];
  for (int i = 0; i < 400; ++i) mask[i] = uint8_t(i % 201);
  m.SetMask(mask);
  EXPECT_EQ(m.Kind, 3u);
  EXPECT_EQ(m.W[399], 198.0);
}

}  // namespace
