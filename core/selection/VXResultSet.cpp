#include "VXResultSet.h"

#include <algorithm>
#include <utility>

#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"

namespace {

constexpr uint16_t kObjectVersion = 1;
constexpr uint16_t kResultVersion = 1;
constexpr uint64_t kHitBytes = sizeof(uint32_t) + sizeof(double);

// Walks the entries in order. A matching entry is erased and the walk starts again at the
// first entry; in any other entry the matching hits are erased, only the first one of them
// with `allHits` false. The restart matters only in that case (an entry in front of an erased
// one is visited again and gives up one more hit), so with all hits the walk just goes on.
template <typename EntryTest, typename HitTest>
bool RemoveReferences(std::vector<SVXResultSetEntry>& entries, EntryTest entryTest, HitTest hitTest,
                      bool allHits) {
  bool removed = false;
  for (size_t i = 0; i < entries.size();) {
    if (entryTest(entries[i])) {
      entries.erase(entries.begin() + static_cast<std::ptrdiff_t>(i));
      removed = true;
      if (!allHits) i = 0;
      continue;
    }
    std::vector<SVXRSEntry>& hits = entries[i].Hits;
    if (allHits) {
      removed |= std::erase_if(hits, hitTest) > 0;
    } else if (auto it = std::find_if(hits.begin(), hits.end(), hitTest); it != hits.end()) {
      hits.erase(it);
      removed = true;
    }
    ++i;
  }
  return removed;
}

// Entries first, then their hits, in order.
template <typename EntryTest, typename HitTest>
bool FindReference(const std::vector<SVXResultSetEntry>& entries, EntryTest entryTest,
                   HitTest hitTest, CVXResultSet::ERefType& ref) {
  for (const SVXResultSetEntry& e : entries) {
    if (entryTest(e)) {
      ref = CVXResultSet::rtOriginal;
      return true;
    }
    if (std::any_of(e.Hits.begin(), e.Hits.end(), hitTest)) {
      ref = CVXResultSet::rtHit;
      return true;
    }
  }
  return false;
}

// Tests of an entry and of a hit for one OID or one folder OID.
auto ByOid(uint32_t oid) {
  return std::pair([oid](const SVXResultSetEntry& e) { return e.OID == oid; },
                   [oid](const SVXRSEntry& h) { return h.OID == oid; });
}

auto ByFolder(uint32_t folder) {
  return std::pair([folder](const SVXResultSetEntry& e) { return e.Folder == folder; },
                   [folder](const SVXRSEntry& h) { return h.Folder == folder; });
}

void WriteEntry(CVXFile& file, const SVXResultSetEntry& e) {
  file << e.Number << e.OID << static_cast<uint32_t>(e.URI.Type()) << uint8_t{e.URI.IsFolder()}
       << e.URI.AsString() << e.File << static_cast<uint32_t>(e.Hits.size());
  for (const SVXRSEntry& h : e.Hits) file << h.OID << h.Score;
}

SVXResultSetEntry ReadEntry(CVXFile& file) {
  SVXResultSetEntry e;
  uint32_t uriType = 0, hitCount = 0;
  uint8_t isFolder = 0;
  std::string text;
  file >> e.Number >> e.OID >> uriType >> isFolder >> text >> e.File >> hitCount;
  e.URI = CVXURI::Restore(std::move(text), isFolder != 0, uriType);
  if (hitCount * kHitBytes > file.Remaining()) VX_THROW(VX_NOT_FOUND);
  e.Hits.resize(hitCount);
  for (SVXRSEntry& h : e.Hits) file >> h.OID >> h.Score;
  return e;
}

}  // namespace

void CVXResultSet::GetOriginals(std::vector<unsigned long>& oids) const {
  oids.clear();
  for (const SVXResultSetEntry& e : data_.Entries) {
    if (e.OID != 0) oids.push_back(e.OID);
  }
}

std::vector<SVXResultSetEntry>::const_iterator CVXResultSet::GetEntry(unsigned number) const {
  return std::find_if(data_.Entries.begin(), data_.Entries.end(),
                      [&](const SVXResultSetEntry& e) { return e.Number == number; });
}

SVXResultSetEntry* CVXResultSet::GetEntry(unsigned number) {
  auto it = std::as_const(*this).GetEntry(number);
  return it == data_.Entries.end() ? nullptr : &data_.Entries[it - data_.Entries.cbegin()];
}

bool CVXResultSet::HasReference(uint32_t oid, ERefType& ref) const {
  auto [entryTest, hitTest] = ByOid(oid);
  return FindReference(data_.Entries, entryTest, hitTest, ref);
}

bool CVXResultSet::HasReference(const CVXURI& uri, ERefType& ref) const {
  bool found = std::any_of(data_.Entries.begin(), data_.Entries.end(),
                           [&](const SVXResultSetEntry& e) { return e.URI == uri; });
  if (found) ref = rtOriginal;
  return found;
}

bool CVXResultSet::HasFolderReference(uint32_t folderOid, ERefType& ref) const {
  auto [entryTest, hitTest] = ByFolder(folderOid);
  return FindReference(data_.Entries, entryTest, hitTest, ref);
}

bool CVXResultSet::RemoveFileReferences(uint32_t oid, bool allHits) {
  auto [entryTest, hitTest] = ByOid(oid);
  return RemoveReferences(data_.Entries, entryTest, hitTest, allHits);
}

bool CVXResultSet::RemoveFileReferences(const CVXURI& uri) {
  return std::erase_if(data_.Entries, [&](const SVXResultSetEntry& e) { return e.URI == uri; }) > 0;
}

bool CVXResultSet::RemoveFolderReferences(uint32_t folderOid) {
  auto [entryTest, hitTest] = ByFolder(folderOid);
  return RemoveReferences(data_.Entries, entryTest, hitTest, true);
}

CVXFile& operator<<(CVXFile& file, const CVXResultSet& result) {
  const CVXResultSet::SData& d = result.Properties();
  file << kObjectVersion << result.Oid() << kResultVersion << d.Name << d.Comment
       << static_cast<uint32_t>(d.Entries.size());
  for (const SVXResultSetEntry& e : d.Entries) WriteEntry(file, e);
  return file;
}

// Reads into locals, so that a short stream leaves `result` as it was.
CVXFile& operator>>(CVXFile& file, CVXResultSet& result) {
  uint16_t objectVersion = 0, version = 0;
  uint32_t oid = 0, count = 0;
  std::string name, comment;
  file >> objectVersion >> oid >> version >> name >> comment >> count;
  // Each entry takes bytes of the stream, so a corrupt count ends at its end.
  std::vector<SVXResultSetEntry> entries;
  for (uint32_t i = 0; i < count; ++i) entries.push_back(ReadEntry(file));
  CVXResultSet::SData& d = result.Properties();
  result.Oid() = oid;
  d.Name = std::move(name);
  d.Comment = std::move(comment);
  d.Entries = std::move(entries);
  return file;
}
