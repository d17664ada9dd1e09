#include "VXPersistantSelection.h"

#include <ctime>
#include <utility>

#include "VXFile.h"
#include "VXResult.h"
#include "bitvector.h"

namespace {

constexpr uint16_t kObjectVersion = 1;
constexpr uint16_t kSelectionVersion = 1;

}  // namespace

CVXPersistantSelection::CVXPersistantSelection(uint32_t oid) : CVXDBObject(oid) {
  data_.TimeStamp = static_cast<int32_t>(std::time(nullptr));
}

bool CVXPersistantSelection::HasImage(uint32_t oid) const {
  CVXResultSet::ERefType ref;
  return data_.Result.HasReference(oid, ref);
}

unsigned CVXPersistantSelection::RemoveImage(uint32_t oid) {
  data_.Result.RemoveFileReferences(oid, false);
  return VX_OK;
}

void CVXPersistantSelection::GetAllResultImages(CBitVector& bits) const {
  bits.Clear();
  for (const SVXResultSetEntry& e : data_.Result.Properties().Entries) {
    for (const SVXRSEntry& h : e.Hits) bits.Set(h.OID);
  }
}

CVXFile& operator<<(CVXFile& file, const CVXPersistantSelection& selection) {
  const CVXPersistantSelection::SData& d = selection.Properties();
  file << kObjectVersion << selection.Oid() << kSelectionVersion << d.Name
       << static_cast<uint32_t>(d.TimeStamp) << d.Reserved << d.Selector << d.Result
       << uint8_t{selection.IsDirty()};
  return file;
}

// Reads into a copy, so that a short stream leaves `selection` as it was.
CVXFile& operator>>(CVXFile& file, CVXPersistantSelection& selection) {
  CVXPersistantSelection r(selection);
  CVXPersistantSelection::SData& d = r.Properties();
  uint16_t objectVersion = 0, version = 0;
  uint8_t dirty = 0;
  file >> objectVersion >> r.Oid() >> version >> d.Name >> d.TimeStamp >> d.Reserved >>
      d.Selector >> d.Result >> dirty;
  r.SetDirty(dirty != 0);
  selection = r;
  return file;
}
