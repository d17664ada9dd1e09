#pragma once

#include <cstdint>
#include <ctime>
#include <map>
#include <string>
#include <vector>

#include "QRLBlobDB.h"
#include "VXBase.h"
#include "VXCatFile.h"
#include "VXFolder.h"
#include "VXGroup.h"
#include "bitvector.h"

class CVXEngine;
class CQRLLogfile;
class CVXPersistantSelection;

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

  // ---- Files. Lookups copy records out; 10020 when the object is absent.
  unsigned LookupFile(uint32_t oid, CVXCatFile& out) const;
  // LookupFile for each of `count` OIDs into files[i], its answer into codes[i]. Quickest when
  // the OIDs mostly ascend.
  void LookupFiles(const uint32_t* oids, size_t count, CVXCatFile* files, unsigned* codes) const;
  unsigned GetFileURI(uint32_t oid, CVXURI& out) const;
  unsigned GetFileFolder(uint32_t oid, unsigned long& folder) const;
  // OID of the folder's first file of that name (case-insensitive), or 0.
  uint32_t LookupFile(const std::string& name, uint32_t folderOid) const;
  uint32_t FolderLookupFile(const CVXFolder& folder, const std::string& name) const;
  unsigned LookupFile(uint32_t crc, const std::string& mediaID, const std::string& mediaSerial,
                      std::vector<uint32_t>& out) const;
  unsigned GetFiles(CBitVector& bits) const;
  unsigned GetFilesForFormat(const CBitVector& formats, CBitVector& bits) const;
  unsigned GetFilesForCRC(uint32_t crc, uint32_t size, CBitVector& bits) const;
  unsigned GetFilesForOrientation(bool portrait, CBitVector& bits) const;
  unsigned GetRank(int32_t rank, CBitVector& bits);
  unsigned GetLabel(const char* label, CBitVector& bits);
  size_t NumberOfFiles() const { return files_.size(); }
  bool IsUniqueFileOID(uint32_t oid) const { return files_.count(oid) == 0; }

  unsigned AddFile(uint32_t folderOid, const CVXCatFile& file);
  unsigned UpdateFile(const CVXCatFile& file);
  unsigned RemoveFile(uint32_t oid);
  unsigned RenameFile(uint32_t oid, const std::string& newName);
  unsigned MoveFile(uint32_t oid, uint32_t folderOid, const std::string& newName);
  unsigned CopyFile(uint32_t oid, uint32_t folderOid, unsigned long& newOid,
                    const std::string& newName);

  // ---- Folders.
  unsigned LookupFolder(uint32_t oid, CVXFolder& out) const;
  uint32_t LookupFolder(const CVXURI& uri, const std::string& mediaID,
                        const std::string& mediaSerial) const;
  uint32_t FindParentFolder(const CVXFolder& folder) const;
  uint32_t FindParentFolder(const CVXURI& uri, const std::string& mediaID,
                            const std::string& mediaSerial) const;
  unsigned EnumFolders(const CVXURI& uri, std::vector<CVXFolder>& out) const;
  unsigned GetRootFolders(std::vector<uint32_t>& out) const;
  unsigned GetFolders(std::vector<uint32_t>& out) const;
  unsigned GetFolderChildren(uint32_t oid, std::vector<uint32_t>& out, bool recursive);
  unsigned GetFolderFiles(uint32_t oid, CBitVector& bits, bool recursive);
  unsigned GetFolderFiles(uint32_t oid, std::vector<uint32_t>& out, bool recursive);
  uint32_t GetFolderThumb(uint32_t oid) const;
  size_t NumberOfFolders() const { return folders_.size(); }
  bool IsUniqueFolderOID(uint32_t oid) const { return folders_.count(oid) == 0; }

  unsigned AddFolder(const CVXFolder& folder);
  unsigned UpdateFolder(const CVXFolder& folder);
  unsigned RemoveFolder(uint32_t oid, bool recursive);
  unsigned RenameFolder(uint32_t oid, const CVXURI& newURI, const std::string& newMediaID,
                        const std::string& newMediaSerial);
  // Points folder references of every formula from `oldOid` to `newOid`; the host decides when.
  unsigned MoveFolderReferences(uint32_t oldOid, uint32_t newOid);

  // ---- Categories. Callers take a copy, change it and hand it back to UpdateGroup.
  unsigned LookupGroup(uint32_t oid, CVXGroup& out) const;
  // OID of the first category whose full name equals `fullName` exactly, with case; 0 if none.
  uint32_t LookupGroup(const std::string& fullName) const;
  unsigned GetGroupSortInfo(uint32_t oid, int& sortSequence, std::string& name) const;
  // "Top.Middle.Leaf"; 10020 with the partial name when a parent is missing.
  unsigned GetFullGroupName(uint32_t oid, std::string& name) const;
  unsigned GetGroups(std::vector<uint32_t>& out) const;
  unsigned GetGroupChildrenRecursive(uint32_t oid, std::vector<uint32_t>& out) const;
  unsigned GetGroupReferrers(uint32_t oid, unsigned refType, std::vector<uint32_t>& out);
  unsigned GroupDependsOn(uint32_t oid, uint32_t otherOid, bool& depends);
  unsigned GetGroupImages(uint32_t oid, std::vector<uint32_t>& out);
  unsigned GetFileGroups(uint32_t fileOid, std::vector<uint32_t>& out) const;
  unsigned GetFileGroups(const std::vector<uint32_t>& fileOids, std::vector<uint32_t>& out) const;
  unsigned SetFileGroups(uint32_t fileOid, const std::vector<uint32_t>& groups, bool additive);
  unsigned RemoveImageFromGroups(uint32_t fileOid, uint32_t parentOid);
  unsigned RemoveImageFromGroups(const std::vector<uint32_t>& fileOids, uint32_t parentOid);
  unsigned AddGroup(const CVXGroup& group);
  unsigned UpdateGroup(const CVXGroup& group);
  unsigned RemoveGroup(uint32_t oid);
  unsigned ReorderGroup(uint32_t oid, uint32_t targetOid, bool before);
  unsigned GetDynamicGroups(std::vector<uint32_t>& out) const;
  uint32_t GetInteractiveGroup() const { return interactiveGroup_; }
  // Marks data-driven categories for a new query: all of them, or `oid`, and with `tag` only
  // those whose tag holds it (ignoring case). Always 10001.
  unsigned InvalidateDynamicGroups(uint32_t oid, const char* tag);
  // Turns a data-driven root into an ordinary category and removes its data-driven children.
  unsigned ClearDynamicGroup(uint32_t oid);
  // Rebuilds the data-driven roots that need it (all with `force`; `oid` 0 means every root);
  // with `force` their children are marked for a new query as well. 10001 when no root needs
  // a build; else the first failure of the builds.
  unsigned UpdateDynamicGroups(uint32_t oid, bool force, bool recalcChildren);
  // Files of no top-level category; 15014 when a formula comes back here through "@Unassigned".
  unsigned GetUnassignedImages(CBitVector& bits);
  // OID of the stored persistent selection of that name; 10020 when there is none.
  unsigned GetPersSelOid(const std::string& name, uint32_t& oid);
  size_t NumberOfGroups() const { return groups_.size(); }

  // ---- Persistent selections and file transforms, as far as file and folder changes reach
  // them. `sel` null means every selection.
  unsigned InvalidatePersistantSelections(const CVXPersistantSelection* sel);
  // `key` null tests for property selectors instead of one key.
  unsigned InvalidatePersistantSelectionsForKey(const char* key);
  unsigned InvalidatePersistantSelectionsForProps();
  unsigned RemoveFileTransform(uint32_t oid);

  bool IsDirty() const { return dirty_; }
  int32_t LastPersistantSelectionUpdate() const { return lastPersSelUpdate_; }
  bool PersSelDirty() const { return persSelDirty_; }
  uint32_t InteractiveGroup() const { return interactiveGroup_; }
  const SVXCatalogHeader& Header() const { return header_; }
  const std::map<uint32_t, CVXGroup>& Groups() const { return groups_; }
  const std::map<uint32_t, CVXCatFile>& Files() const { return files_; }
  const std::map<uint32_t, CVXFolder>& Folders() const { return folders_; }
  // The catalog's store, for the engine's statistics, self test and optimisation.
  CQRLBlobDB& BlobDB() { return store_; }

 protected:
  unsigned StoreHeader();
  unsigned LoadHeader();
  unsigned StoreFile(uint32_t oid);
  unsigned LoadFile(uint32_t oid, CVXCatFile& file);
  unsigned StoreFolder(uint32_t oid);
  unsigned LoadFolder(uint32_t oid, CVXFolder& folder);
  unsigned StoreGroup(uint32_t oid);
  unsigned LoadGroup(uint32_t oid, CVXGroup& group);
  unsigned LoadFiles();
  unsigned LoadFolders();
  unsigned LoadGroups();

  // Pointers into the maps for friend code; null when absent.
  CVXCatFile* GetFile(uint32_t oid);
  CVXFolder* GetFolder(uint32_t oid);
  const CVXFolder* GetFolder(uint32_t oid) const;

  // Throw CVXException* with the code on failure.
  void InternalAddFile(uint32_t oid, uint32_t folderOid, CVXCatFile& file);
  void InternalRemoveFile(uint32_t oid);
  void InternalAddFolder(uint32_t oid, const CVXFolder& folder);
  void InternalRemoveFolder(uint32_t oid);
  // Links every parentless folder to the folder one path element up on the same medium.
  void ConnectChildren();
  unsigned _RecurseFolder(uint32_t oid, CBitVector& bits);
  unsigned _RecurseFolderChildren(uint32_t oid, std::vector<uint32_t>& out);
  unsigned _RecurseGroup(uint32_t oid, CBitVector& bits);
  CVXGroup* GetGroup(uint32_t oid);
  const CVXGroup* GetGroup(uint32_t oid) const;
  void SetDirty(bool dirty) { dirty_ = dirty; }

 private:
  CQRLLogfile* Log_() const;
  // Which exceptions of its body a frame turns into codes: all of them (a CVXException gives
  // its own code); all but as if a CVXException were a framework exception (10003, whatever
  // its code); or none, so that they pass to the caller.
  enum EHandlers { hAllLevels, hOuterLevels, hNoHandlers };
  // The frame of every mutating operation: entry and exit lines, the object's name, the body's
  // exceptions handled as `handlers` says, a failed result logged.
  template <typename Body>
  unsigned Frame_(const char* name, int level, const std::string* objectName, EHandlers handlers,
                  Body&& body);
  template <typename T>
  unsigned StoreRecord_(ERecordType type, const std::map<uint32_t, T>& map, uint32_t oid);
  unsigned RemoveRecord_(ERecordType type, uint32_t oid);
  unsigned CountRecords_(ERecordType type, unsigned& count);
  // Marks every clean stored selection dirty (all of them when `key` is null, else those with a
  // selector on that key) and returns the result of the walk.
  unsigned MarkPersistantSelectionsDirty_(const char* key = nullptr);
  void RemoveFileFromPersistantSelections_(uint32_t oid);
  // Logs and answers 10020 where stored selections would have to be read.
  unsigned SelectionsUnreadable_() const;
  // Builds the children of one data-driven root from the full-text index.
  unsigned BuildDynamicChildren_(uint32_t rootOid, bool force, bool recalcChildren);
  // Drops empty and corrupt stored selections; run by each writable open.
  void CleanPersistantSelections_();
  void RemapFolders_();
  static std::string ParentText_(const CVXURI& uri);
  CBitVector GroupScope_(uint32_t parentOid) const;
  void PrepareInteractiveGroup_();
  bool RemapFolder_(uint32_t oid, CVXFolder& folder);
  uint32_t ParentOidFor_(const std::string& uriText, const std::string& mediaID,
                         const std::string& mediaSerial) const;
  unsigned RenameToFreeTarget_(uint32_t oid, const CVXURI& newURI, const std::string& newMediaID,
                               const std::string& newMediaSerial);
  unsigned MergeFolder_(uint32_t oid, const CVXFolder& before, uint32_t targetOid, bool& closing);
  void ClearFolderReferences_(uint32_t folderOid);
  unsigned RenameChildren_(const std::vector<uint32_t>& children, const std::string& base,
                           const std::string& mediaID, const std::string& mediaSerial,
                           bool stopOnFailure);
  void CreateContent_();
  void OpenContent_(bool headerDamaged);
  void RestoreHeader_();
  template <typename T>
  static uint32_t HighestOid_(const std::map<uint32_t, T>& map, uint32_t ignore);
  template <typename T>
  unsigned LoadRecord_(ERecordType type, uint32_t oid, T& object);
  // Reads every record of `type` into `loaded`, with progress messages; stops at the first
  // failure.
  template <typename T>
  unsigned LoadEach_(ERecordType type, std::map<uint32_t, T>& loaded);
  uint32_t NextOid_(uint32_t SVXCatalogHeader::*field);

  CVXEngine* engine_ = nullptr;  // not owned
  std::map<uint32_t, CVXGroup> groups_;
  std::map<uint32_t, CVXCatFile> files_;
  std::map<uint32_t, CVXFolder> folders_;
  SVXCatalogHeader header_;
  CQRLBlobDB store_;
  int32_t lastPersSelUpdate_;
  bool persSelDirty_ = true;
  bool dirty_ = false;
  uint32_t interactiveGroup_ = 0;
  bool inUnassignedCalc_ = false;  // re-entry guard of GetUnassignedImages
};
