#pragma once

#include <cstdint>
#include <memory>

#include "VXBase.h"
#include "VXBitmap.h"
#include "VXColor.h"
#include "VXMatchInfo.h"

// Computes the shape and colour record of an image and holds the query of the comparisons: the
// original's record and a colour query. One CShape per worker: the luminance scratch buffer is
// kept across calls so that a run of images allocates only when an image is larger than any
// before.
class CShape : public CVXBase {
 public:
  CShape();
  // A copy takes the records but not the scratch buffer, which stays with its owner: the copy
  // allocates its own on first use. Moves hand the buffer over.
  CShape(const CShape& other);
  CShape(CShape&& other) noexcept;
  CShape& operator=(const CShape& other);
  CShape& operator=(CShape&& other) noexcept;
  ~CShape() override;

  // Fills `info` from the pixels of `bitmap`; a pixel is bright when its histogram-equalised
  // luminance exceeds `threshold` (the engine passes 127); Shape is the integer percent of the
  // nominal cell area that is bright. Returns false, with `info` cleared, for a bitmap without
  // pixels or when not even one row of working memory can be allocated.
  bool CalcShapeInfo(const CVXBitmap& bitmap, SVXMatchInfo& info, unsigned char threshold);

  void SetOriginal(const SVXMatchInfo& info);
  // Copies the 20 x 20 colour query (cell order x * 20 + y) and computes C1 to C3 of each cell.
  void SetColorInfo(const SColPercMatchInfo (*cells)[20]);

  // Fills C1 to C3 of `info` from r, g, b.
  static void RGB2C(unsigned char r, unsigned char g, unsigned char b, ShapeColorInfo& info);

  const SVXMatchInfo& GetOriginal() const { return Original; }
  const ShapeColorInfo (&GetColorInfo() const)[20][20] { return ColorInfo; }
  uint32_t GetScratchSize() const { return ScratchSize; }

 protected:
  SVXMatchInfo Original;
  ShapeColorInfo ColorInfo[20][20];
  std::unique_ptr<uint8_t[]> Scratch;  // luminance of each pixel, ScratchSize bytes
  uint32_t ScratchSize = 0;

 private:
  uint8_t* ReserveScratch_(uint64_t pixels);
};
