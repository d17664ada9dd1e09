#include "Shape.h"

#include <gtest/gtest.h>

#include <array>
#include <cstring>
#include <random>
#include <tuple>
#include <vector>

#include "VexoraSettings.h"

namespace {

// The calculation read straight from its description, one pixel at a time, kept simple so that
// the optimised one can be checked against it.
SVXMatchInfo ReferenceShape(const CVXBitmap& bitmap, unsigned char threshold) {
  const uint64_t w = bitmap.GetWidth(), h = bitmap.GetHeight(), n = w * h;
  const uint64_t cw = (w + 19) / 20, ch = (h + 19) / 20;
  std::vector<uint64_t> r(400), g(400), b(400), count(400), bright(400), cum(256);
  std::vector<uint8_t> scratch(n);
  const SVXColor* p = bitmap.GetColorMatrix();
  for (uint64_t y = 0; y < h; ++y) {
    for (uint64_t x = 0; x < w; ++x) {
      const SVXColor c = p[y * w + x];
      const size_t cell = x / cw * 20 + y / ch;
      const auto l = static_cast<uint8_t>((30000 * c.R + 59000 * c.G + 11000 * c.B) / 100000);
      ++cum[l];
      r[cell] += c.R, g[cell] += c.G, b[cell] += c.B, ++count[cell];
      scratch[y * w + x] = l;
    }
  }
  for (int l = 1; l < 256; ++l) cum[l] += cum[l - 1];
  for (uint64_t y = 0; y < h; ++y) {
    for (uint64_t x = 0; x < w; ++x) {
      const double e = 255.0 / n * cum[scratch[y * w + x]];
      if (e > threshold) ++bright[x / cw * 20 + y / ch];
    }
  }
  SVXMatchInfo info;
  for (int i = 0; i < 400; ++i) {
    const double k = count[i] ? double(count[i]) : 1.0;
    const int mr = int(r[i] / k), mg = int(g[i] / k), mb = int(b[i] / k);
    info.Cells[i] = {uint8_t((mr + mg + mb) / 3), uint8_t((mr - mb + 255) / 2),
                     uint8_t((mr + 2 * (255 - mg) + mb) / 4),
                     uint8_t(double(bright[i]) / (cw * ch * 0.01))};
  }
  return info;
}

CVXBitmap Uniform(uint32_t w, uint32_t h, uint8_t r, uint8_t g, uint8_t b) {
  CVXBitmap bitmap(w, h);
  for (uint64_t i = 0; i < uint64_t{w} * h; ++i) bitmap.GetColorMatrix()[i] = {{r, g, b, 0}};
  return bitmap;
}

// Pixels drawn from `colours` distinct values, so that luminance ties are common.
CVXBitmap Random(uint32_t w, uint32_t h, std::mt19937& rng, uint32_t colours) {
  std::vector<uint32_t> palette(colours);
  for (auto& c : palette) c = rng();
  CVXBitmap bitmap(w, h);
  for (uint64_t i = 0; i < uint64_t{w} * h; ++i) {
    bitmap.GetColorMatrix()[i].Value = colours ? palette[rng() % colours] : uint32_t(rng());
  }
  return bitmap;
}

// C1, C2, C3 and Shape of grid cell (x, y).
std::array<int, 4> Cell(const SVXMatchInfo& info, int x, int y) {
  const SVXMatchInfo::SCell c = info.Cells[x * 20 + y];
  return {c.C1, c.C2, c.C3, c.Shape};
}

TEST(ShapeTest, MatchesReferenceOnManySizes) {
  const uint32_t sizes[][2] = {{1, 1},      {19, 1},   {1, 5000}, {20, 20}, {21, 37},
                               {6000, 1},   {1, 19},   {39, 41},  {40, 40}, {7, 300},
                               {1237, 911}, {20, 140}, {401, 3},  {2, 2},   {90001, 2}};
  std::mt19937 rng(42);
  CShape shape;
  for (const auto& s : sizes) {
    for (uint32_t colours : {0u, 3u, 40u}) {
      const CVXBitmap bitmap = Random(s[0], s[1], rng, colours);
      for (unsigned threshold : {0u, 127u, 200u, 255u}) {
        SVXMatchInfo info;
        ASSERT_TRUE(shape.CalcShapeInfo(bitmap, info, static_cast<unsigned char>(threshold)));
        const SVXMatchInfo want = ReferenceShape(bitmap, static_cast<unsigned char>(threshold));
        ASSERT_EQ(std::memcmp(&info, &want, sizeof info), 0)
            << s[0] << "x" << s[1] << " colours " << colours << " threshold " << threshold;
      }
    }
  }
}

TEST(ShapeTest, EmptyAndUniformImagesAndCellsAtTheEdge) {
  using C = std::array<int, 4>;
  CShape shape;
  SVXMatchInfo info;
  std::memset(&info, 0xAB, sizeof info);
  EXPECT_FALSE(shape.CalcShapeInfo(CVXBitmap(), info, 127));
  const SVXMatchInfo zero{};
  EXPECT_EQ(std::memcmp(&info, &zero, sizeof info), 0);
  EXPECT_FALSE(shape.CalcShapeInfo(CVXBitmap(0, 500), info, 127));
  // Every full cell is wholly bright. Shape is bright / (area * 0.01) in double, truncated: for
  // cells of 1 x 7 (20 x 140) that is 7 / 0.07, just below 100, so 99.
  const std::tuple<uint32_t, uint32_t, int> uniform[] = {
      {200, 100, 100}, {20, 140, 99}, {60, 140, 100}, {20, 340, 99}};
  for (const auto& [w, h, percent] : uniform) {
    ASSERT_TRUE(shape.CalcShapeInfo(Uniform(w, h, 90, 90, 90), info, 127));
    for (int i = 0; i < 400; ++i) {
      ASSERT_EQ(Cell(info, i / 20, i % 20), (C{90, 127, 127, percent})) << w << "x" << h;
    }
  }
  ASSERT_TRUE(shape.CalcShapeInfo(Uniform(40, 40, 255, 255, 255), info, 127));
  EXPECT_EQ(Cell(info, 19, 19), (C{255, 127, 127, 100}));
  // 5 pixels wide: cells of width 1; columns 5 to 19 hold no pixels and carry black.
  ASSERT_TRUE(shape.CalcShapeInfo(Uniform(5, 40, 200, 10, 30), info, 127));
  EXPECT_EQ(Cell(info, 4, 19), (C{80, 212, 180, 100}));
  for (int i = 100; i < 400; ++i) ASSERT_EQ(Cell(info, i / 20, i % 20), (C{0, 127, 127, 0}));
  // 21 x 21: cells of 2 x 2, column and row 10 one pixel thick, scored against the full area.
  ASSERT_TRUE(shape.CalcShapeInfo(Uniform(21, 21, 50, 50, 50), info, 127));
  EXPECT_EQ(Cell(info, 9, 9)[3], 100);
  EXPECT_EQ(Cell(info, 10, 9)[3], 50);
  EXPECT_EQ(Cell(info, 9, 10)[3], 50);
  EXPECT_EQ(Cell(info, 10, 10)[3], 25);
  EXPECT_EQ(Cell(info, 11, 0)[3], 0);
}

TEST(ShapeTest, ScratchGrowsOnlyForLargerImagesAndStaysWithItsOwner) {
  CShape shape;
  SVXMatchInfo info;
  ASSERT_TRUE(shape.CalcShapeInfo(Uniform(30, 20, 1, 2, 3), info, 127));
  ASSERT_TRUE(shape.CalcShapeInfo(Uniform(10, 10, 1, 2, 3), info, 127));
  EXPECT_EQ(shape.GetScratchSize(), 600u);
  ASSERT_TRUE(shape.CalcShapeInfo(Uniform(40, 20, 1, 2, 3), info, 127));
  EXPECT_EQ(shape.GetScratchSize(), 800u);

  SVXMatchInfo original{};
  original.Cells[7].Shape = 9;
  shape.SetOriginal(original);
  CShape copy(shape);  // the records, not the buffer
  EXPECT_EQ(copy.GetOriginal().Cells[7].Shape, 9);
  EXPECT_EQ(copy.GetScratchSize(), 0u);
  ASSERT_TRUE(copy.CalcShapeInfo(Uniform(5, 5, 1, 2, 3), info, 127));
  CShape moved(std::move(shape));
  EXPECT_EQ(moved.GetScratchSize(), 800u);
  copy = std::move(moved);
  EXPECT_EQ(copy.GetScratchSize(), 800u);
}

TEST(ShapeTest, SetColorInfoConvertsEveryCell) {
  SColPercMatchInfo query[20][20] = {};
  query[3][4] = {255, 0, 0, 9, 9, 9, 60};
  query[19][19] = {255, 255, 255, 0, 0, 0, 1};
  CShape shape;
  shape.SetColorInfo(query);
  const ShapeColorInfo red = shape.GetColorInfo()[3][4];
  EXPECT_TRUE(red.R == 255 && red.C1 == 85 && red.C2 == 255 && red.C3 == 191 && red.Percent == 60);
  EXPECT_EQ(shape.GetColorInfo()[19][19].C1, 255);
  EXPECT_EQ(shape.GetColorInfo()[0][0].C2, 127);  // black
  shape.SetColorInfo(nullptr);
  EXPECT_EQ(shape.GetColorInfo()[3][4].C1, 85);
}

TEST(VexoraSettingsTest, DefaultsAndEquality) {
  CVexoraSettings settings;
  const CVexoraSettings::SData& d = settings.Data();
  EXPECT_TRUE(d.Method == 2 && d.MaxDifference == 3.0 && d.Limit == 1000.0 && d.Option == 1 &&
              d.Percent == 100 && d.Name == "Default" && d.ColorTolerance == 50 &&
              d.LumaWeight == 35 && d.ColorWeight == 45 && d.UseMask == 0);
  EXPECT_TRUE(d.Colors[7][3].Percent == 1 && d.Colors[7][3].R == 0 && d.Mask[399] == 100);

  CVexoraSettings other(d);
  EXPECT_TRUE(other == settings);
  other.Data().Name = "Default ";
  EXPECT_FALSE(other == settings);
  other = settings;
  other.Data().Mask[200] = 99;
  EXPECT_FALSE(other == settings);
}

}  // namespace
