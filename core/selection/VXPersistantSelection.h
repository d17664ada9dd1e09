#pragma once

#include <cstdint>
#include <string>

#include "VXDBObject.h"
#include "VXResultSet.h"
#include "VXSelector.h"

class CBitVector;
class CVXFile;

// A named selector with its stored result, kept in the catalog's blob store. Dirty is the
// client's note that the stored result no longer reflects the catalog; the library sets it but
// never clears it.
//
// Stream form (operators << and >>): u16 1, u32 OID, u16 1, string Name, u32 TimeStamp, u32
// Reserved, the selector, the result set, u8 Dirty.
class CVXPersistantSelection : public CVXDBObject {
 public:
  struct SData {
    std::string Name;
    int32_t TimeStamp = 0;  // seconds since 1970; the current time on construction
    uint32_t Reserved = 0;
    CVXSelector Selector;
    CVXResultSet Result;
  };

  explicit CVXPersistantSelection(uint32_t oid = 0);
  CVXPersistantSelection(const CVXPersistantSelection&) = default;
  CVXPersistantSelection& operator=(const CVXPersistantSelection&) = default;
  ~CVXPersistantSelection() override = default;

  SData& Properties() { return data_; }
  const SData& Properties() const { return data_; }

  void SetDirty(bool dirty) { dirty_ = dirty; }
  bool IsDirty() const { return dirty_; }

  // Equal OIDs; nothing else is compared.
  bool operator==(const CVXPersistantSelection& other) const { return Oid() == other.Oid(); }

  // The file is an original or a hit of the result.
  bool HasImage(uint32_t oid) const;
  // Erases the file's entries from the result, and in every other entry its first hit.
  // Always 10001.
  unsigned RemoveImage(uint32_t oid);
  // Clears `bits` and sets the OID of every hit, not of the originals.
  void GetAllResultImages(CBitVector& bits) const;

 private:
  SData data_;
  bool dirty_ = false;
};

CVXFile& operator<<(CVXFile& file, const CVXPersistantSelection& selection);
// Throws CVXException* (10020) on a short stream and then leaves `selection` unchanged.
CVXFile& operator>>(CVXFile& file, CVXPersistantSelection& selection);
