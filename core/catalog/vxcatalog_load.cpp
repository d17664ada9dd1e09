// Bulk loading of the catalog: files in batches, folders and categories one at a time, each with
// its progress messages.

#include <algorithm>

#include "VXEngineTypes.h"
#include "vxcatalog_frame.h"
#include "xstring.h"

namespace {

constexpr size_t kFileBatch = 5000;

// Percentage of a load: truncated, at most 100, and 100 when there is nothing to load.
unsigned Percent(size_t done, size_t total) {
  double value = done * 100.0 / static_cast<double>(total ? total : 1);
  return static_cast<unsigned>(std::min(100.0, value));
}

}  // namespace

// Files, the largest population, are read in batches of 5000 in one store call each, in the
// store's physical order.
unsigned CVXCatalog::LoadFiles() {
  files_.clear();
  std::vector<uint32_t> oids;
  unsigned rc = store_.GetOids(rtFile, oids, true);
  if (rc == VX_OK) store_.OptimizeOidsForSequentialAccess(rtFile, oids);
  Notify(cbmLoadFiles, 0, 0, nullptr);
  Notify(cbmLoadProgress, 0, 0, nullptr);
  CVXMemFile file(false, 100000, 4096);
  unsigned lastPercent = 0;
  std::vector<CQRLBlobDB::SSelector> batch;
  for (size_t at = 0; rc == VX_OK && at < oids.size(); at += kFileBatch) {
    size_t end = std::min(oids.size(), at + kFileBatch);
    batch.clear();
    for (size_t i = at; i < end; ++i) batch.emplace_back(rtFile, oids[i]);
    unsigned total = 0;
    if ((rc = store_.GetSize(batch, total)) != VX_OK) break;
    file.Rewind();
    if ((rc = store_.Get(batch, file.GetBuffer(total), total)) != VX_OK) break;
    if ((rc = DecodeFiles_(file, oids, at, end)) != VX_OK) break;
    unsigned percent = Percent(end, oids.size());
    if (percent != lastPercent) Notify(cbmLoadProgress, percent, 0, nullptr);
    lastPercent = percent;
  }
  Notify(cbmLoadProgress, 100, 0, nullptr);
  Notify(cbmLoadStageEnded, 0, 0, nullptr);
  if (rc != VX_OK) VX_ERROR(Log_(), rc, "Loading files");
  return rc;
}

// Each record is read straight into its map entry, which goes at the end: OIDs rise.
unsigned CVXCatalog::DecodeFiles_(CVXMemFile& file, const std::vector<uint32_t>& oids, size_t at,
                                  size_t end) {
  for (size_t i = at; i < end; ++i) {
    auto it = files_.emplace_hint(files_.end(), std::piecewise_construct,
                                  std::forward_as_tuple(oids[i]), std::forward_as_tuple());
    try {
      file >> it->second;
    } catch (...) {
      files_.erase(it);
      return VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
    }
  }
  return VX_OK;
}

template <typename T>
unsigned CVXCatalog::LoadEach_(ERecordType type, std::map<uint32_t, T>& loaded, bool sequential) {
  std::vector<uint32_t> oids;
  unsigned rc = store_.GetOids(type, oids, false);
  if (rc == VX_OK && sequential) store_.OptimizeOidsForSequentialAccess(type, oids);
  unsigned lastPercent = 0;
  for (size_t i = 0; rc == VX_OK && i < oids.size(); ++i) {
    T object;
    if ((rc = LoadRecord_(type, oids[i], object)) != VX_OK) break;
    loaded.emplace(oids[i], std::move(object));
    unsigned percent = Percent(i + 1, oids.size());
    if (percent != lastPercent) Notify(cbmLoadProgress, percent, 0, nullptr);
    lastPercent = percent;
  }
  return rc;
}

unsigned CVXCatalog::LoadFolders() {
  std::map<uint32_t, CVXFolder> loaded;
  Notify(cbmLoadFolders, 0, 0, nullptr);
  Notify(cbmLoadProgress, 0, 0, nullptr);
  unsigned rc = LoadEach_(rtFolder, loaded, true);
  if (rc == VX_OK) folders_ = std::move(loaded);
  RemapFolders_();
  ConnectChildren();
  Notify(cbmLoadProgress, 100, 0, nullptr);
  Notify(cbmLoadStageEnded, 0, 0, nullptr);
  return rc;
}

// A folder whose parent's path is not a prefix of its own was moved outside the catalog: it is
// linked to the folder one path element up on the same medium, if there is one. The walk starts
// again after each remap; a remap whose store failed changes no parent and does not restart it,
// so the walk always ends.
void CVXCatalog::RemapFolders_() {
  bool restart = true;
  while (restart) {
    restart = false;
    for (auto& [oid, f] : folders_) {
      if (RemapFolder_(oid, f)) {
        restart = true;
        break;
      }
    }
  }
}

bool CVXCatalog::RemapFolder_(uint32_t oid, CVXFolder& f) {
  CVXFolder* p = GetFolder(f.ParentFolder());
  if (!p) return false;
  if (_mbsupr(f.URI().AsString()).rfind(_mbsupr(p->URI().AsString()), 0) == 0) return false;
  VX_LOG(Log_(), 3, "  Remapping folder to new parent:");
  std::string path = CVXURI::StripTrailer(f.URI().URIPath());
  size_t slash = path.rfind('/');
  if (slash == std::string::npos) return false;
  path.resize(slash + 1);
  uint32_t found = 0;
  for (const auto& [coid, c] : folders_) {
    if (xstring_comparenocase(c.MediaID(), f.MediaID()) == 0 &&
        xstring_comparenocase(c.MediaSerial(), f.MediaSerial()) == 0 &&
        xstring_comparenocase(c.URI().AsString(), path) == 0) {
      found = coid;
      break;
    }
  }
  if (found == 0 || found == f.ParentFolder()) return false;
  VX_LOGF(Log_(), 3, "Mapped from %lu to %lu", static_cast<unsigned long>(f.ParentFolder()),
          static_cast<unsigned long>(found));
  p->RemoveChild(oid);
  if (StoreFolder(f.ParentFolder()) != VX_OK) return false;
  CVXFolder& c = folders_.at(found);
  f.ParentFolder() = found;
  f.MediaID() = c.MediaID();
  f.MediaSerial() = c.MediaSerial();
  if (StoreFolder(oid) == VX_OK) {
    c.AddChild(oid);
    StoreFolder(found);
  }
  return true;
}

// Categories are read one at a time, in no particular order. "@Interactive" is remembered.
unsigned CVXCatalog::LoadGroups() {
  std::map<uint32_t, CVXGroup> loaded;
  Notify(cbmLoadGroups, 0, 0, nullptr);
  Notify(cbmLoadProgress, 0, 0, nullptr);
  unsigned rc = LoadEach_(rtGroup, loaded, false);
  if (rc == VX_OK) {
    for (const auto& [oid, group] : loaded) {
      if (group.Name() == "@Interactive") interactiveGroup_ = oid;
    }
    groups_ = std::move(loaded);
    PrepareInteractiveGroup_();
  }
  Notify(cbmLoadProgress, 100, 0, nullptr);
  Notify(cbmLoadStageEnded, 0, 0, nullptr);
  return rc;
}

// The interactive selection never survives a close: its formula is emptied at every load. A
// catalog without the category gets one.
void CVXCatalog::PrepareInteractiveGroup_() {
  // The map's record is cleared in place, so that a read-only store, which UpdateGroup leaves
  // alone, forgets the formula as well.
  if (CVXGroup* record = GetGroup(interactiveGroup_); record && interactiveGroup_ != 0) {
    record->SetExpression(*this, "");
    CVXGroup copy = *record;
    UpdateGroup(copy);
    return;
  }
  CVXGroup group(GenerateGroupOID());
  group.Name() = "@Interactive";
  group.Description() =
      "This special category represents the result of your @interactive selection. Drag "
      "categories to the Category Builder window to define the contents of this category.";
  group.Parent() = 0;
  group.Flags() = gfSystem | gfSealed;
  group.SortSequence() = -2;
  // A read-only store cannot take it; the catalog opens all the same.
  if (AddGroup(group) == VX_OK) interactiveGroup_ = group.Oid();
}
