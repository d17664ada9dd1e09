#pragma once

#include <cstdint>

#include "VXBase.h"

// Identity of a persisted object. An OID of 0 means the object has none yet; OIDs are never
// reused. Copying copies the OID only.
class CVXDBObject : public CVXBase {
 public:
  explicit CVXDBObject(uint32_t oid = 0) : oid_(oid) {}
  CVXDBObject(const CVXDBObject&) = default;
  CVXDBObject& operator=(const CVXDBObject&) = default;
  ~CVXDBObject() override = default;

  uint32_t Oid() const { return oid_; }
  uint32_t& Oid() { return oid_; }

 private:
  uint32_t oid_;
};

// OID of the super category "@All", which virtually contains every file.
constexpr uint32_t VX_ALL_GROUP_OID = 0xFFFFEFFFu;
