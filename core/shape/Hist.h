#pragma once

#include <cstdint>

#include "VXMatchInfo.h"

// Colour histogram of a shape record: 256 bins of 4 brightness by 8 by 8 colour levels, each the
// percent of the cells that fall into it (see Build for the exact finish).
class CHist {
 public:
  CHist();
  CHist(const CHist& other) = default;
  CHist& operator=(const CHist& other) = default;
  virtual ~CHist() = default;

  // Fills the bins from the 400 cells of `cells`; `weighting` 0 counts every cell once, other
  // values weigh the cells by SVXWeightMatrix of that kind.
  void Build(const SVXMatchInfo& cells, uint32_t weighting);

  float Bins[256];
  uint32_t Total;
};
