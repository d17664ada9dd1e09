#pragma once

#include <cstdint>

// The feature record of one image: a 20 by 20 grid, cell (column x, row y) at index x * 20 + y.
// One index step is one row down, twenty steps one column right.
struct SVXMatchInfo {
  struct SCell {
    uint8_t C1;     // mean brightness
    uint8_t C2;     // mean blue-to-red
    uint8_t C3;     // mean green-to-magenta
    uint8_t Shape;  // percent of the nominal cell area that is bright after equalisation
  };
  SCell Cells[400];
};
static_assert(sizeof(SVXMatchInfo) == 1600);

#pragma pack(push, 1)
// The stored shape record, record type 2 under the file's OID; 1601 bytes, written and read
// whole. Flag is 0 in every record this library makes and no comparison reads it.
struct SVXDBRec_3 {
  uint8_t Flag;
  SVXMatchInfo Info;
};
#pragma pack(pop)
static_assert(sizeof(SVXDBRec_3) == 1601);
