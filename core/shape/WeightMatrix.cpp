#include "WeightMatrix.h"

namespace {

// Vectors over one axis of the grid, outer cells first.
constexpr double kCentre[20] = {1.0, 1.0, 1.0, 1.0, 1.0, 1.0, 1.0, 1.2, 1.2, 1.2,
                                1.2, 1.2, 1.2, 1.0, 1.0, 1.0, 1.0, 1.0, 1.0, 1.0};
constexpr double kGraded[20] = {1.0, 1.0, 1.0, 1.1, 1.1, 1.2, 1.2, 1.5, 1.5, 1.5,
                                1.5, 1.5, 1.5, 1.2, 1.2, 1.1, 1.1, 1.0, 1.0, 1.0};

}  // namespace

void SVXWeightMatrix::Reset(uint32_t kind) {
  Kind = kind;
  const double* v = kind == 1 ? kCentre : kind == 2 ? kGraded : nullptr;
  for (int k = 0; k < 20; ++k) {
    for (int i = 0; i < 20; ++i) W[k * 20 + i] = v ? 1.0 * (v[i] * v[k]) : 1.0;
  }
}

void SVXWeightMatrix::SetMask(const uint8_t (&cells)[400]) {
  Kind = 3;
  for (int i = 0; i < 400; ++i) W[i] = cells[i];
}
