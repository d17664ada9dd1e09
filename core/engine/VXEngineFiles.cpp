// Files and folders across the stores: the catalog, the shape data of the match store, the
// thumbnail store, the property database, the XMP database and the plug-in stores.
//
// The stores are not one transaction. The catalog record is what makes a file visible, so it is
// written last when a file comes and removed last when it goes: a crash in between leaves data
// without a catalog record, which self test cleans away, never a listed file without its shape
// data.
#include "VXEngine.h"

#include <cstdio>
#include <ctime>

#include "QRLLogfile.h"
#include "SQLiteTransaction.h"
#include "Shape.h"
#include "VXBitmap.h"
#include "VXException.h"
#include "VXLog.h"
#include "VXMatchInfo.h"
#include "VXPropDB.h"
#include "VXResult.h"
#include "VXThumb.h"
#include "VXXMPDB.h"

namespace {

using Sel = CQRLBlobDB::SSelector;
constexpr uint16_t kShapeRecord = 2;
constexpr uint16_t kThumbRecord = 3;
constexpr uint64_t kFileSpace = 0x80000;
constexpr uint64_t kFolderSpace = 0x200000;
constexpr unsigned char kShapeThreshold = 127;

int32_t Now() { return static_cast<int32_t>(std::time(nullptr)); }

}  // namespace

// ---------------------------------------------------------------------------------------------
// Frame

unsigned CVXEngine::Framed_(const char* name, bool locked, const std::function<unsigned()>& body,
                            bool quietMiss) {
  std::unique_lock<std::recursive_mutex> lock(lock_, std::defer_lock);
  if (locked) lock.lock();
  VX_LOGF(log_, 2, "+ VXEngine::%s", name);
  unsigned rc;
  try {
    rc = body();
  } catch (...) {
    rc = VXCodeOfCurrentException(log_, __LINE__, __FILE__);
  }
  VX_LOGF(log_, 2, "- VXEngine::%s", name);
  if (rc != VX_OK && !(quietMiss && rc == VX_NOT_FOUND)) {
    VX_ERROR(log_, rc, (std::string("VXEngine::") + name).c_str());
  }
  return rc;
}

unsigned CVXEngine::CheckMutableNoDisk_(bool logged) const {
  if (Mutable()) return VX_OK;
  if (logged) VX_ERROR(log_, VX_NOT_MUTABLE, "Engine not mutable");
  return VX_NOT_MUTABLE;
}

// No match plug-in can be loaded yet (LoadPlugIns loads none), so there is no plug-in store
// that could hold the image.
void CVXEngine::RemoveImageFromPlugIns_(uint32_t /*oid*/) {}

uint32_t CVXEngine::FindFileInFolder_(uint32_t folderOid, const std::string& name,
                                      uint32_t skip) const {
  auto folder = catalog_.Folders().find(folderOid);
  if (name.empty() || folder == catalog_.Folders().end()) return 0;
  for (uint32_t oid : folder->second.Files()) {
    auto file = catalog_.Files().find(oid);
    if (oid != skip && file != catalog_.Files().end() &&
        CVXCatFile::CompareNames(file->second.Name(), name) == 0) {
      return oid;
    }
  }
  return 0;
}

// ---------------------------------------------------------------------------------------------
// Adding files

unsigned CVXEngine::ProcessFile(CVXCatFile& file, const CVXBitmap& bitmap, bool update,
                                uint32_t crc) {
  return Framed_("PF", true, [&] {
    SetUpdated_();
    CVXCatFile::SData& data = file.Properties();
    data.Processed = Now();
    data.CRC = crc;
    data.Flags = static_cast<uint16_t>(data.Flags & ~cfGreyscale);
    if (bitmap.IsGrayScale()) data.Flags |= cfGreyscale;
    if (!shaper_) shaper_ = std::make_unique<CShape>();
    SVXDBRec_3 record{};  // the flag byte stays 0
    // No pixels, no shape: storing the cleared record would make every such file match.
    if (!shaper_->CalcShapeInfo(bitmap, record.Info, kShapeThreshold)) {
      return unsigned{VX_NOT_FOUND};
    }
    VX_LOG(log_, 3, update ? "Update" : "Insert");
    return matchDB_.Set(Sel(kShapeRecord, file.Oid()), &record, sizeof record);
  });
}

void CVXEngine::ForgetNewFile_(uint32_t oid) {
  matchDB_.Remove(Sel(kShapeRecord, oid));
  thumbDB_.Remove(Sel(kThumbRecord, oid));
  thumbSizes_.erase(oid);
}

// A copy stores its data under the OID that the catalog is about to give it, before the catalog
// record that takes the OID (see CopyFile_). A crash in between leaves data under an OID that
// the catalog's counter has not passed, and the next new file would adopt it: its properties row
// would refuse the host's AddImageProperties, and the source's XMP data would show on it. Every
// new OID is therefore cleared first; a copy writes shape data, thumbnail and properties before
// the XMP data, so a leftover always shows in one of those three.
void CVXEngine::ClearLeftovers_(uint32_t oid) {
  if (matchDB_.HasRecord(Sel(kShapeRecord, oid)) || thumbDB_.HasRecord(Sel(kThumbRecord, oid)) ||
      propDB_->HasRecord(VX_IMAGE_PROPERTIES_TABLE, oid)) {
    VX_WARN(log_, "Removing data of an unfinished copy");
    RemoveDependendItems(oid);
  }
}

uint32_t CVXEngine::NewFileOid_() {
  uint32_t oid = catalog_.GenerateFileOID();
  ClearLeftovers_(oid);
  return oid;
}

unsigned CVXEngine::AddFile(CVXCatFile& file, const CVXBitmap& bitmap, uint32_t crc) {
  return Framed_("AddFile", true, [&] {
    unsigned rc = CheckMutable_(kFileSpace);
    if (rc != VX_OK) return rc;
    SetUpdated_();
    uint32_t folderOid = file.Properties().Folder;
    file.Oid() = catalog_.LookupFile(file.Name(), folderOid);
    bool existing = file.Oid() != 0;
    if (!existing) file.Oid() = NewFileOid_();
    if ((rc = ProcessFile(file, bitmap, existing, crc)) != VX_OK) {
      VX_ERROR(log_, rc, "Preprocess failed");
      return rc;
    }
    file.Properties().CRC = crc;
    if (existing) return catalog_.UpdateFile(file);
    if ((rc = catalog_.AddFile(folderOid, file)) != VX_OK) ForgetNewFile_(file.Oid());
    return rc;
  });
}

unsigned CVXEngine::AddFile(CVXCatFile& file, CVXThumb& thumb, const SVXDBRec_3& shape) {
  return Framed_("AddFile", true, [&] {
    unsigned rc = CheckMutable_(kFileSpace);
    if (rc != VX_OK) return rc;
    SetUpdated_();
    return AddFileFromThumb_(file, thumb, shape);
  });
}

// Shape data and thumbnail go in before the catalog record, as in the bitmap form.
unsigned CVXEngine::AddFileFromThumb_(CVXCatFile& file, CVXThumb& thumb, const SVXDBRec_3& shape) {
  uint32_t folderOid = file.Properties().Folder;
  uint32_t oid = catalog_.LookupFile(file.Name(), folderOid);
  bool existing = oid != 0;
  if (!existing) oid = NewFileOid_();
  file.Oid() = oid;
  file.Properties().Processed = Now();
  unsigned rc = matchDB_.Set(Sel(kShapeRecord, oid), &shape, sizeof shape);
  if (rc != VX_OK) VX_THROW(rc);
  thumb.Oid() = oid;
  if ((rc = existing ? SetThumb(thumb) : AddThumb(oid, thumb)) != VX_OK) {
    if (!existing) ForgetNewFile_(oid);
    return rc;
  }
  // The catalog's own result shows in the lookup below.
  if (existing) {
    catalog_.UpdateFile(file);
  } else {
    catalog_.AddFile(folderOid, file);
  }
  if (catalog_.IsUniqueFileOID(oid)) {
    VX_ERROR(log_, VX_INDEX_CORRUPTED, "Index corrupted. Run Diagnosis & Repair!");
    if (!existing) ForgetNewFile_(oid);
    VX_THROW(VX_INDEX_CORRUPTED);
  }
  return rc;
}

// ---------------------------------------------------------------------------------------------
// Removing files and folders

unsigned CVXEngine::RemoveDependendItems(uint32_t oid) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  unsigned rc = matchDB_.Remove(Sel(kShapeRecord, oid));
  if (rc != VX_OK) VX_ERROR(log_, rc, "VXEngine::DB::Remove");
  RemoveImageFromPlugIns_(oid);
  if ((rc = RemoveThumb(oid)) != VX_OK) VX_ERROR(log_, rc, "VXEngine::ThumbDB::Remove");
  RemoveImageProperties(oid);
  DeleteXMP(oid);
  SetUpdated_();
  return rc;
}

unsigned CVXEngine::RemoveFile(uint32_t oid) {
  return Framed_("RemoveFile", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    rc = RemoveDependendItems(oid);
    // 10020: the stores held nothing of the file, which does not keep it in the catalog.
    if (rc != VX_OK && rc != VX_NOT_FOUND) {
      VX_ERROR(log_, rc, "Failed to remove file from catalog");
    } else {
      rc = catalog_.RemoveFile(oid);
    }
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::RemoveFolderDependends(uint32_t oid, bool recursive) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  CVXFolder folder;
  unsigned rc = catalog_.LookupFolder(oid, folder);
  if (rc != VX_OK) return rc;
  for (uint32_t file : folder.Files()) {
    // As in RemoveFile, a file without thumbnail is no reason to keep the folder.
    rc = RemoveDependendItems(file);
    if (rc != VX_OK && rc != VX_NOT_FOUND) {
      SetUpdated_();
      return rc;
    }
  }
  if (recursive) {
    for (uint32_t child : folder.Children()) {
      if ((rc = RemoveFolderDependends(child, true)) != VX_OK) return rc;
    }
  }
  SetUpdated_();
  return VX_OK;
}

// Only the XMP database takes part in a transaction: its deletions come back if the catalog
// keeps the folder.
unsigned CVXEngine::RemoveFolder(uint32_t oid) {
  return Framed_("RemoveFolder", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    SetUpdated_();
    CSQLiteTransaction transaction(*xmpDB_);
    if (!transaction.BeginTrans()) return unsigned{VX_UNKNOWN_EXCEPTION};
    if ((rc = RemoveFolderDependends(oid, true)) != VX_OK) {
      VX_ERROR(log_, rc, "Removing folder dependends");
    } else if ((rc = catalog_.RemoveFolder(oid, true)) != VX_OK) {
      VX_ERROR(log_, rc, "Removing folder from catalog");
    }
    if (rc == VX_OK) transaction.Commit();
    SetUpdated_();
    return rc;
  });
}

// ---------------------------------------------------------------------------------------------
// Moving and copying files

void CVXEngine::ApplyPropertiesAndGroups_(uint32_t oid, const std::vector<CVXProperty>& properties,
                                          const std::vector<uint32_t>& groups) {
  unsigned rc;
  if (!properties.empty() && (rc = SetImageProperties(oid, properties)) != VX_OK) {
    VX_ERROR(log_, rc, "Taking over properties");
  }
  if ((rc = catalog_.SetFileGroups(oid, groups, false)) != VX_OK) {
    VX_ERROR(log_, rc, "Taking over categories");
  }
}

// A file that a move or copy replaced has left the catalog; its data in the other stores goes
// after it. The test guards against a catalog that kept it after all.
unsigned CVXEngine::MoveFile(uint32_t oid, uint32_t folderOid, const std::string& name,
                             bool takeOverTarget) {
  return Framed_("MoveFile", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    std::string effective = name;
    if (auto file = catalog_.Files().find(oid); name.empty() && file != catalog_.Files().end()) {
      effective = file->second.Name();
    }
    uint32_t target = FindFileInFolder_(folderOid, effective, oid);
    std::vector<CVXProperty> properties;
    std::vector<uint32_t> groups;
    if (takeOverTarget && target) {
      if ((rc = propDB_->GetRecord(VX_IMAGE_PROPERTIES_TABLE, target, properties)) != VX_OK) {
        VX_ERROR(log_, rc, "Reading properties of the replaced file");
        takeOverTarget = false;
      }
      catalog_.GetFileGroups(target, groups);
    }
    if ((rc = catalog_.MoveFile(oid, folderOid, name)) == VX_OK) {
      if (takeOverTarget && target) ApplyPropertiesAndGroups_(oid, properties, groups);
      if (target && catalog_.IsUniqueFileOID(target)) RemoveDependendItems(target);
    }
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::CopyFile(uint32_t oid, uint32_t folderOid, unsigned long& newOid,
                             const std::string& name, bool takeOverTarget) {
  return Framed_("CopyFile", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    newOid = 0;
    SetUpdated_();
    try {
      rc = CopyFile_(oid, folderOid, newOid, name, takeOverTarget);
    } catch (...) {
      rc = VXCodeOfCurrentException(log_, __LINE__, __FILE__);
    }
    if (rc != VX_OK && newOid != 0) {
      // No half copy stays: the record goes first, then what was written for it.
      catalog_.RemoveFile(static_cast<uint32_t>(newOid));
      RemoveDependendItems(static_cast<uint32_t>(newOid));
      newOid = 0;
    }
    SetUpdated_();
    return rc;
  });
}

void CVXEngine::CopyDependents_(uint32_t from, uint32_t to, bool skipProperties) {
  SVXDBRec_3 shape;
  unsigned rc = matchDB_.GetExact(Sel(kShapeRecord, from), &shape, sizeof shape);
  if (rc == VX_OK) rc = matchDB_.Set(Sel(kShapeRecord, to), &shape, sizeof shape);
  if (rc != VX_OK) VX_ERROR(log_, rc, "Setting new file");
  CVXThumb thumb;
  if (ReadThumb_(from, thumb) == VX_OK && (rc = AddThumb(to, thumb)) != VX_OK) VX_THROW(rc);
  std::vector<CVXProperty> row;
  unsigned long key = to;
  if (!skipProperties && propDB_->GetRecord(VX_IMAGE_PROPERTIES_TABLE, from, row) == VX_OK &&
      (rc = propDB_->AddRecord(VX_IMAGE_PROPERTIES_TABLE, key, row, true)) != VX_OK) {
    VX_THROW(rc);
  }
  xmpDB_->Copy(from, to);  // fails only when the source has no XMP data to copy
}

// The copy's data is written under the OID that the catalog is about to give it (the next of
// its counter, under our lock), so that the new catalog record is the last write.
unsigned CVXEngine::CopyFile_(uint32_t oid, uint32_t folderOid, unsigned long& newOid,
                              const std::string& name, bool takeOverTarget) {
  auto source = catalog_.Files().find(oid);
  bool known = source != catalog_.Files().end() && catalog_.Folders().count(folderOid) != 0;
  std::string effective = name.empty() && known ? source->second.Name() : name;
  uint32_t target = known ? FindFileInFolder_(folderOid, effective, 0) : 0;
  std::vector<CVXProperty> properties;
  std::vector<uint32_t> groups;
  if (takeOverTarget && target &&
      propDB_->GetRecord(VX_IMAGE_PROPERTIES_TABLE, target, properties) != VX_OK) {
    takeOverTarget = false;
  }
  bool takeOver = takeOverTarget && target;
  if (takeOver || !takeOverTarget) catalog_.GetFileGroups(takeOver ? target : oid, groups);
  uint32_t expected = catalog_.Header().LastFileOid + 1;
  try {
    if (known) ClearLeftovers_(expected);
    if (known) CopyDependents_(oid, expected, takeOver);
  } catch (...) {
    RemoveDependendItems(expected);
    throw;
  }
  unsigned rc = catalog_.CopyFile(oid, folderOid, newOid, name);
  if (rc != VX_OK || newOid != expected) {
    if (known) RemoveDependendItems(expected);
    if (rc != VX_OK) return rc;
    VX_ERROR(log_, VX_INDEX_CORRUPTED, "Index corrupted. Run Diagnosis & Repair!");
    return VX_INDEX_CORRUPTED;
  }
  CVXCatFile file;
  if (catalog_.LookupFile(oid, file) != VX_OK || catalog_.LookupFile(expected, file) != VX_OK) {
    VX_LOG(log_, 3, "Getting original file");
  }
  if (target && catalog_.IsUniqueFileOID(target)) RemoveDependendItems(target);
  ApplyPropertiesAndGroups_(expected, takeOver ? properties : std::vector<CVXProperty>{}, groups);
  return VX_OK;
}

// ---------------------------------------------------------------------------------------------
// Changing and reading files

unsigned CVXEngine::SetFile(CVXCatFile& file) {
  return Framed_("SetFile", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    rc = catalog_.UpdateFile(file);
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::SetFile(CVXCatFile& file, const CVXBitmap* bitmap, uint32_t crc) {
  return Framed_("SetFile", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    // Shape data is written only for a file the catalog knows.
    if (bitmap && catalog_.IsUniqueFileOID(file.Oid())) {
      rc = VX_NOT_FOUND;
    } else if (bitmap && (rc = ProcessFile(file, *bitmap, true, crc)) != VX_OK) {
      VX_ERROR(log_, rc, "Processing file in SetFile");
    } else {
      rc = catalog_.UpdateFile(file);
    }
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::RenameFile(uint32_t oid, const std::string& name) {
  return Framed_("RenameFile", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    rc = catalog_.RenameFile(oid, name);
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::GetFile(uint32_t oid, CVXCatFile& file) {
  return Framed_("GetFile", true, [&] {
    unsigned rc = catalog_.LookupFile(oid, file);
    if (rc != VX_OK) {
      char text[64];
      std::snprintf(text, sizeof text, "Err %lu, OID searched: %lu", static_cast<unsigned long>(rc),
                    static_cast<unsigned long>(oid));
      VX_WARN(log_, text);
    }
    return rc;
  });
}

unsigned CVXEngine::GetFiles(const uint32_t* oids, size_t count, std::vector<CVXCatFile>& files,
                             std::vector<unsigned>& codes) {
  files.resize(count);
  codes.resize(count);
  return Framed_("GetFiles", true, [&] {
    catalog_.LookupFiles(oids, count, files.data(), codes.data());
    return VX_OK;
  });
}

unsigned CVXEngine::GetFiles(CBitVector& bits) {
  return Framed_("GetFiles", true, [&] { return catalog_.GetFiles(bits); });
}

unsigned CVXEngine::GetFileGroups(uint32_t oid, std::vector<uint32_t>& groups) {
  return Framed_("GetFileGroups", true, [&] { return catalog_.GetFileGroups(oid, groups); });
}

unsigned CVXEngine::GetFileGroups(const std::vector<uint32_t>& oids,
                                  std::vector<uint32_t>& groups) {
  return Framed_("GetFileGroups", true, [&] { return catalog_.GetFileGroups(oids, groups); });
}

unsigned CVXEngine::ReorderGroup(uint32_t oid, uint32_t targetOid, bool before) {
  return Framed_("ReorderGroup", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    rc = catalog_.ReorderGroup(oid, targetOid, before);
    SetUpdated_();
    return rc;
  });
}

// ---------------------------------------------------------------------------------------------
// Folders

unsigned CVXEngine::AddFolder(CVXFolder& folder) {
  VX_LOGF(log_, 3, "  %s Media-ID: %s, Serial %s", folder.URI().AsString().c_str(),
          folder.MediaID().c_str(), folder.MediaSerial().c_str());
  return Framed_("AddFolder", true, [&] {
    unsigned rc = CheckMutable_(kFolderSpace);
    if (rc != VX_OK) return rc;
    SetUpdated_();
    // Same medium (any serial when the new folder has none), same kind, same location.
    uint32_t match = catalog_.LookupFolder(folder.URI(), folder.MediaID(), folder.MediaSerial());
    if (match != 0) {
      VX_LOGF(log_, 3, "Folder already in database. OID is %lu", static_cast<unsigned long>(match));
      folder.Oid() = match;
      if ((rc = catalog_.UpdateFolder(folder)) == VX_NOT_FOUND) {
        VX_ERROR(log_, rc, "Update failed with invalid OID");
      }
    } else {
      VX_LOG(log_, 3, "New Folder");
      folder.Oid() = catalog_.GenerateFolderOID();
      rc = catalog_.AddFolder(folder);
    }
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::GetFolder(uint32_t oid, CVXFolder& folder) {
  return Framed_("GetFolder", true, [&] { return catalog_.LookupFolder(oid, folder); });
}

unsigned CVXEngine::SetFolder(const CVXFolder& folder) {
  return Framed_("SetFolder", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    rc = catalog_.UpdateFolder(folder);
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::RenameFolder(uint32_t oid, const CVXURI& uri, const std::string& mediaId,
                                 const std::string& mediaSerial) {
  return Framed_("RenameFolder", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    rc = catalog_.RenameFolder(oid, uri, mediaId, mediaSerial);
    SetUpdated_();
    return rc;
  });
}

unsigned CVXEngine::GetFolderFiles(uint32_t oid, std::vector<uint32_t>& files, bool recursive) {
  return Framed_("GetFolderFiles", true,
                 [&] { return catalog_.GetFolderFiles(oid, files, recursive); });
}

unsigned CVXEngine::GetFolderChildren(uint32_t oid, std::vector<uint32_t>& children,
                                      bool recursive) {
  return Framed_("GetFolderChildren", true,
                 [&] { return catalog_.GetFolderChildren(oid, children, recursive); });
}
