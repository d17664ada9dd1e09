#include "VXTable.h"

#include <algorithm>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"

CVXFile& operator<<(CVXFile& file, const SVXColumn& column) {
  return file << column.Id << column.Name << column.Type << column.Default << column.LinkTable
              << column.LinkColumn;
}

CVXFile& operator>>(CVXFile& file, SVXColumn& column) {
  SVXColumn c;
  file >> c.Id >> c.Name >> c.Type;
  if (!CVXProperty::IsValidType(c.Type)) VX_THROW(VX_NOT_FOUND);
  file >> c.Default >> c.LinkTable >> c.LinkColumn;
  column = std::move(c);
  return file;
}

CVXTable::CVXTable(uint32_t table) { data_.Table = table; }

int CVXTable::ColumnIndex(uint32_t id) const {
  for (size_t i = 0; i < columns_.size(); ++i) {
    if (columns_[i].Id == id) return static_cast<int>(i);
  }
  return -1;
}

bool CVXTable::GetColumn(uint32_t id, SVXColumn& column) const {
  int i = ColumnIndex(id);
  if (i < 0) return false;
  column = columns_[static_cast<size_t>(i)];
  return true;
}

bool CVXTable::GetColumnData(uint32_t id, const std::vector<CVXProperty>& row,
                             const CVXProperty*& value) const {
  int i = ColumnIndex(id);
  if (i < 0 || static_cast<size_t>(i) >= row.size()) return false;
  value = &row[static_cast<size_t>(i)];
  return true;
}

uint32_t CVXTable::AddColumn(const std::string& name, unsigned type,
                             const CVXProperty& defaultValue) {
  if (!CVXProperty::IsValidType(type)) return 0;
  uint32_t highest = 0;
  for (const SVXColumn& c : columns_) highest = std::max(highest, c.Id);
  if (highest == UINT32_MAX) return 0;  // no room above the highest id
  SVXColumn column;
  column.Id = highest + 1;
  column.Name = name;
  column.Type = type;
  column.Default = defaultValue;
  columns_.push_back(std::move(column));
  return columns_.back().Id;
}

uint32_t CVXTable::FindColumn(const std::string& name) const {
  for (auto it = columns_.rbegin(); it != columns_.rend(); ++it) {
    if (it->Name == name) return it->Id;
  }
  return 0;
}
