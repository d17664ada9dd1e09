#pragma once

#include <cstdint>
#include <ctime>
#include <map>
#include <string>

#include "QRLBlobDB.h"
#include "VXBase.h"
#include "VXGroup.h"

class CVXEngine;
class CQRLLogfile;

#pragma pack(push, 1)
// Header of the catalog store, records 1/1 and 21/1 (backup). Loading copies the 278 bytes over
// the in-memory header as they are; magic and version are not tested.
struct SVXCatalogHeader {
  char Magic[4] = {'V', 'X', 'C', 'F'};
  uint16_t Version = 768;
  uint32_t LastFolderOid = 0;
  uint32_t LastFileOid = 0;
  uint32_t LastGroupOid = 0;
  uint32_t LastPersSelOid = 0;
  uint8_t Reserved[256] = {};
};
#pragma pack(pop)
static_assert(sizeof(SVXCatalogHeader) == 278);

// The catalog: folders, files and categories in memory, written through at every change to one
// blob store, the ".vxc" file. Flush therefore has nothing to do.
//
// Record types of the store: 1/1 header, 2 folders, 3 files, 4 categories, 10 persistent
// selections, 11 file transforms, 12/1 version tags, 21/1 header copy.
//
// No lock of its own: every call comes under the engine's recursive lock, and so does the read
// of the engine's log file pointer.
class CVXCatalog : public CVXBase {
 public:
  enum ERecordType : uint16_t {
    rtHeader = 1,
    rtFolder = 2,
    rtFile = 3,
    rtGroup = 4,
    rtPersSel = 10,
    rtTransform = 11,
    rtVersionTags = 12,
    rtHeaderCopy = 21,
  };

  CVXCatalog();
  CVXCatalog(const CVXCatalog&) = delete;
  CVXCatalog& operator=(const CVXCatalog&) = delete;
  ~CVXCatalog() override;

  void SetEngine(CVXEngine* engine) { engine_ = engine; }
  CVXEngine* GetEngine() const { return engine_; }
  // Forwards to the engine's Notify when an engine is set.
  void Notify(unsigned message, unsigned long a, unsigned long b, const char* c);

  // Empties the maps and reinitialises the header; the store is untouched.
  void Reset();
  // Create and Open throw CVXException* with the code on failure.
  void Create(const std::string& path);
  void Open(const std::string& path, bool readOnly);
  unsigned Flush();
  void Close();

  uint32_t GenerateFolderOID();
  uint32_t GenerateFileOID();
  uint32_t GenerateGroupOID();
  uint32_t GeneratePersistantSelectionOID();

  bool IsDirty() const { return dirty_; }
  int32_t LastPersistantSelectionUpdate() const { return lastPersSelUpdate_; }
  bool PersSelDirty() const { return persSelDirty_; }
  uint32_t InteractiveGroup() const { return interactiveGroup_; }
  const SVXCatalogHeader& Header() const { return header_; }
  const std::map<uint32_t, CVXGroup>& Groups() const { return groups_; }
  // The catalog's store, for the engine's statistics, self test and optimisation.
  CQRLBlobDB& BlobDB() { return store_; }

 protected:
  unsigned StoreHeader();
  unsigned LoadHeader();
  unsigned StoreGroup(uint32_t oid);
  unsigned LoadGroup(uint32_t oid, CVXGroup& group);
  unsigned LoadGroups();
  void SetDirty(bool dirty) { dirty_ = dirty; }

 private:
  CQRLLogfile* Log_() const;
  void CreateContent_();
  void OpenContent_(bool headerDamaged);
  void RestoreHeader_();
  uint32_t HighestOid_(ERecordType type, uint32_t ignore);
  uint32_t NextOid_(uint32_t SVXCatalogHeader::*field);

  CVXEngine* engine_ = nullptr;  // not owned
  std::map<uint32_t, CVXGroup> groups_;
  SVXCatalogHeader header_;
  CQRLBlobDB store_;
  int32_t lastPersSelUpdate_;
  bool persSelDirty_ = true;
  bool dirty_ = false;
  uint32_t interactiveGroup_ = 0;
};
