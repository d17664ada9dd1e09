#pragma once

// The operation frame and the record store shared by the catalog's source files. Internal.

#include <exception>

#include "VXException.h"
#include "VXLog.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "vxcatalog.h"

template <typename Body>
unsigned CVXCatalog::Frame_(const char* name, int level, const std::string* objectName,
                            EHandlers handlers, Body&& body) {
  CQRLLogfile* log = Log_();
  VX_LOGF(log, level, "+ CVXCatalog::%s", name);
  if (objectName) VX_LOGF(log, 4, "%s", objectName->c_str());
  unsigned rc = VX_OK;
  if (handlers == hNoHandlers) {
    rc = body();
  } else {
    try {
      rc = body();
    } catch (CVXException* e) {
      rc = handlers == hAllLevels ? e->GetCode() : VX_FRAMEWORK_EXCEPTION;
      if (log) log->AddError(e, __LINE__, __FILE__);
      delete e;
    } catch (...) {
      rc = VXCodeOfCurrentException(log, __LINE__, __FILE__);
    }
  }
  if (rc != VX_OK) VX_ERROR(log, rc, "");
  VX_LOGF(log, level, "- CVXCatalog::%s", name);
  return rc;
}

// Serialises the map's object into one record; 10020 when the map lacks it.
template <typename T>
unsigned CVXCatalog::StoreRecord_(ERecordType type, const std::map<uint32_t, T>& map,
                                  uint32_t oid) {
  auto it = map.find(oid);
  if (it == map.end()) return VX_NOT_FOUND;
  CVXMemFile file(false, 0, 4096);
  file << it->second;
  unsigned rc = store_.Set(CQRLBlobDB::SSelector(type, oid), file.GetBuffer(),
                           static_cast<unsigned>(file.GetFileSize()), 0);
  if (rc != VX_OK) VX_ERROR(Log_(), rc, "Storing record");
  return rc;
}

// Reads one record into `object` through a memory file; a record that does not read gives its
// code and leaves `object` as it was.
template <typename T>
unsigned CVXCatalog::LoadRecord_(ERecordType type, uint32_t oid, T& object) {
  CVXMemFile file;
  unsigned rc = store_.Get(CQRLBlobDB::SSelector(type, oid), file);
  if (rc != VX_OK) return rc;
  try {
    file >> object;
  } catch (...) {
    return VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
  }
  return VX_OK;
}
