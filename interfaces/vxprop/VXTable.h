#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "VXBase.h"
#include "VXProperty.h"

class CVXFile;

// One column of a property table. `Id` is unique within its table and never changes once given;
// `Type` is a type code 1 to 12 (EVXPropertyType). `Default` stands in for the value of a row
// that was stored before the column existed.
//
// A reference column (vptReference) may name the table and the column its OIDs point into, so
// that a sort can show the linked value; 0 in both means an unlinked column.
struct SVXColumn {
  uint32_t Id = 0;
  std::string Name;
  uint32_t Type = vptString;
  CVXProperty Default;
  uint32_t LinkTable = 0;
  uint32_t LinkColumn = 0;

  bool IsLinked() const { return LinkTable != 0 && LinkColumn != 0; }
};

// Stream form: u32 Id, string Name, u32 Type, Default, u32 LinkTable, u32 LinkColumn. The reader
// throws CVXException* (10020) on a type code outside 1 to 12 or a short input.
CVXFile& operator<<(CVXFile& file, const SVXColumn& column);
CVXFile& operator>>(CVXFile& file, SVXColumn& column);

// The definition of one table of a CVXPropDB: its number, its name and its columns. A row of the
// table holds one CVXProperty per column, in the order of Columns().
class CVXTable : public CVXBase {
 public:
  struct SData {
    uint32_t Table = 0;
    std::string Name;
  };

  explicit CVXTable(uint32_t table = 0);
  CVXTable(const CVXTable&) = default;
  CVXTable& operator=(const CVXTable&) = default;
  ~CVXTable() override = default;

  SData& Properties() { return data_; }
  const SData& Properties() const { return data_; }
  std::vector<SVXColumn>& Columns() { return columns_; }
  const std::vector<SVXColumn>& Columns() const { return columns_; }

  // Copies the column with that id; false if there is none.
  bool GetColumn(uint32_t id, SVXColumn& column) const;
  // Points `value` at the entry of `row` that belongs to column `id`; false if the id is unknown
  // or the row is too short to hold it. `value` points into `row`.
  bool GetColumnData(uint32_t id, const std::vector<CVXProperty>& row,
                     const CVXProperty*& value) const;

  // For hosts that define tables. AddColumn appends a column with the next free id (one above
  // the highest here) and returns it; 0 if `type` is not a type code 1 to 12.
  uint32_t AddColumn(const std::string& name, unsigned type,
                     const CVXProperty& defaultValue = CVXProperty());
  // Id of the column of that exact name, the last one if several share it; 0 if none.
  uint32_t FindColumn(const std::string& name) const;
  // Position of column `id` in Columns(), or -1.
  int ColumnIndex(uint32_t id) const;

 private:
  SData data_;
  std::vector<SVXColumn> columns_;
};
