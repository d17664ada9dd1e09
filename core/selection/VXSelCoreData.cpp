#include "VXSelCoreData.h"

#include <cstring>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"

namespace {

CVXFile& NotNull(CVXFile* file) {
  if (file == nullptr) VX_THROW(VX_NOT_FOUND);
  return *file;
}

}  // namespace

void SSelCoreData::Reset() { *this = SSelCoreData(); }

// Reads into a copy so that a short block leaves this record as it was.
void SSelCoreData::Load(CVXFile* file, bool withCore) {
  CVXFile& f = NotNull(file);
  if (!withCore) return;
  SSelCoreData c(*this);
  std::string tag;
  f >> c.Version >> tag;
  c.Active = ReadBool8_(f);
  c.NeedsOriginals = ReadBool8_(f);
  c.InterActive = c.Version >= 2 && ReadBool8_(f);
  c.Option = 0;
  if (c.Version >= 3) f >> c.Option;
  std::memset(c.UserData, 0, sizeof c.UserData);
  if (c.Version >= 2) f.Read(c.UserData, sizeof c.UserData);
  *this = c;
}

void SSelCoreData::Store(CVXFile* file, bool withCore) {
  CVXFile& f = NotNull(file);
  if (!withCore) return;
  f << kVersion << "SCD" << uint8_t{Active} << uint8_t{NeedsOriginals} << uint8_t{InterActive}
    << Option;
  f.Write(UserData, sizeof UserData);
}

CVXFile& SSelCoreData::LoadHead_(CVXFile* file, bool withCore) {
  SSelCoreData::Load(file, withCore);
  std::string tag;
  *file >> Version >> tag;
  return *file;
}

CVXFile& SSelCoreData::StoreHead_(CVXFile* file, bool withCore, uint16_t version, const char* tag) {
  SSelCoreData::Store(file, withCore);
  *file << version << tag;
  return *file;
}

bool SSelCoreData::ReadBool8_(CVXFile& file) {
  uint8_t b = 0;
  file >> b;
  return b != 0;
}

bool SSelCoreData::ReadBool32_(CVXFile& file) {
  uint32_t v = 0;
  file >> v;
  return v != 0;
}

void SSelCoreData::WriteOids_(CVXFile& file, const std::vector<uint32_t>& oids) {
  file << static_cast<uint32_t>(oids.size());
  if (!oids.empty()) file.Write(oids.data(), oids.size() * sizeof(uint32_t));
}

std::vector<uint32_t> SSelCoreData::ReadOids_(CVXFile& file) {
  uint32_t count = 0;
  file >> count;
  if (uint64_t{count} * sizeof(uint32_t) > file.Remaining()) VX_THROW(VX_NOT_FOUND);
  std::vector<uint32_t> oids(count);
  if (count > 0) file.Read(oids.data(), oids.size() * sizeof(uint32_t));
  return oids;
}
