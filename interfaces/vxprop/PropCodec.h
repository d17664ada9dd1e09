#pragma once

#include <cstdint>
#include <vector>

#include "VXProperty.h"
#include "VXTable.h"

class CVXFile;

// The two record forms of the property database. Internal to vxprop; not installed.
//
// Row: u16 version (1); u32 value count; the values (CVXProperty stream form), in column order.
// Table definition: u16 version (1); u32 table number; string name; u32 next column id; u32
// column count; the columns (SVXColumn stream form).
//
// A reader accepts any version from 1 on and reads the fields it knows; a later version may
// append fields, which it then skips. Readers throw CVXException* (10020) on a short or corrupt
// record and leave their output unchanged; a count is checked against the bytes left before
// anything is allocated for it.
namespace vxprop {

constexpr uint16_t kRowVersion = 1;
constexpr uint16_t kTableVersion = 1;

struct STableDef {
  CVXTable Table;
  // Column ids below this one may have been used before; a new column gets this one.
  uint32_t NextColumnId = 1;
};

void WriteRow(CVXFile& file, const std::vector<CVXProperty>& row);
// Also fails when a version 1 record has bytes after its last value.
void ReadRow(CVXFile& file, std::vector<CVXProperty>& row);

void WriteTableDef(CVXFile& file, const STableDef& def);
// Also fails on a column id 0 or an id used twice; a NextColumnId not above every id is raised.
void ReadTableDef(CVXFile& file, STableDef& def);

}  // namespace vxprop
