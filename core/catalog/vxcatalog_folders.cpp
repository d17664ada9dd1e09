// Folder operations of the catalog. The hierarchy is derived from the locations: a folder's
// parent is the folder one path element up on the same medium, linked when folders appear and
// kept by these operations, with the files' Folder fields.

#include <ctime>
#include <unordered_map>

#include "VXURI.h"
#include "vxcatalog_frame.h"
#include "xstring.h"

// ---- Lookups

unsigned CVXCatalog::LookupFolder(uint32_t oid, CVXFolder& out) const {
  const CVXFolder* folder = GetFolder(oid);
  if (!folder) return VX_NOT_FOUND;
  out = *folder;
  return VX_OK;
}

uint32_t CVXCatalog::LookupFolder(const CVXURI& uri, const std::string& mediaID,
                                  const std::string& mediaSerial) const {
  for (const auto& [oid, f] : folders_) {
    if (xstring_comparenocase(mediaID, f.MediaID()) != 0) continue;
    if (!mediaSerial.empty() && xstring_comparenocase(mediaSerial, f.MediaSerial()) != 0) continue;
    if (uri.IsFolder() != f.URI().IsFolder()) continue;
    if (_mbsicmp(uri.AsString().c_str(), f.URI().AsString().c_str()) == 0) return oid;
  }
  return 0;
}

uint32_t CVXCatalog::FindParentFolder(const CVXFolder& folder) const {
  if (folder.ParentFolder() != 0) return folder.ParentFolder();
  return FindParentFolder(folder.URI(), folder.MediaID(), folder.MediaSerial());
}

uint32_t CVXCatalog::FindParentFolder(const CVXURI& uri, const std::string& mediaID,
                                      const std::string& mediaSerial) const {
  std::string text = ParentText_(uri);
  return text.empty() ? 0 : ParentOidFor_(text, mediaID, mediaSerial);
}

// The URI text one path element up: the path without its final slash, cut behind its last "/".
// Empty when there is no "/" left.
std::string CVXCatalog::ParentText_(const CVXURI& uri) {
  std::string path = CVXURI::StripTrailer(uri.URIPath());
  size_t slash = path.rfind('/');
  return slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
}

// The first folder, by OID, whose URI text is `parentText` on the medium given; the serial
// always counts here, also when empty.
uint32_t CVXCatalog::ParentOidFor_(const std::string& parentText, const std::string& mediaID,
                                   const std::string& mediaSerial) const {
  for (const auto& [oid, f] : folders_) {
    if (xstring_comparenocase(f.MediaID(), mediaID) == 0 &&
        xstring_comparenocase(f.MediaSerial(), mediaSerial) == 0 &&
        xstring_comparenocase(f.URI().AsString(), parentText) == 0) {
      return oid;
    }
  }
  return 0;
}

unsigned CVXCatalog::EnumFolders(const CVXURI& uri, std::vector<CVXFolder>& out) const {
  out.clear();
  for (const auto& [oid, f] : folders_) {
    if (f.URI().IsFolder() == uri.IsFolder() &&
        _mbsicmp(f.URI().AsString().c_str(), uri.AsString().c_str()) == 0) {
      out.push_back(f);
    }
  }
  return VX_OK;
}

unsigned CVXCatalog::GetRootFolders(std::vector<uint32_t>& out) const {
  out.clear();
  for (const auto& [oid, f] : folders_) {
    if (f.ParentFolder() == 0) out.push_back(oid);
  }
  return VX_OK;
}

unsigned CVXCatalog::GetFolders(std::vector<uint32_t>& out) const {
  out.clear();
  for (const auto& entry : folders_) out.push_back(entry.first);
  return VX_OK;
}

unsigned CVXCatalog::_RecurseFolder(uint32_t oid, CBitVector& bits) {
  const CVXFolder* folder = GetFolder(oid);
  if (!folder) return VX_NOT_FOUND;
  for (uint32_t file : folder->Files()) bits.Set(file);
  for (uint32_t child : folder->Children()) {
    if (unsigned rc = _RecurseFolder(child, bits); rc != VX_OK) return rc;
  }
  return VX_OK;
}

unsigned CVXCatalog::_RecurseFolderChildren(uint32_t oid, std::vector<uint32_t>& out) {
  out.push_back(oid);
  const CVXFolder* folder = GetFolder(oid);
  if (!folder) return VX_NOT_FOUND;
  for (uint32_t child : folder->Children()) {
    if (unsigned rc = _RecurseFolderChildren(child, out); rc != VX_OK) return rc;
  }
  return VX_OK;
}

unsigned CVXCatalog::GetFolderFiles(uint32_t oid, CBitVector& bits, bool recursive) {
  bits.Clear();
  unsigned rc = VX_OK;
  if (recursive) {
    rc = _RecurseFolder(oid, bits);
  } else if (const CVXFolder* folder = GetFolder(oid)) {
    for (uint32_t file : folder->Files()) bits.Set(file);
  } else {
    rc = VX_NOT_FOUND;
  }
  if (rc != VX_OK) VX_ERROR(Log_(), rc, "GetFolderFilesRecursive");
  return rc;
}

unsigned CVXCatalog::GetFolderFiles(uint32_t oid, std::vector<uint32_t>& out, bool recursive) {
  CBitVector bits;
  unsigned rc = GetFolderFiles(oid, bits, recursive);
  if (rc == VX_OK) bits.Convert(out);
  return rc;
}

unsigned CVXCatalog::GetFolderChildren(uint32_t oid, std::vector<uint32_t>& out, bool recursive) {
  out.clear();
  unsigned rc = VX_OK;
  if (recursive) {
    rc = _RecurseFolderChildren(oid, out);
  } else if (const CVXFolder* folder = GetFolder(oid)) {
    out = folder->Children();
  } else {
    rc = VX_NOT_FOUND;
  }
  if (rc != VX_OK) VX_ERROR(Log_(), rc, "GetFolderChildren");
  return rc;
}

uint32_t CVXCatalog::GetFolderThumb(uint32_t oid) const {
  const CVXFolder* folder = GetFolder(oid);
  if (!folder) {
    VX_ERROR(Log_(), VX_NOT_FOUND, "GetFolderThumb");
    return 0;
  }
  return folder->Thumbnail();
}

// ---- The hierarchy

// Visits folders in OID order, not by depth, so a parent added after its children picks them
// up here. A failed store of the parent stores F's record under a file's selector, which finds
// no file and writes nothing: the stored F keeps its parent link until the self test repairs it.
//
// The parent of each root is found through an index of every folder by folded medium and URI,
// built once per pass, which finds the same folder as the scan by OID of FindParentFolder: the
// pass changes no URI or medium, and the index keeps the lowest OID of equal keys.
void CVXCatalog::ConnectChildren() {
  CQRLLogfile* log = Log_();
  VX_LOG(log, 4, "+ CVXCatalog::ConnectChildren");
  auto key = [](const std::string& mediaID, const std::string& serial, const std::string& uri) {
    return xstring_foldkey(mediaID) + '\n' + xstring_foldkey(serial) + '\n' + xstring_foldkey(uri);
  };
  std::unordered_map<std::string, uint32_t> index;
  for (const auto& [oid, f] : folders_) {
    index.emplace(key(f.MediaID(), f.MediaSerial(), f.URI().AsString()), oid);
  }
  for (auto& [oid, f] : folders_) {
    if (f.ParentFolder() != 0) continue;
    uint32_t p = 0;
    if (std::string text = ParentText_(f.URI()); !text.empty()) {
      auto it = index.find(key(f.MediaID(), f.MediaSerial(), text));
      if (it != index.end()) p = it->second;
    }
    CVXFolder* parent = GetFolder(p);
    VX_LOGF(log, 4, "Connecting folder %lu(%s) to parent %lu(%s)", static_cast<unsigned long>(oid),
            f.URI().AsString().c_str(), static_cast<unsigned long>(p),
            parent ? parent->URI().AsString().c_str() : "");
    if (!parent) continue;
    f.ParentFolder() = p;
    if (unsigned rc = StoreFolder(oid); rc != VX_OK) {
      f.ParentFolder() = 0;
      VX_ERROR(log, rc, "ConnectChildren: storing folder");
    }
    parent->AddChild(oid);
    if (unsigned rc = StoreFolder(p); rc != VX_OK) {
      parent->RemoveChild(oid);
      f.ParentFolder() = 0;
      StoreFile(oid);
      VX_ERROR(log, rc, "ConnectChildren: storing parent");
    }
  }
  VX_LOG(log, 4, "- CVXCatalog::ConnectChildren");
}

// ---- Changing folders

void CVXCatalog::InternalAddFolder(uint32_t oid, const CVXFolder& folder) {
  VX_LOG(Log_(), 4, "+ CVXCatalog::InternalAddFolder");
  if (folders_.count(oid)) VX_THROW(VX_ALREADY_PRESENT);
  folders_.emplace(oid, folder);
  if (unsigned rc = StoreFolder(oid); rc != VX_OK) {
    RemoveRecord_(rtFolder, oid);
    folders_.erase(oid);
    VX_THROW(rc);
  }
  if (uint32_t parentOid = folder.ParentFolder(); parentOid != 0) {
    CVXFolder* parent = GetFolder(parentOid);
    if (parent) {
      parent->AddChild(oid);
      if (StoreFolder(parentOid) != VX_OK) parent->RemoveChild(oid);
    }
  }
  ConnectChildren();
  CVXFolder& added = folders_.at(oid);
  if (added.Thumbnail() == 0 && !added.Files().empty()) {
    added.Thumbnail() = added.Files().front();
    if (unsigned rc = StoreFolder(oid); rc != VX_OK) {
      added.Thumbnail() = 0;
      VX_ERROR(Log_(), rc, "InternalAddFolder: storing thumbnail");
    }
  }
  VX_LOG(Log_(), 4, "- CVXCatalog::InternalAddFolder");
}

void CVXCatalog::InternalRemoveFolder(uint32_t oid) {
  if (folders_.count(oid) == 0) VX_THROW(VX_NOT_FOUND);
  if (unsigned rc = RemoveRecord_(rtFolder, oid); rc != VX_OK) VX_THROW(rc);
  folders_.erase(oid);
}

namespace {

std::string FolderTitle(const CVXFolder& f) {
  return f.URI().AsString() + " (" + f.MediaID() + " " + f.MediaSerial() + ")";
}

}  // namespace

unsigned CVXCatalog::AddFolder(const CVXFolder& folder) {
  std::string title = FolderTitle(folder);
  return Frame_("AddFolder", 3, &title, hAllLevels, [&]() -> unsigned {
    if (folders_.count(folder.Oid())) return VX_ALREADY_PRESENT;
    InternalAddFolder(folder.Oid(), folder);
    return VX_OK;
  });
}

unsigned CVXCatalog::UpdateFolder(const CVXFolder& folder) {
  return Frame_("UpdateFolder", 3, &folder.URI().AsString(), hAllLevels, [&]() -> unsigned {
    CVXFolder* record = GetFolder(folder.Oid());
    if (!record) return VX_NOT_FOUND;
    *record = folder;
    record->Touch();
    ConnectChildren();
    record = GetFolder(folder.Oid());
    StoreFolder(folder.Oid());
    if (record->Thumbnail() == 0 && !record->Files().empty()) {
      record->Thumbnail() = record->Files().front();
      StoreFolder(folder.Oid());
    }
    return VX_OK;
  });
}

unsigned CVXCatalog::RemoveFolder(uint32_t oid, bool recursive) {
  const CVXFolder* found = GetFolder(oid);
  std::string title = found ? FolderTitle(*found) : std::string();
  return Frame_("RemoveFolder", 3, &title, hAllLevels, [&]() -> unsigned {
    CVXFolder* record = GetFolder(oid);
    if (!record) return VX_NOT_FOUND;
    const CVXFolder before = *record;
    // Each removal shortens the list; the first failure restores the record and ends the
    // operation, so neither loop can run forever.
    while (!GetFolder(oid)->Files().empty()) {
      if (unsigned rc = RemoveFile(GetFolder(oid)->Files().front()); rc != VX_OK) {
        *GetFolder(oid) = before;
        return rc;
      }
    }
    while (recursive && !GetFolder(oid)->Children().empty()) {
      if (unsigned rc = RemoveFolder(GetFolder(oid)->Children().front(), true); rc != VX_OK) {
        *GetFolder(oid) = before;
        return rc;
      }
    }
    uint32_t parentOid = GetFolder(oid)->ParentFolder();
    if (CVXFolder* parent = GetFolder(parentOid)) {
      parent->RemoveChild(oid);
      if (unsigned rc = StoreFolder(parentOid); rc != VX_OK) {
        parent->AddChild(oid);
        VX_ERROR(Log_(), rc, "RemoveFolder: storing parent");
        return rc;
      }
    }
    if (unsigned rc = RemoveRecord_(rtFolder, oid); rc != VX_OK) {
      VX_ERROR(Log_(), rc, "RemoveFolder: removing record");
      return rc;
    }
    folders_.erase(oid);
    ClearFolderReferences_(oid);
    return VX_OK;
  });
}

// A category whose formula names a removed folder loses its whole formula, not only that term.
// Results are not looked at: the folder is gone whatever happens to the formulas.
void CVXCatalog::ClearFolderReferences_(uint32_t folderOid) {
  std::vector<uint32_t> referrers;
  for (const auto& [goid, group] : groups_) {
    if (group.HasReference(folderOid, refFolder)) referrers.push_back(goid);
  }
  for (uint32_t goid : referrers) {
    CVXGroup copy = groups_.at(goid);
    copy.SetExpression(*this, "");
    UpdateGroup(copy);
  }
}

// ---- Renaming and merging

unsigned CVXCatalog::RenameFolder(uint32_t oid, const CVXURI& newURI, const std::string& newMediaID,
                                  const std::string& newMediaSerial) {
  CQRLLogfile* log = Log_();
  VX_LOG(log, 3, "+ CVXCatalog::RenameFolder");
  CVXFolder* folder = GetFolder(oid);
  if (!folder) return VX_NOT_FOUND;
  const CVXFolder before = *folder;
  folder->Touch();
  uint32_t target = 0;
  for (const auto& [toid, t] : folders_) {
    if (xstring_comparenocase(t.MediaID(), newMediaID) == 0 &&
        (newMediaSerial.empty() || xstring_comparenocase(t.MediaSerial(), newMediaSerial) == 0) &&
        t.URI() == newURI) {
      target = toid;
      break;
    }
  }
  if (target == oid) {
    // The same place, at most in another case: store the new spelling if there is one.
    if (folder->URI().WindowsPath() != newURI.WindowsPath()) {
      folder->URI() = newURI;
      StoreFolder(oid);
    }
    return VX_OK;
  }
  unsigned rc = VX_OK;
  bool closing = true;  // a failed merge ends without the closing line
  try {
    rc = target == 0 ? RenameToFreeTarget_(oid, newURI, newMediaID, newMediaSerial)
                     : MergeFolder_(oid, before, target, closing);
  } catch (...) {
    rc = VXCodeOfCurrentException(log, __LINE__, __FILE__);
  }
  if (!closing) return rc;
  if (rc != VX_OK) VX_ERROR(log, rc, "");
  VX_LOG(log, 3, "- CVXCatalog::RenameFolder");
  return rc;
}

// Renames each child that has a record to `base` plus its own last name, on the medium given.
// Returns the first failure; the free-target move logs failures and goes on.
unsigned CVXCatalog::RenameChildren_(const std::vector<uint32_t>& children, const std::string& base,
                                     const std::string& mediaID, const std::string& mediaSerial,
                                     bool stopOnFailure) {
  for (uint32_t child : children) {
    const CVXFolder* c = GetFolder(child);
    if (!c) continue;
    CVXURI uri;
    uri.Set(base + c->URI().LastName(), true);
    if (unsigned rc = RenameFolder(child, uri, mediaID, mediaSerial); rc != VX_OK) {
      VX_ERROR(Log_(), rc, "RenameFolder: child");
      if (stopOnFailure) return rc;
    }
  }
  return VX_OK;
}

// Moves a folder tree to a location no folder has: the OIDs stay, every URI below is rewritten.
// Files need no change, their location is computed from their folder.
unsigned CVXCatalog::RenameToFreeTarget_(uint32_t oid, const CVXURI& newURI,
                                         const std::string& newMediaID,
                                         const std::string& newMediaSerial) {
  CVXFolder* f = GetFolder(oid);
  f->URI() = newURI;
  f->MediaID() = newMediaID;
  f->MediaSerial() = newMediaSerial;
  uint32_t oldParentOid = f->ParentFolder();
  CVXFolder* oldParent = GetFolder(oldParentOid);
  if (oldParent) {
    oldParent->RemoveChild(oid);
    if (unsigned rc = StoreFolder(oldParentOid); rc != VX_OK) {
      VX_ERROR(Log_(), rc, "RenameFolder: storing old parent");
      oldParent->AddChild(oid);
      VX_THROW(rc);
    }
  }
  uint32_t newParentOid = FindParentFolder(newURI, f->MediaID(), f->MediaSerial());
  f->ParentFolder() = newParentOid;
  if (newParentOid != 0) {
    CVXFolder* newParent = GetFolder(newParentOid);
    if (!newParent) VX_THROW(VX_NOT_FOUND);
    // The parent's spelling of the medium wins over the caller's.
    f->MediaID() = newParent->MediaID();
    f->MediaSerial() = newParent->MediaSerial();
    newParent->AddChild(oid);
    if (unsigned rc = StoreFolder(newParentOid); rc != VX_OK) {
      VX_ERROR(Log_(), rc, "RenameFolder: storing new parent");
      newParent->RemoveChild(oid);
      if (oldParent) oldParent->AddChild(oid);
      VX_THROW(rc);
    }
  }
  // Touch the ancestors; the bound guards against a damaged, cyclic tree.
  uint32_t up = f->ParentFolder();
  for (size_t steps = 0; up != 0 && steps < folders_.size(); ++steps) {
    CVXFolder* ancestor = GetFolder(up);
    if (!ancestor) break;
    ancestor->Touch();
    if (unsigned rc = StoreFolder(up); rc != VX_OK) VX_ERROR(Log_(), rc, "RenameFolder: ancestor");
    up = ancestor->ParentFolder();
  }
  const std::vector<uint32_t> children = f->Children();
  const std::string base = f->URI().AsString();
  const std::string mediaID = f->MediaID(), mediaSerial = f->MediaSerial();
  RenameChildren_(children, base, mediaID, mediaSerial, false);
  return StoreFolder(oid);
}

// Merges folder `oid` into the existing folder `targetOid`: files move with their OIDs, the
// children are renamed below the target, and the emptied source is removed. A failure at a file
// or at the target undoes the merge.
unsigned CVXCatalog::MergeFolder_(uint32_t oid, const CVXFolder& before, uint32_t targetOid,
                                  bool& closing) {
  CVXFolder* t = GetFolder(targetOid);
  if (!t) {
    VX_ERROR(Log_(), VX_NOT_FOUND, "Target not found!");
    closing = false;
    return VX_NOT_FOUND;
  }
  const CVXFolder targetBefore = *t;
  CVXFolder* f = GetFolder(oid);
  unsigned rc = VX_OK;
  for (uint32_t file : f->Files()) {
    CVXCatFile* record = GetFile(file);
    if (!record) continue;
    record->Properties().Folder = targetOid;
    t->AddFile(file);
    if ((rc = StoreFile(file)) != VX_OK) break;
  }
  if (rc == VX_OK) rc = StoreFolder(targetOid);
  if (rc != VX_OK) {
    VX_ERROR(Log_(), rc, "RenameFolder: merge");
    *t = targetBefore;
    *f = before;
    for (uint32_t file : f->Files()) {
      CVXCatFile* record = GetFile(file);
      if (!record || record->Properties().Folder == oid) continue;
      record->Properties().Folder = oid;
      if (unsigned r = StoreFile(file); r != VX_OK) VX_ERROR(Log_(), r, "RenameFolder: undo");
    }
    closing = false;
    return rc;
  }
  f->Files().clear();
  StoreFolder(oid);
  const std::vector<uint32_t> children = f->Children();
  rc = RenameChildren_(children, t->URI().AsString(), t->MediaID(), t->MediaSerial(), true);
  if (rc == VX_OK) {
    GetFolder(oid)->Children().clear();
    RemoveFolder(oid, true);
  }
  return rc;
}
