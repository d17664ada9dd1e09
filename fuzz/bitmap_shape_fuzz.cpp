// Bitmaps of arbitrary size and content through CShape::CalcShapeInfo and CHist::Build. Bytes 0-1
// and 2-3 are width and height (little-endian, total pixels capped), byte 4 the threshold,
// byte 5 the histogram weighting; the rest fills the pixels, repeated as needed. One CShape
// serves every input, as one serves a run of images. Checks that the record is sound: cells
// beyond the image are black and dark, no cell is more than wholly bright.
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "Hist.h"
#include "Shape.h"

namespace {

constexpr uint64_t kMaxPixels = uint64_t{1} << 20;

void Check(bool ok) {
  if (!ok) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 6) return 0;
  uint32_t w = data[0] | data[1] << 8;
  uint32_t h = data[2] | data[3] << 8;
  while (uint64_t{w} * h > kMaxPixels) (w > h ? w : h) /= 2;
  const unsigned char threshold = data[4];
  const uint32_t weighting = data[5] % 4;
  data += 6;
  size -= 6;

  CVXBitmap bitmap;
  Check(bitmap.Create(w, h) == 10001);
  if (size > 0) {
    unsigned char* bytes = bitmap.GetData();
    for (size_t i = 0; i < bitmap.GetDataSize(); ++i) bytes[i] = data[i % size];
  }
  static CShape shape;
  SVXMatchInfo info;
  const bool made = shape.CalcShapeInfo(bitmap, info, threshold);
  Check(made == (uint64_t{w} * h > 0));
  const uint32_t cw = (w + 19) / 20, ch = (h + 19) / 20;
  for (uint32_t i = 0; i < 400; ++i) {
    const SVXMatchInfo::SCell& c = info.Cells[i];
    Check(c.Shape <= 100);
    const bool outside = i / 20 * cw >= w || i % 20 * ch >= h;
    if (made && outside) Check(c.C1 == 0 && c.C2 == 127 && c.C3 == 127 && c.Shape == 0);
  }
  CHist hist;
  hist.Build(info, weighting);
  for (float bin : hist.Bins) Check(std::isfinite(bin) && bin >= 0.5f);
  return 0;
}
