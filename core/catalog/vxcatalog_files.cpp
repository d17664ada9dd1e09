// File operations of the catalog. Every mutating operation runs in the frame and writes each
// changed record through to the store before it returns.

#include <ctime>

#include "VXEngine.h"
#include "VXGroupParser.h"
#include "VXURI.h"
#include "VXXMPDB.h"
#include "vxcatalog_frame.h"
#include "xstring.h"

namespace {

// Grows `bits` with a margin before setting an OID beyond its size, as the bulk filters do.
void SetWithMargin(CBitVector& bits, uint32_t oid, bool bulk) {
  if (bulk) {
    bits.SetBulk(oid);
  } else {
    bits.Set(oid);
  }
}

// The files an XMP lookup names (it answers 0 on success); with `complement`, all the other
// files of the catalog instead.
template <typename Lookup>
unsigned XMPFiles(CVXCatalog& catalog, bool complement, Lookup lookup, CBitVector& bits) {
  std::vector<uint32_t> oids;
  if (lookup(oids) != 0) return VX_FORMULA_OPERAND_FAILED;
  if (complement) catalog.GetFiles(bits);
  for (uint32_t oid : oids) {
    if (complement) {
      bits.Reset(oid);
    } else {
      bits.Set(oid);
    }
  }
  return VX_OK;
}

}  // namespace

CVXCatFile* CVXCatalog::GetFile(uint32_t oid) {
  auto it = files_.find(oid);
  return it == files_.end() ? nullptr : &it->second;
}

CVXFolder* CVXCatalog::GetFolder(uint32_t oid) {
  auto it = folders_.find(oid);
  return it == folders_.end() ? nullptr : &it->second;
}

const CVXFolder* CVXCatalog::GetFolder(uint32_t oid) const {
  auto it = folders_.find(oid);
  return it == folders_.end() ? nullptr : &it->second;
}

unsigned CVXCatalog::RemoveRecord_(ERecordType type, uint32_t oid) {
  return store_.Remove(CQRLBlobDB::SSelector(type, oid));
}

unsigned CVXCatalog::CountRecords_(ERecordType type, unsigned& count) {
  count = 0;
  return store_.GetNumberOfRecords(type, count);
}

// ---- Lookups

unsigned CVXCatalog::LookupFile(uint32_t oid, CVXCatFile& out) const {
  auto it = files_.find(oid);
  if (it == files_.end()) return VX_NOT_FOUND;
  out = it->second;
  return VX_OK;
}

void CVXCatalog::LookupFiles(const uint32_t* oids, size_t count, CVXCatFile* files,
                             unsigned* codes) const {
  auto it = files_.end();
  for (size_t i = 0; i < count; ++i) {
    // The next record along the map is most often the one asked for: no search then.
    if (it != files_.end()) ++it;
    if (it == files_.end() || it->first != oids[i]) it = files_.find(oids[i]);
    codes[i] = it == files_.end() ? VX_NOT_FOUND : VX_OK;
    if (codes[i] == VX_OK) files[i] = it->second;
  }
}

unsigned CVXCatalog::GetFileURI(uint32_t oid, CVXURI& out) const {
  auto it = files_.find(oid);
  if (it == files_.end()) return VX_NOT_FOUND;
  const CVXFolder* folder = GetFolder(it->second.Properties().Folder);
  if (!folder) return VX_NOT_FOUND;
  out.Set(folder->URI().AsString() + it->second.Name(), false);
  return VX_OK;
}

unsigned CVXCatalog::GetFileFolder(uint32_t oid, unsigned long& folder) const {
  folder = 0;
  auto it = files_.find(oid);
  if (it == files_.end()) return VX_NOT_FOUND;
  folder = it->second.Properties().Folder;
  return VX_OK;
}

uint32_t CVXCatalog::LookupFile(const std::string& name, uint32_t folderOid) const {
  const CVXFolder* folder = GetFolder(folderOid);
  if (!folder) return 0;
  for (uint32_t oid : folder->Files()) {
    auto it = files_.find(oid);
    if (it != files_.end() && _mbsicmp(it->second.Name().c_str(), name.c_str()) == 0) return oid;
  }
  return 0;
}

// Trusts the caller's folder: every OID in its list is taken to have a record.
uint32_t CVXCatalog::FolderLookupFile(const CVXFolder& folder, const std::string& name) const {
  for (uint32_t oid : folder.Files()) {
    if (_mbsicmp(files_.at(oid).Name().c_str(), name.c_str()) == 0) return oid;
  }
  return 0;
}

unsigned CVXCatalog::LookupFile(uint32_t crc, const std::string& mediaID,
                                const std::string& mediaSerial, std::vector<uint32_t>& out) const {
  out.clear();
  for (const auto& [oid, file] : files_) {
    if (file.Properties().CRC != crc) continue;
    if (!mediaSerial.empty()) {
      const CVXFolder* folder = GetFolder(file.Properties().Folder);
      if (!folder || folder->MediaID() != mediaID || folder->MediaSerial() != mediaSerial) {
        continue;
      }
    }
    out.push_back(oid);
  }
  return VX_OK;
}

// ---- Sets of files

unsigned CVXCatalog::GetFiles(CBitVector& bits) const {
  bits.Clear();
  for (const auto& entry : files_) SetWithMargin(bits, entry.first, true);
  return VX_OK;
}

unsigned CVXCatalog::GetFilesForFormat(const CBitVector& formats, CBitVector& bits) const {
  bits.Clear();
  if (formats.IsEmpty()) return VX_OK;
  for (const auto& [oid, file] : files_) {
    uint32_t format = file.Properties().Format;
    if (format < formats.Size() && formats.Get(format)) SetWithMargin(bits, oid, true);
  }
  return VX_OK;
}

unsigned CVXCatalog::GetFilesForCRC(uint32_t crc, uint32_t size, CBitVector& bits) const {
  bits.Clear();
  for (const auto& [oid, file] : files_) {
    const CVXCatFile::SData& d = file.Properties();
    if (d.CRC == crc && (size == 0 || d.Size == size)) SetWithMargin(bits, oid, false);
  }
  return VX_OK;
}

unsigned CVXCatalog::GetFilesForOrientation(bool portrait, CBitVector& bits) const {
  bits.Clear();
  for (const auto& [oid, file] : files_) {
    if (portrait ? file.IsPortrait() : file.IsLandscape()) SetWithMargin(bits, oid, false);
  }
  return VX_OK;
}

// Ratings come from the XMP database; rank 0 means "no rank stored", the complement of the
// files that have one.
unsigned CVXCatalog::GetRank(int32_t rank, CBitVector& bits) {
  bits.Clear();
  if (!engine_) return VX_FORMULA_OPERAND_FAILED;
  CVXXMPDB& xmp = engine_->XMPDB();
  if (rank != 0) {
    return XMPFiles(
        *this, false, [&](auto& oids) { return xmp.GetOidsForRank(rank, oids); }, bits);
  }
  return XMPFiles(
      *this, true, [&](auto& oids) { return xmp.GetOidsWithRank(oids); }, bits);
}

unsigned CVXCatalog::GetLabel(const char* label, CBitVector& bits) {
  bits.Clear();
  if (!engine_) return VX_FORMULA_OPERAND_FAILED;
  CVXXMPDB& xmp = engine_->XMPDB();
  if (label && *label) {
    return XMPFiles(
        *this, false, [&](auto& oids) { return xmp.GetOidsForLabel(label, oids); }, bits);
  }
  return XMPFiles(
      *this, true, [&](auto& oids) { return xmp.GetOidsWithLabel(oids); }, bits);
}

// ---- Changing files

void CVXCatalog::InternalAddFile(uint32_t oid, uint32_t folderOid, CVXCatFile& file) {
  VX_LOG(Log_(), 4, "+ CVXCatalog::InternalAddFile");
  file.Properties().Folder = folderOid;
  unsigned rc = VX_OK;
  CVXFolder* folder = GetFolder(folderOid);
  if (!folder) {
    rc = VX_NOT_FOUND;
  } else if (auto it = files_.find(oid); it != files_.end()) {
    CVXCatFile before = it->second;
    it->second = file;
    if ((rc = StoreFile(oid)) != VX_OK) it->second = before;
  } else {
    files_.emplace(oid, file);
    if ((rc = StoreFile(oid)) != VX_OK) {
      RemoveRecord_(rtFile, oid);
      files_.erase(oid);
    }
  }
  if (rc != VX_OK) {
    VX_ERROR(Log_(), rc, "InternalAddFile");
    VX_THROW(rc);
  }
  if (folder->Thumbnail() == 0) {
    folder->Thumbnail() = oid;
    StoreFolder(folderOid);
  }
  VX_LOG(Log_(), 4, "- CVXCatalog::InternalAddFile");
}

void CVXCatalog::InternalRemoveFile(uint32_t oid) {
  if (files_.count(oid) == 0) VX_THROW(VX_NOT_FOUND);
  if (unsigned rc = RemoveRecord_(rtFile, oid); rc != VX_OK) VX_THROW(rc);
  files_.erase(oid);
}

unsigned CVXCatalog::AddFile(uint32_t folderOid, const CVXCatFile& file) {
  return Frame_("AddFile", 3, &file.Name(), hOuterLevels, [&]() -> unsigned {
    CVXFolder* folder = GetFolder(folderOid);
    if (!folder) return VX_NOT_FOUND;
    CVXCatFile copy = file;
    InternalAddFile(file.Oid(), folderOid, copy);
    folder->AddFile(file.Oid());
    if (unsigned rc = StoreFolder(folderOid); rc != VX_OK) {
      VX_ERROR(Log_(), rc, "AddFile: storing folder");
      folder->RemoveFile(file.Oid());
      RemoveFile(file.Oid());
      return rc;
    }
    if (persSelDirty_) InvalidatePersistantSelections(nullptr);
    return VX_OK;
  });
}

unsigned CVXCatalog::UpdateFile(const CVXCatFile& file) {
  return Frame_("UpdateFile", 3, &file.Name(), hAllLevels, [&]() -> unsigned {
    CVXCatFile* record = GetFile(file.Oid());
    if (!record) return VX_NOT_FOUND;
    uint32_t oldCRC = record->Properties().CRC;
    CVXFolder* folder = GetFolder(file.Properties().Folder);
    if (!folder) {
      VX_ERROR(Log_(), VX_NOT_FOUND, "Updated file without folder");
      return VX_OK;
    }
    folder->Touch();
    if (unsigned rc = StoreFolder(file.Properties().Folder); rc != VX_OK) return rc;
    CVXCatFile before = *record;
    *record = file;
    if (unsigned rc = StoreFile(file.Oid()); rc != VX_OK) {
      *record = before;
      return rc;
    }
    // A new CRC means new content: every clean persistent selection must be evaluated again.
    // A change of size alone invalidates nothing.
    if (oldCRC == file.Properties().CRC) return VX_OK;
    unsigned count = 0;
    if (unsigned rc = CountRecords_(rtPersSel, count); rc != VX_OK) return rc;
    if (count > 0) MarkPersistantSelectionsDirty_();
    return VX_OK;
  });
}

unsigned CVXCatalog::RemoveFile(uint32_t oid) {
  return Frame_("RemoveFile", 3, nullptr, hAllLevels, [&]() -> unsigned {
    CVXCatFile* record = GetFile(oid);
    if (!record) return VX_NOT_FOUND;
    uint32_t folderOid = record->Properties().Folder;
    if (folderOid != 0) {
      if (CVXFolder* folder = GetFolder(folderOid)) {
        folder->RemoveFile(oid);
        if (unsigned rc = StoreFolder(folderOid); rc != VX_OK) return rc;
      }
    } else {
      VX_ERROR(Log_(), VX_NOT_FOUND, "Unlinked file found");
    }
    for (auto& [goid, group] : groups_) {
      if (oid >= group.Images().Size() || !group.Images().Get(oid)) continue;
      group.RemoveImage(oid);
      if (unsigned rc = StoreGroup(goid); rc != VX_OK) {
        VX_ERROR(Log_(), rc, "RemoveFile: storing group");
        VX_WARN(Log_(), "Cannot update group after file remove!");
        return rc;
      }
    }
    if (unsigned rc = RemoveRecord_(rtFile, oid); rc != VX_OK) return rc;
    files_.erase(oid);
    RemoveFileTransform(oid);
    unsigned count = 0;
    unsigned rc = CountRecords_(rtPersSel, count);
    if (rc == VX_OK && count > 0) RemoveFileFromPersistantSelections_(oid);
    return rc;
  });
}

unsigned CVXCatalog::RenameFile(uint32_t oid, const std::string& newName) {
  return Frame_("RenameFile", 3, nullptr, hAllLevels, [&]() -> unsigned {
    CVXCatFile* record = GetFile(oid);
    if (!record) return VX_NOT_FOUND;
    unsigned rc = VX_OK;
    uint32_t folderOid = record->Properties().Folder;
    if (CVXFolder* folder = GetFolder(folderOid)) {
      folder->Touch();
      if ((rc = StoreFolder(folderOid)) == VX_OK) {
        std::string oldName = record->Name();
        record->Properties().Name = newName;
        if ((rc = StoreFile(oid)) != VX_OK) record->Properties().Name = oldName;
      }
    } else {
      VX_ERROR(Log_(), VX_NOT_FOUND, "Catalog::RenameFile: Failed to update folder for file");
    }
    if (persSelDirty_) InvalidatePersistantSelectionsForKey("VXSELFileName");
    return rc;
  });
}

unsigned CVXCatalog::MoveFile(uint32_t oid, uint32_t folderOid, const std::string& newName) {
  return Frame_("MoveFile", 3, nullptr, hAllLevels, [&]() -> unsigned {
    CVXCatFile* record = GetFile(oid);
    if (!record) return VX_NOT_FOUND;
    uint32_t presentOid = record->Properties().Folder;
    CVXFolder* present = GetFolder(presentOid);
    CVXFolder* target = GetFolder(folderOid);
    // A missing folder ends the move silently: the caller sees the unchanged record.
    if (!present || !target) return VX_OK;
    // Unlink first, so that a move within one folder does not meet the file itself below.
    present->RemoveFile(oid);
    const std::string name = newName.empty() ? record->Name() : newName;
    std::vector<uint32_t> targetFiles = target->Files();
    for (uint32_t other : targetFiles) {
      const CVXCatFile* o = GetFile(other);
      // A catalog cut short mid-move may list the file in both folders: it is not in its own way.
      if (!o || other == 0 || other == oid || CVXCatFile::CompareNames(o->Name(), name) != 0) {
        continue;
      }
      if (unsigned rc = RemoveFile(other); rc != VX_OK) {
        VX_ERROR(Log_(), rc, "MoveFile: removing the file in the way");
        VX_THROW(rc);
      }
      break;
    }
    record = GetFile(oid);
    record->Properties().Folder = folderOid;
    if (!newName.empty()) record->Properties().Name = newName;
    target->AddFile(oid);
    if (unsigned rc = StoreFolder(folderOid); rc != VX_OK) {
      VX_ERROR(Log_(), rc, "MoveFile: storing target folder");
      VX_THROW(rc);
    }
    if (unsigned rc = StoreFile(oid); rc != VX_OK) {
      VX_ERROR(Log_(), rc, "MoveFile: storing file");
      target->RemoveFile(oid);
      StoreFolder(folderOid);
      VX_THROW(rc);
    }
    return StoreFolder(presentOid);
  });
}

unsigned CVXCatalog::CopyFile(uint32_t oid, uint32_t folderOid, unsigned long& newOid,
                              const std::string& newName) {
  return Frame_("CopyFile", 3, nullptr, hAllLevels, [&]() -> unsigned {
    const CVXCatFile* source = GetFile(oid);
    if (!source) return VX_NOT_FOUND;
    unsigned rc = VX_NOT_FOUND;
    if (CVXFolder* target = GetFolder(folderOid)) {
      CVXCatFile copy = *source;
      if (!newName.empty()) copy.Properties().Name = newName;
      uint32_t replacedOid = 0;
      CVXCatFile replaced;
      replaced.Oid() = 0;
      for (uint32_t other : target->Files()) {
        const CVXCatFile* o = GetFile(other);
        if (o && CVXCatFile::CompareNames(o->Name(), copy.Name()) == 0) {
          replacedOid = other;
          replaced = *o;
          break;
        }
      }
      if (replacedOid != 0) {
        if ((rc = RemoveFile(replacedOid)) != VX_OK) {
          VX_ERROR(Log_(), rc, "CopyFile: removing the file in the way");
          VX_THROW(rc);
        }
      }
      uint32_t oidNew = GenerateFileOID();
      copy.Oid() = oidNew;
      newOid = oidNew;
      copy.Properties().Folder = folderOid;
      if ((rc = AddFile(folderOid, copy)) != VX_OK) {
        // Put back what the copy replaced; with nothing replaced this stores nothing useful and
        // fails quietly, as the caller's record of OID 0 is no file.
        try {
          InternalAddFile(replacedOid, folderOid, replaced);
        } catch (CVXException* e) {
          delete e;
        }
        newOid = 0;
      }
    }
    if (persSelDirty_) InvalidatePersistantSelections(nullptr);
    return rc;
  });
}
