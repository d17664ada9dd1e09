#include "VXEngine.h"

#include <algorithm>
#include <functional>

#include "VXException.h"
#include "VXLog.h"
#include "VXMemFile.h"
#include "VXPropDB.h"
#include "VXResult.h"
#include "VXXMPDB.h"
#include "xstring.h"

namespace {

constexpr uint16_t kShapeRecord = 2;
constexpr uint32_t kStatsVersion = 768;
constexpr uint64_t kFileDiskSpace = 0x80000;

using SetOf = std::function<unsigned(uint32_t oid, CBitVector& set)>;

// Folds the set of every OID into `out`. The first set is united into the empty result unless
// `intersectFirst`; with soIntersect each later one is intersected, otherwise united.
unsigned CombineSets(const std::vector<uint32_t>& oids, CVXEngine::ESelectOp op,
                     bool intersectFirst, CBitVector& out, const SetOf& setOf) {
  bool first = true;
  for (uint32_t oid : oids) {
    CBitVector set;
    if (unsigned rc = setOf(oid, set); rc != VX_OK) {
      out.Clear();
      return rc;
    }
    if (op == CVXEngine::soIntersect && (!first || intersectFirst)) {
      out &= set;
    } else {
      out |= set;
    }
    first = false;
  }
  return VX_OK;
}

// 10124 when one of `siblings` is named `name` exactly, with case; 10020 when one is missing.
unsigned SiblingNamed(const CVXCatalog& catalog, const std::vector<uint32_t>& siblings,
                      const std::string& name) {
  for (uint32_t oid : siblings) {
    CVXGroup sibling;
    if (catalog.LookupGroup(oid, sibling) != VX_OK) return VX_NOT_FOUND;
    if (sibling.Name() == name) return VX_NAME_USED;
  }
  return VX_OK;
}

// Runs `body`, turning an exception into its code, for operations outside the usual frame.
template <typename Body>
unsigned Guarded(CQRLLogfile* log, Body&& body) {
  try {
    return body();
  } catch (...) {
    return VXCodeOfCurrentException(log, __LINE__, __FILE__);
  }
}

// A closed store reports -1 or 0; the statistics show 0 for both.
int64_t StoreSize(int64_t size) { return std::max<int64_t>(size, 0); }

}  // namespace

// ---------------------------------------------------------------------------------------------
// Names

bool CVXEngine::IsValidName(const std::string& name) {
  if (name.empty()) return false;
  // None of the refused characters has a case; the check runs on the folded form all the same,
  // as every name comparison of the catalog does.
  const std::string folded = _mbsupr(name);
  return folded.find_first_of("\"@\\|/") == std::string::npos;
}

unsigned CVXEngine::IsValidSelectionTemplateName(const std::string& name) const {
  return IsValidName(name) ? VX_OK : VX_INVALID_NAME;
}

unsigned CVXEngine::IsValidGroupName(const std::string& name, uint32_t parentOid) {
  return Framed_("IsValidGroupName", true, [&]() -> unsigned {
    // "." joins full names; the others are operators of the formula language.
    if (!IsValidName(name) || name.find_first_of("=.;[]@<>") != std::string::npos) {
      return VX_INVALID_NAME;
    }
    std::vector<uint32_t> siblings;
    if (parentOid == 0) {
      for (const auto& [oid, group] : catalog_.Groups()) {
        if (group.Parent() == 0) siblings.push_back(oid);
      }
    } else {
      CVXGroup parent;
      if (catalog_.LookupGroup(parentOid, parent) != VX_OK) return VX_NOT_FOUND;
      siblings = parent.Children();
    }
    return SiblingNamed(catalog_, siblings, name);
  });
}

// ---------------------------------------------------------------------------------------------
// Selections over the catalog

unsigned CVXEngine::SelectCategories(const std::vector<uint32_t>& groups, ESelectOp op,
                                     CBitVector& out) {
  out.Clear();
  return Framed_("SelectCategories", true, [&]() -> unsigned {
    if (!IsOpen()) return VX_NOT_OPEN;
    return CombineSets(groups, op, false, out, [this](uint32_t oid, CBitVector& set) {
      std::vector<uint32_t> files;
      unsigned rc = catalog_.GetGroupImages(oid, files);
      for (uint32_t file : files) set.Set(file);
      return rc;
    });
  });
}

unsigned CVXEngine::SelectFolders(const std::vector<uint32_t>& folders, ESelectOp op,
                                  bool recursive, CBitVector& out) {
  out.Clear();
  return Framed_("SelectFolders", true, [&]() -> unsigned {
    if (!IsOpen()) return VX_NOT_OPEN;
    return CombineSets(folders, op, true, out, [&](uint32_t oid, CBitVector& set) {
      return catalog_.GetFolderFiles(oid, set, recursive);
    });
  });
}

unsigned CVXEngine::SelectFileFormats(const CBitVector& formats, CBitVector& out) {
  out.Clear();
  return Framed_("SelectFileFormats", true, [&]() -> unsigned {
    return IsOpen() ? catalog_.GetFilesForFormat(formats, out) : VX_NOT_OPEN;
  });
}

unsigned CVXEngine::SelectCRC(uint32_t crc, CBitVector& out) {
  out.Clear();
  return Framed_("SelectCRC", true, [&]() -> unsigned {
    return IsOpen() ? catalog_.GetFilesForCRC(crc, 0, out) : VX_NOT_OPEN;
  });
}

unsigned CVXEngine::SelectByOrientation(bool portrait, CBitVector& out) {
  out.Clear();
  return Framed_("SelectByOrientation", true, [&]() -> unsigned {
    return IsOpen() ? catalog_.GetFilesForOrientation(portrait, out) : VX_NOT_OPEN;
  });
}

// ---------------------------------------------------------------------------------------------
// Sort arrays. The sorter calls these for every sort; they keep out of the log unless something
// is wrong, and a missing array is an ordinary answer.

unsigned CVXEngine::UpdateSortArray(const CQRLBlobDB::SSelector& sel,
                                    const std::vector<uint32_t>& oids) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  unsigned rc = Guarded(log_, [&] {
    CVXMemFile mem(false, 0x20000, 4096);
    mem << static_cast<uint32_t>(oids.size());
    mem.Write(oids.data(), oids.size() * sizeof(uint32_t));
    return sortDB_.Set(sel, mem.GetBuffer(), static_cast<unsigned>(mem.GetFileSize()), 0);
  });
  if (rc != VX_OK) VX_ERROR(log_, rc, "VXEngine::UpdateSortArray");
  return rc;
}

unsigned CVXEngine::GetSortArray(const CQRLBlobDB::SSelector& sel, std::vector<uint32_t>& oids) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  oids.clear();
  CVXMemFile mem;
  if (unsigned rc = sortDB_.Get(sel, mem); rc != VX_OK) return rc;
  unsigned rc = Guarded(log_, [&]() -> unsigned {
    uint32_t count = 0;
    mem >> count;
    // A damaged count must not make us allocate for OIDs that the record does not hold.
    if (uint64_t{count} * sizeof(uint32_t) > mem.Remaining()) VX_THROW(VX_NOT_FOUND);
    oids.resize(count);
    mem.Read(oids.data(), oids.size() * sizeof(uint32_t));
    return VX_OK;
  });
  if (rc != VX_OK) oids.clear();
  return rc;
}

unsigned CVXEngine::RemoveSortArray(const CQRLBlobDB::SSelector& sel) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  unsigned rc = sortDB_.Remove(sel);
  if (rc != VX_OK && rc != VX_NOT_FOUND) VX_ERROR(log_, rc, "VXEngine::RemoveSortArray");
  return rc;
}

// ---------------------------------------------------------------------------------------------
// Statistics and file locations

unsigned CVXEngine::GetStats(SVXStats& stats) {
  stats = SVXStats{};
  return Framed_("GetStats", true, [&]() -> unsigned {
    if (!IsOpen()) return VX_NOT_OPEN;
    // Without a property store there is nothing to count, and no size either.
    unsigned properties = 0;
    const bool hasProperties = propDB_->IsOpen();
    if (hasProperties) {
      unsigned rc = propDB_->GetRecordCount(VX_IMAGE_PROPERTIES_TABLE, properties);
      if (rc != VX_OK) return rc;
    }
    stats.Version = kStatsVersion;
    stats.Files = static_cast<uint32_t>(catalog_.NumberOfFiles());
    stats.Folders = static_cast<uint32_t>(catalog_.NumberOfFolders());
    stats.Groups = static_cast<uint32_t>(catalog_.NumberOfGroups());
    stats.Properties = properties;
    stats.LastUpdate = coreInfo_.LastUpdate;
    for (const auto& entry : catalog_.Files()) stats.FileBytes += entry.second.Properties().Size;
    stats.MatchDBSize = StoreSize(matchDB_.GetFileSize());
    stats.CatalogDBSize = StoreSize(catalog_.BlobDB().GetFileSize());
    stats.ThumbDBSize = StoreSize(thumbDB_.GetFileSize());
    stats.PropDBSize = hasProperties ? StoreSize(propDB_->BlobDB().GetFileSize()) : 0;
    stats.XMPDBSize = StoreSize(xmpDB_->GetFileSize());
    return VX_OK;
  });
}

unsigned CVXEngine::GetFileURI(uint32_t oid, CVXURI& uri) {
  return Framed_("GetFileURI", true, [&]() -> unsigned {
    return IsOpen() ? catalog_.GetFileURI(oid, uri) : VX_NOT_OPEN;
  });
}

unsigned CVXEngine::GetFileFolder(uint32_t oid, unsigned long& folder) {
  folder = 0;
  return Framed_("GetFileFolder", true, [&]() -> unsigned {
    return IsOpen() ? catalog_.GetFileFolder(oid, folder) : VX_NOT_OPEN;
  });
}

// ---------------------------------------------------------------------------------------------
// Read order

unsigned CVXEngine::OptimizeForSequentialAccess(CQRLBlobDB& store, uint16_t type,
                                                std::vector<uint32_t>& oids) {
  return Framed_("OptimizeForSequentialAccess", true,
                 [&]() -> unsigned { return store.OptimizeOidsForSequentialAccess(type, oids); });
}

unsigned CVXEngine::OptimizeForSequentialAccess(CQRLBlobDB& store, uint16_t type,
                                                const CBitVector& bits,
                                                std::vector<uint32_t>& oids) {
  bits.Convert(oids);
  return OptimizeForSequentialAccess(store, type, oids);
}

unsigned CVXEngine::OptimizeShapeDataAccess(std::vector<uint32_t>& oids) {
  return OptimizeForSequentialAccess(matchDB_, kShapeRecord, oids);
}

unsigned CVXEngine::OptimizeShapeDataAccess(const CBitVector& bits, std::vector<uint32_t>& oids) {
  return OptimizeForSequentialAccess(matchDB_, kShapeRecord, bits, oids);
}

// ---------------------------------------------------------------------------------------------
// Categories and folders, forwarded to the catalog

unsigned CVXEngine::AddGroup(CVXGroup& group) {
  return Framed_("AddGroup", true, [&]() -> unsigned {
    if (unsigned rc = CheckMutable_(kFileDiskSpace); rc != VX_OK) return rc;
    SetUpdated_();
    group.Oid() = catalog_.GenerateGroupOID();
    return catalog_.AddGroup(group);
  });
}

unsigned CVXEngine::RemoveGroup(uint32_t oid) {
  return Framed_("RemoveGroup", true, [&]() -> unsigned {
    if (unsigned rc = CheckMutableNoDisk_(); rc != VX_OK) return rc;
    SetUpdated_();
    return catalog_.RemoveGroup(oid);
  });
}

unsigned CVXEngine::SetGroup(const CVXGroup& group) {
  return Framed_("SetGroup", true, [&]() -> unsigned {
    if (unsigned rc = CheckMutableNoDisk_(); rc != VX_OK) return rc;
    SetUpdated_();
    return catalog_.UpdateGroup(group);
  });
}

unsigned CVXEngine::GetGroup(uint32_t oid, CVXGroup& group) {
  return Framed_("GetGroup", true, [&] { return catalog_.LookupGroup(oid, group); });
}

unsigned CVXEngine::GetGroupImages(uint32_t oid, std::vector<uint32_t>& files) {
  return Framed_("GetGroupImages", true, [&] { return catalog_.GetGroupImages(oid, files); });
}

unsigned CVXEngine::GetFullGroupName(uint32_t oid, std::string& name) {
  return Framed_("GetFullGroupName", true, [&] { return catalog_.GetFullGroupName(oid, name); });
}

unsigned CVXEngine::GetGroupReferrers(uint32_t oid, unsigned refType,
                                      std::vector<uint32_t>& groups) {
  return Framed_("GetGroupReferrers", true,
                 [&] { return catalog_.GetGroupReferrers(oid, refType, groups); });
}

unsigned CVXEngine::GetGroupChildrenRecursive(uint32_t oid, std::vector<uint32_t>& children) {
  return Framed_("GetGroupChildrenRecursive", true,
                 [&] { return catalog_.GetGroupChildrenRecursive(oid, children); });
}

unsigned CVXEngine::GroupDependsOn(uint32_t oid, uint32_t otherOid, bool& depends) {
  return Framed_("GroupDependsOn", true,
                 [&] { return catalog_.GroupDependsOn(oid, otherOid, depends); });
}

unsigned CVXEngine::GetRootFolders(std::vector<uint32_t>& folders) {
  return Framed_("GetRootFolders", true, [&] { return catalog_.GetRootFolders(folders); });
}

unsigned CVXEngine::GetFolders(std::vector<uint32_t>& folders) {
  return Framed_("GetFolders", true, [&] { return catalog_.GetFolders(folders); });
}

unsigned CVXEngine::GetGroups(std::vector<uint32_t>& groups) {
  return Framed_("GetGroups", true, [&] { return catalog_.GetGroups(groups); });
}

unsigned CVXEngine::RemoveFileTransform(uint32_t oid) {
  return Framed_("RemoveFileTransform", true, [&] { return catalog_.RemoveFileTransform(oid); });
}

unsigned CVXEngine::ClearDynamicGroup(uint32_t oid) {
  return Framed_("ClearDynamicGroup", true, [&]() -> unsigned {
    if (catalog_.BlobDB().IsReadOnly()) return VX_OK;
    return catalog_.ClearDynamicGroup(oid);
  });
}
