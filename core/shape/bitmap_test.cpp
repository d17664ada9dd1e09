#include "VXBitmap.h"

#include <gtest/gtest.h>

#include <cstring>
#include <utility>

#include "VXResult.h"

namespace {

TEST(BitmapTest, CreateCopiesOrClears) {
  uint8_t source[3 * 2 * 4];
  for (size_t i = 0; i < sizeof source; ++i) source[i] = uint8_t(i + 1);
  CVXBitmap bitmap;
  EXPECT_EQ(bitmap.GetDataSize() + bitmap.GetBytesPerRow(), 0u);
  ASSERT_EQ(bitmap.Create(3, 2, true, source), VX_OK);
  EXPECT_EQ(bitmap.GetDataSize(), 24u);
  EXPECT_EQ(bitmap.GetBytesPerRow(), 12u);
  EXPECT_TRUE(bitmap.IsGrayScale());
  // Byte 0 of a pixel is red, byte 3 alpha; rows follow each other without padding.
  const SVXColor p = bitmap.GetColorMatrix()[4];
  EXPECT_TRUE(p.R == 17 && p.G == 18 && p.B == 19 && p.A == 20);

  ASSERT_EQ(bitmap.Create(2, 2), VX_OK);
  EXPECT_FALSE(bitmap.IsGrayScale());
  for (int i = 0; i < 16; ++i) EXPECT_EQ(bitmap.GetData()[i], 0);
  EXPECT_EQ(bitmap.Create(0, 7), VX_OK);
  EXPECT_EQ(bitmap.GetData(), nullptr);

  // 4 * w * h does not fit in memory's address range: refused before any allocation.
  EXPECT_EQ(bitmap.Create(0xFFFFFFFF, 0xFFFFFFFF), VX_NEUTRAL_FAILURE);
  EXPECT_EQ(bitmap.GetData(), nullptr);
  EXPECT_EQ(bitmap.GetWidth(), 0u);
}

TEST(BitmapTest, CopiesAreDeepMovesHandOverFreeEmpties) {
  CVXBitmap a(2, 2);
  a.SetGrayScale(true);
  a.GetColorMatrix()[3].Value = 0x01020304;
  CVXBitmap b(9, 9);
  b = a;
  b.GetColorMatrix()[3].Value = 7;
  EXPECT_EQ(a.GetColorMatrix()[3].Value, 0x01020304u);
  EXPECT_TRUE(b.IsGrayScale() && b.GetWidth() == 2);

  const unsigned char* pixels = a.GetData();
  CVXBitmap c(std::move(a));
  b = std::move(c);
  EXPECT_EQ(b.GetData(), pixels);
  b.Free();
  EXPECT_EQ(b.GetFlags() + b.GetWidth() + b.GetHeight(), 0u);
  EXPECT_EQ(b.GetData(), nullptr);
}

}  // namespace
