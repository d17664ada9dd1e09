#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "VXCatFile.h"
#include "VXDBObject.h"
#include "VXURI.h"

class CVXFile;

// One hit of a selection.
struct SVXRSEntry {
  uint32_t OID = 0;
  uint32_t Folder = 0;  // folder OID
  double Score = 0;     // 0 to 100, higher is better
};

// One original of a selection with its hits.
struct SVXResultSetEntry {
  uint32_t Number = 0;  // position in the result, from 1
  uint32_t OID = 0;     // 0: an external file, or the single entry of a run without originals
  uint32_t Folder = 0;  // folder OID
  CVXURI URI;
  CVXCatFile File;               // copy of the original's record
  std::vector<SVXRSEntry> Hits;  // by descending Score after a run
};

// The outcome of a selection run: one entry per original, each with its ranked hits. The
// removal operations keep it in step with the catalog when files or folders go away; they never
// renumber, so the remaining entries keep their numbers, gaps and all.
//
// Stream form (operators << and >>): u16 1, u32 OID, u16 1, string Name, string Comment, u32
// entry count, the entries. An entry: u32 Number, u32 OID, u32 URI type, u8 URI IsFolder,
// string URI text, the file record, u32 hit count, per hit u32 OID and f64 Score. The folder
// OIDs of entries and hits are not part of it and read back as 0, nor is DropEmpty.
class CVXResultSet : public CVXDBObject {
 public:
  // What an object is to the result that refers to it.
  enum ERefType { rtHit = 0, rtOriginal = 1 };

  struct SData {
    std::string Name;
    std::string Comment;
    bool DropEmpty = false;  // the run's setting; not persisted
    std::vector<SVXResultSetEntry> Entries;
  };

  explicit CVXResultSet(uint32_t oid = 0) : CVXDBObject(oid) {}
  CVXResultSet(const CVXResultSet&) = default;
  CVXResultSet& operator=(const CVXResultSet&) = default;
  ~CVXResultSet() override = default;

  SData& Properties() { return data_; }
  const SData& Properties() const { return data_; }

  bool IsEmpty() const { return data_.Entries.empty(); }
  // Drops all entries; name and comment stay.
  void Clear() { data_.Entries.clear(); }
  // The OIDs of the entries that have one, in order.
  void GetOriginals(std::vector<unsigned long>& oids) const;

  // The entry with that Number; the end of Entries when there is none, not to be read.
  std::vector<SVXResultSetEntry>::const_iterator GetEntry(unsigned number) const;
  // The entry with that Number, or null.
  SVXResultSetEntry* GetEntry(unsigned number);

  // Entries first, then their hits, in order: an original gives rtOriginal, a hit rtHit.
  bool HasReference(uint32_t oid, ERefType& ref) const;
  // An entry with that location (folder flag and text, case-insensitive); ref rtOriginal.
  bool HasReference(const CVXURI& uri, ERefType& ref) const;
  // As HasReference(oid), on the folder OIDs.
  bool HasFolderReference(uint32_t folderOid, ERefType& ref) const;

  // Erases the entries of the file and its hits in all other entries: all of them, or with
  // `allHits` false only the first in each entry. True if something was removed.
  bool RemoveFileReferences(uint32_t oid, bool allHits = true);
  // Erases the entries at that location; hits have none.
  bool RemoveFileReferences(const CVXURI& uri);
  // Erases the entries and hits in that folder.
  bool RemoveFolderReferences(uint32_t folderOid);

 private:
  SData data_;
};

CVXFile& operator<<(CVXFile& file, const CVXResultSet& result);
// Throws CVXException* (10020) on a short stream and then leaves `result` unchanged.
CVXFile& operator>>(CVXFile& file, CVXResultSet& result);
