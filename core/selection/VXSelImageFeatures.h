#pragma once

#include <cstdint>

#include "VXColor.h"
#include "VXSelCoreData.h"

// The feature records that compare the images themselves, through their 20 by 20 shape and
// colour record. Grids are in that record's cell order. Field lists are in stream order after
// the record block's version and tag.

// u32 Mode, u32 Tolerance, u32 byte count (1600 written; the reader ignores it and always reads
// 1600), the 400 colours. The fourth byte of a colour marks the cell as used.
struct SSelColor : SSelCoreData {
  static constexpr char kKey[] = "VXSELColor";
  static constexpr uint32_t kCells = 400;

  uint32_t Mode = 0;       // 0: colours at their grid position; 1: anywhere in the image
  uint32_t Tolerance = 0;  // percent
  SVXColor Colors[kCells] = {};

  // All colours white and unused.
  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 MaskMode, u32 byte count (400 written; ignored on reading), the 400 cell weights.
struct SSelMask : SSelCoreData {
  static constexpr char kKey[] = "VXSELMask";
  static constexpr uint32_t kCells = 400;

  uint32_t MaskMode = 0;
  uint8_t Cells[kCells] = {};  // weight of the cell in the match; 0 leaves it out

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};

// u32 Method, Precision, Weighting, LumaWeight, ColorWeight, Rotate, Fast (from 2; older:
// false). Load starts from Reset, so fields the stream lacks, and the core block when it is not
// read, come back as their defaults.
struct SSelMatch : SSelCoreData {
  static constexpr char kKey[] = "VXSELMatch";

  uint32_t Method = 0;     // 0 duplicates, 1 histogram, 2 colour and shape
  uint32_t Precision = 0;  // 0 quick, 1 fuzzy
  uint32_t Weighting = 0;  // 0 none, 1 and 2 built-in matrices, 3 the mask
  uint32_t LumaWeight = 0;
  uint32_t ColorWeight = 0;
  bool Rotate = false;  // try the four orientations
  bool Fast = false;    // every second cell, early exit

  void Reset() override;
  void Load(CVXFile* file, bool withCore) override;
  void Store(CVXFile* file, bool withCore) override;
};
