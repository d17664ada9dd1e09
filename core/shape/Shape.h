#pragma once

#include <cstdint>
#include <memory>

#include "VXBase.h"
#include "VXBitmap.h"
#include "VXColor.h"
#include "VXMatchInfo.h"

class CVexoraSettings;

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

  // Difference of `query` from Original, lower being closer, by settings.Method: 1
  // MatchDuplicates, 2 MatchShapeColorQuick, 3 MatchShapeColor; any other method gives 0.
  // The three return 10000.0 as soon as their running difference passes settings.MaxDifference.
  double Compare(const SVXMatchInfo& query, const CVexoraSettings& settings) const;
  // Difference of `query` from the colour query in ColorInfo under settings.ColorTolerance:
  // method 6 counts the colour cells found in place, method 7 how much of each colour of the
  // palette (the first row of ColorInfo) the query covers. Other methods give 100.0.
  double CompareColor(const SVXMatchInfo& query, const CVexoraSettings& settings) const;

  // Colour only, on a 5 x 5 sample of the cells.
  double MatchDuplicates(const SVXMatchInfo& query, const CVexoraSettings& settings) const;
  // Colour and shape, cell against cell.
  double MatchShapeColorQuick(const SVXMatchInfo& query, const CVexoraSettings& settings) const;
  // Colour and shape; a cell too far off may match a query cell up to two steps away, at a
  // price growing with the distance.
  double MatchShapeColor(const SVXMatchInfo& query, const CVexoraSettings& settings) const;

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
