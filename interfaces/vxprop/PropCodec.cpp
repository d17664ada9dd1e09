#include "PropCodec.h"

#include <algorithm>
#include <set>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"

namespace vxprop {
namespace {

// Smallest stream forms: an empty property is its 4-byte type code; a column has at least
// 4 + 4 + 4 + 4 + 4 + 4 bytes.
constexpr uint64_t kMinPropertySize = 4;
constexpr uint64_t kMinColumnSize = 24;

uint32_t ReadCount(CVXFile& file, uint64_t minItemSize) {
  uint32_t count = 0;
  file >> count;
  if (count > file.Remaining() / minItemSize) VX_THROW(VX_NOT_FOUND);
  return count;
}

uint16_t ReadVersion(CVXFile& file) {
  uint16_t version = 0;
  file >> version;
  if (version == 0) VX_THROW(VX_NOT_FOUND);
  return version;
}

// A record of the version we write must end where its fields end.
void CheckEnd(CVXFile& file, uint16_t version, uint16_t current) {
  if (version == current && file.Remaining() != 0 && file.Remaining() != UINT64_MAX) {
    VX_THROW(VX_NOT_FOUND);
  }
}

}  // namespace

void WriteRow(CVXFile& file, const std::vector<CVXProperty>& row) {
  if (row.size() > UINT32_MAX) VX_THROW(VX_RANGE);
  file << kRowVersion << static_cast<uint32_t>(row.size());
  for (const CVXProperty& p : row) file << p;
}

void ReadRow(CVXFile& file, std::vector<CVXProperty>& row) {
  uint16_t version = ReadVersion(file);
  uint32_t count = ReadCount(file, kMinPropertySize);
  // Grown as read: with an unknown remainder the count alone must not size an allocation.
  std::vector<CVXProperty> values;
  values.reserve(std::min<uint32_t>(count, 1024));
  for (uint32_t i = 0; i < count; ++i) file >> values.emplace_back();
  CheckEnd(file, version, kRowVersion);
  row = std::move(values);
}

void WriteTableDef(CVXFile& file, const STableDef& def) {
  const CVXTable& t = def.Table;
  if (t.Columns().size() > UINT32_MAX) VX_THROW(VX_RANGE);
  file << kTableVersion << t.Properties().Table << t.Properties().Name << def.NextColumnId
       << static_cast<uint32_t>(t.Columns().size());
  for (const SVXColumn& c : t.Columns()) file << c;
}

void ReadTableDef(CVXFile& file, STableDef& def) {
  uint16_t version = ReadVersion(file);
  STableDef d;
  file >> d.Table.Properties().Table >> d.Table.Properties().Name >> d.NextColumnId;
  uint32_t count = ReadCount(file, kMinColumnSize);
  std::vector<SVXColumn>& columns = d.Table.Columns();
  std::set<uint32_t> ids;
  for (uint32_t i = 0; i < count; ++i) {
    SVXColumn& c = columns.emplace_back();
    file >> c;
    if (c.Id == 0 || !ids.insert(c.Id).second) VX_THROW(VX_NOT_FOUND);
    if (c.Id >= d.NextColumnId) d.NextColumnId = c.Id == UINT32_MAX ? c.Id : c.Id + 1;
  }
  CheckEnd(file, version, kTableVersion);
  def = std::move(d);
}

}  // namespace vxprop
