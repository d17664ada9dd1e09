// Property values and the property database's records from untrusted bytes: the CVXProperty
// reader, the row and table-definition readers, SetString of every type, and String with the
// input as a format. A reader may throw its 10020 exception, nothing else; what it accepted
// must write back to bytes that read as an equal value.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <vector>

#include "PropCodec.h"
#include "VXException.h"
#include "VXMemFile.h"
#include "VXProperty.h"
#include "VXResult.h"
#include "VXTable.h"

namespace {

template <typename F>
bool Reads(F&& read) {
  try {
    read();
    return true;
  } catch (CVXException* e) {
    if (e->GetCode() != VX_NOT_FOUND) std::abort();
    delete e;
    return false;
  }
}

void CheckRoundTrip(const std::vector<CVXProperty>& row) {
  CVXMemFile out;
  vxprop::WriteRow(out, row);
  out.Rewind();
  std::vector<CVXProperty> back;
  vxprop::ReadRow(out, back);
  if (back.size() != row.size()) std::abort();
  for (size_t i = 0; i < row.size(); ++i) {
    if (!(back[i] == row[i]) || back[i].Type() != row[i].Type()) std::abort();
  }
}

void FuzzText(const std::string& text) {
  for (unsigned type = 0; type <= 13; ++type) {
    CVXProperty p;
    bool ok = p.SetString(text, type);
    if (ok != (p.Type() == type && CVXProperty::IsValidType(type))) std::abort();
    p.String(text.c_str());
    p.String();
    p.Double();
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  {
    CVXMemFile in(data, size);
    std::vector<CVXProperty> values;
    while (Reads([&] {
      values.emplace_back();
      in >> values.back();
    })) {
    }
    values.pop_back();
    CheckRoundTrip(values);
  }
  {
    CVXMemFile in(data, size);
    std::vector<CVXProperty> row;
    if (Reads([&] { vxprop::ReadRow(in, row); })) CheckRoundTrip(row);
  }
  {
    CVXMemFile in(data, size);
    vxprop::STableDef def;
    Reads([&] { vxprop::ReadTableDef(in, def); });
    SVXColumn column;
    CVXMemFile again(data, size);
    Reads([&] { again >> column; });
  }
  FuzzText(std::string(reinterpret_cast<const char*>(data), size));
  return 0;
}
