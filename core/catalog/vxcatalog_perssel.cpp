// What file and folder changes do to stored persistent selections and file transforms.
//
// The selections themselves (their records and result sets) are read and written by the
// selection code; until a build carries it, a store that holds selection records answers the
// walks below with 10020 instead of pretending to have marked them.

#include <ctime>

#include "vxcatalog_frame.h"

unsigned CVXCatalog::InvalidatePersistantSelections(const CVXPersistantSelection* /*sel*/) {
  if (!persSelDirty_) return VX_OK;
  unsigned count = 0;
  if (unsigned rc = CountRecords_(rtPersSel, count); rc != VX_OK) {
    VX_ERROR(Log_(), rc, "InvalidatePersistantSelections");
    return rc;
  }
  if (count == 0) return VX_OK;
  unsigned rc = MarkPersistantSelectionsDirty_();
  persSelDirty_ = false;
  lastPersSelUpdate_ = static_cast<int32_t>(std::time(nullptr));
  return rc;
}

unsigned CVXCatalog::InvalidatePersistantSelectionsForKey(const char* key) {
  if (!persSelDirty_) return VX_OK;
  unsigned count = 0;
  unsigned rc = CountRecords_(rtPersSel, count);
  if (rc != VX_OK || count == 0) return rc;
  rc = MarkPersistantSelectionsDirty_(key);
  lastPersSelUpdate_ = static_cast<int32_t>(std::time(nullptr));
  return rc;
}

// Selections with any property selector, for property changes through the engine.
unsigned CVXCatalog::InvalidatePersistantSelectionsForProps() {
  return InvalidatePersistantSelectionsForKey(nullptr);
}

unsigned CVXCatalog::SelectionsUnreadable_() const {
  VX_ERROR(Log_(), VX_NOT_FOUND, "Persistent selections cannot be read by this build");
  return VX_NOT_FOUND;
}

unsigned CVXCatalog::MarkPersistantSelectionsDirty_(const char* /*key*/) {
  return SelectionsUnreadable_();
}

void CVXCatalog::RemoveFileFromPersistantSelections_(uint32_t /*oid*/) { SelectionsUnreadable_(); }

// A store without selection records has nothing to clean; stored ones are left as they are,
// since judging them empty or corrupt takes reading them.
void CVXCatalog::CleanPersistantSelections_() {
  std::vector<uint32_t> oids;
  if (unsigned rc = store_.GetOids(rtPersSel, oids, false); rc != VX_OK) {
    VX_ERROR(Log_(), rc, "Loading Persistant Selections");
    return;
  }
  if (!oids.empty()) SelectionsUnreadable_();
}

unsigned CVXCatalog::RemoveFileTransform(uint32_t oid) { return RemoveRecord_(rtTransform, oid); }
