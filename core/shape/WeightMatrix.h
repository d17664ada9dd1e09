#pragma once

#include <cstdint>

// Weights of the 400 cells of a shape record, in its cell order (x cell * 20 + y cell). Kinds 1
// and 2 stress the middle of the image, kind 3 is a user's mask; every other kind weighs all
// cells alike.
struct SVXWeightMatrix {
  uint32_t Kind = 0;
  double W[400];

  SVXWeightMatrix() { Reset(0); }

  // All weights 1.0; for kind 1 and 2 cell (i, j) then carries v[i] * v[j] of the kind's vector.
  void Reset(uint32_t kind);
  // Kind 3: the weights are the mask's cells (percent) as numbers.
  void SetMask(const uint8_t (&cells)[400]);
};
