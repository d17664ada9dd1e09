#include "VXSelPropFeatures.h"

#include "VXFile.h"

// Every Load reads into a copy and assigns it at the end, so that a short stream leaves the
// record as it was.

namespace {

SSelProps::SCondition EmptyCondition() {
  SSelProps::SCondition c;
  c.MatchMode = 1;
  return c;
}

void ReadCondition(CVXFile& file, SSelProps::SCondition& c) {
  file >> c.Op >> c.MatchMode >> c.Flags >> c.Low >> c.High >> c.Value;
}

}  // namespace

std::string SSelProps::GenerateID(const std::string& table, const std::string& column) {
  return std::string(kKeyPrefix) + "." + table + "." + column;
}

void SSelProps::Reset() {
  SSelCoreData::Reset();
  DataType = Invert = 0;
  Table.clear();
  Column.clear();
  MatchEmpty = false;
  for (SCondition& c : Conditions) c = EmptyCondition();
}

void SSelProps::Load(CVXFile* file, bool withCore) {
  SSelProps r(*this);
  CVXFile& f = r.LoadHead_(file, withCore) >> r.DataType >> r.Table >> r.Column;
  r.MatchEmpty = ReadBool32_(f);
  uint32_t count = 0;
  f >> count;
  for (SCondition& c : r.Conditions) c = EmptyCondition();
  // Each condition takes bytes of the stream, so a corrupt count ends at its end.
  for (uint32_t i = 0; i < count; ++i) {
    SCondition c;
    ReadCondition(f, c);
    if (i < kConditions) r.Conditions[i] = c;
  }
  r.Invert = 0;
  if (r.Version >= 2) f >> r.Invert;
  *this = r;
}

void SSelProps::Store(CVXFile* file, bool withCore) {
  CVXFile& f = StoreHead_(file, withCore, 2, "SDPS")
               << DataType << Table << Column << uint32_t{MatchEmpty} << kConditions;
  for (const SCondition& c : Conditions) {
    f << c.Op << c.MatchMode << c.Flags << c.Low << c.High << c.Value;
  }
  f << Invert;
}

void SSelXMP::Reset() {
  SSelCoreData::Reset();
  UseField = Reserved = Exclude = 0;
  Field.clear();
  Query.clear();
  Flag = false;
}

void SSelXMP::Load(CVXFile* file, bool withCore) {
  SSelXMP r(*this);
  CVXFile& f = r.LoadHead_(file, withCore) >> r.UseField >> r.Reserved >> r.Field >> r.Query;
  r.Flag = r.Version >= 2 && ReadBool32_(f);
  r.Exclude = 0;
  if (r.Version >= 3) f >> r.Exclude;
  *this = r;
}

void SSelXMP::Store(CVXFile* file, bool withCore) {
  StoreHead_(file, withCore, 3, "SDXM")
      << UseField << Reserved << Field << Query << uint32_t{Flag} << Exclude;
}
