#include "VXColor.h"

#include <gtest/gtest.h>

#include <random>

#include "Shape.h"

namespace {

TEST(ColorTest, OpponentConversionByEveryEntryPoint) {
  // Blue above red makes r - b negative, which the unsigned arithmetic must survive.
  const uint8_t cases[][6] = {{255, 255, 255, 255, 127, 127}, {0, 0, 0, 0, 127, 127},
                              {255, 0, 0, 85, 255, 191},      {0, 255, 0, 85, 127, 0},
                              {0, 0, 255, 85, 0, 191},        {10, 200, 250, 153, 7, 92}};
  for (const auto& c : cases) {
    unsigned char c1, c2, c3, d1, d2, d3;
    RGB2C3(SVXColor{{c[0], c[1], c[2], 0xEE}}, c1, c2, c3);
    EXPECT_TRUE(c1 == c[3] && c2 == c[4] && c3 == c[5])
        << int(c1) << " " << int(c2) << " " << int(c3);
    ShapeColorInfo info{c[0], c[1], c[2], 0, 0, 0, 0};
    RGB2C3(info, d1, d2, d3);
    EXPECT_TRUE(d1 == c[3] && d2 == c[4] && d3 == c[5]);
    CShape::RGB2C(c[0], c[1], c[2], info);
    EXPECT_TRUE(info.C1 == c[3] && info.C2 == c[4] && info.C3 == c[5]);
  }
}

TEST(ColorTest, HSVScalesAndSectors) {
  double h, s, v, r, g, b;
  const double hues[][4] = {
      {255, 0, 0, 0}, {0, 255, 0, 120}, {0, 0, 255, 240}, {255, 0, 255, 300}, {255, 127.5, 0, 30}};
  for (const auto& c : hues) {
    RGBtoHSV(c[0], c[1], c[2], h, s, v);
    EXPECT_DOUBLE_EQ(h, c[3]);
    EXPECT_DOUBLE_EQ(s, 1);
    EXPECT_DOUBLE_EQ(v, 1);  // 0..255 in, 0..1 out
  }
  RGBtoHSV(51, 51, 51, h, s, v);
  EXPECT_TRUE(h == 0 && s == 0 && v == 0.2);
  HSVtoRGB(200, 0, 0.4, r, g, b);
  EXPECT_TRUE(r == 0.4 && g == 0.4 && b == 0.4);
  HSVtoRGB(360, 1, 1, r, g, b);  // wraps to red, not the sixth sector
  EXPECT_TRUE(r == 1 && g == 0 && b == 0);

  std::mt19937 rng(5);
  for (int i = 0; i < 1000; ++i) {
    const double in[3] = {double(rng() % 256), double(rng() % 256), double(rng() % 256)};
    RGBtoHSV(in[0], in[1], in[2], h, s, v);
    HSVtoRGB(h, s, v, r, g, b);
    ASSERT_NEAR(r * 255, in[0], 1e-9);
    ASSERT_NEAR(g * 255, in[1], 1e-9);
    ASSERT_NEAR(b * 255, in[2], 1e-9);
  }
}

}  // namespace
