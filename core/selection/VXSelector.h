#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "VXDBObject.h"
#include "VXMemFile.h"

class CVXFile;
struct SSelCoreData;

// The definition of a selection: a name and a bag of feature blobs under string keys. The
// selector does not know the feature records; each blob is a record stored with its core block
// (SSelCoreData::Store with withCore), and whoever runs the selection loads it back by its key.
// The flag queries below read the core block of a blob; a blob whose core block does not read
// counts as an inactive feature.
//
// Stream form (operators << and >>): u16 1, u32 OID, u16 1, string Name, u8 NeedsOriginals,
// u32 feature count, then per feature in key order a string key and the blob as a CVXMemFile.
// Reading replaces name, flag and features, and ors into NeedsOriginals the flag of every
// feature's core block, so that a stale stream flag cannot hide a need.
class CVXSelector : public CVXDBObject {
 public:
  struct SData {
    std::string Name;
    // Set when some feature compares candidates with originals. SetFeature does not update
    // it: whoever builds a selector in memory sets it.
    bool NeedsOriginals = false;
    // Ordered byte-wise by key.
    std::map<std::string, CVXMemFile> Features;
    uint8_t Scratch[128] = {};    // the client's; copied, never persisted
    uint32_t ActiveFolder = 0;    // set per run by the caller; never persisted
    uint32_t ActiveCategory = 0;  // likewise
  };

  CVXSelector() = default;
  CVXSelector(const CVXSelector&) = default;
  CVXSelector& operator=(const CVXSelector&) = default;
  ~CVXSelector() override = default;

  SData& Properties() { return data_; }
  const SData& Properties() const { return data_; }

  // Drops all features and clears NeedsOriginals; name and OID stay.
  void Clear();
  // Inserts or replaces; always true.
  bool SetFeature(const std::string& key, const CVXMemFile& blob);
  // Copies the blob into `out`, positioned at its start; false if the key is absent.
  bool GetFeature(const std::string& key, CVXMemFile& out) const;

  // Compares OID, name, NeedsOriginals, feature count, IsInterActive, then every blob of this
  // selector against the other's under the same key. Scratch and the active folder and
  // category play no part.
  bool operator==(const CVXSelector& other) const;

  // The key exists and its feature is Active.
  bool HasSelectorForKey(const std::string& key) const;
  // Some key containing "VXSELProperties" holds an Active feature.
  bool HasPropertySelector() const;
  // Some key containing "VXSELMask" holds a feature both Active and InterActive.
  bool HasActiveMask() const;
  // A colour or match feature is active: the run needs shape records.
  bool NeedsVXShapeData() const;
  // Some feature is both Active and InterActive.
  bool IsInterActive() const;
  // The first key (in key order) containing "VXSELFolders" holds an Active feature in Mode 0.
  bool WorksWithActiveFolder() const;
  // The first key containing "VXSELCategories" holds an Active feature in Mode 2.
  bool WorksWithActiveCategory() const;

 private:
  friend CVXFile& operator>>(CVXFile& file, CVXSelector& selector);

  // Loads `record` from the blob with its core block; false if the blob does not read.
  static bool LoadFeature_(const CVXMemFile& blob, SSelCoreData& record);
  // Whether some feature whose key contains `part` passes `test` on its core block.
  template <typename Test>
  bool AnyCore_(const char* part, Test test) const;
  // The first feature whose key contains `part`, or null.
  const CVXMemFile* FirstContaining_(const char* part) const;

  SData data_;
};

CVXFile& operator<<(CVXFile& file, const CVXSelector& selector);
// Throws CVXException* (10020) on a short stream and then leaves `selector` unchanged.
CVXFile& operator>>(CVXFile& file, CVXSelector& selector);
