#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "QRLBlobDB.h"
#include "SelTempStore.h"
#include "VXBase.h"
#include "VXEngineTypes.h"
#include "vxcatalog.h"

class CQRLLogfile;
class CVXPropDB;
class CVXXMPDB;
class CVXBitmap;
class CShape;
class CVXProperty;
class CVXTable;
class CVXThumb;
struct SVXDBRec_3;
struct SXMPRecord;
struct SFTIRecord;
struct SFTITag;

// The library's façade: one engine owns every store of one database and serialises access to
// them with one recursive lock, taken by each public operation (the exceptions say so).
//
// A database is a family of files derived from one path, the feature match store: ".vxc"
// catalog, ".vxp" properties, ".vxt" thumbnails, ".vxlt" sort arrays, ".vxl" selection
// templates, ".v3x" XMP and full text.
//
// Every public operation returns a result code (10001 success) and never lets an exception out:
// a CVXException becomes its code, a std::exception 10003, anything else 10002.
class CVXEngine : public CVXBase {
 public:
  CVXEngine();
  CVXEngine(const CVXEngine&) = delete;
  CVXEngine& operator=(const CVXEngine&) = delete;
  ~CVXEngine() override;

  virtual bool IsModified() const;
  // Counts the changes made through the engine, closing included, from any thread. Records
  // copied out stay current while the count stays.
  uint64_t Changes() const { return changes_.load(std::memory_order_acquire); }

  unsigned Create(const SVXCreateInfo& info);
  // The callback lives only until Open returns; the engine clears it before it does.
  unsigned Open(const SVXCreateInfo& info, VXCallback callback = nullptr, void* user = nullptr);
  unsigned Close();
  unsigned Flush();

  bool IsOpen() const;
  bool IsReadOnly() const;

  // The log is the host's; the engine never owns it.
  void SetLogFile(CQRLLogfile* log);
  CQRLLogfile* LogFile() const;

  // Name of the match store; 10502 and an empty string when closed.
  unsigned GetPathAndName(std::string& name) const;
  unsigned GetAppDataSize() const { return VX_APP_DATA_SIZE; }
  // The 4096 bytes of application data, copied out under the lock.
  void GetAppData(uint8_t (&data)[VX_APP_DATA_SIZE]) const;
  // Copies at most 4096 bytes; marks the engine modified.
  unsigned SetAppData(const void* data, size_t size);
  int32_t LastUpdate() const;
  int32_t LastPersistantSelectionUpdate() const;

  // Not under the lock.
  void EnableCaching(bool enable, unsigned size);
  void ReleaseCaches();

  CVXPropDB& GetPropertyDatabase() { return *propDB_; }
  CVXXMPDB& XMPDB() { return *xmpDB_; }
  CVXCatalog& Catalog() { return catalog_; }
  operator CVXCatalog&() { return catalog_; }
  operator CVXCatalog*() { return &catalog_; }

  // Calls the host callback if one is set. Not under the lock.
  void Notify(ECBMessage message, unsigned long a, unsigned long b, const char* text);
  // Progress of a blob store (message 4) goes to the host as message 15. `user` is the engine.
  static void BlobDBCallback_(CQRLBlobDB::ECBMessage message, unsigned long a, unsigned long b,
                              void* user, const char* text);

  // Store files of the open database, in the fixed order of the store set, for hosts that show
  // or back them up. Additions for hosts.
  std::string StorePath(const char* ext) const;

  // ---- Files and folders across the stores ----

  // Adds the file, or updates the file of that name in its folder (case-insensitive), and
  // computes its shape data from `bitmap`. The file comes back with OID, Processed, CRC and the
  // greyscale flag filled.
  unsigned AddFile(CVXCatFile& file, const CVXBitmap& bitmap, uint32_t crc);
  // The same from a ready thumbnail and ready shape data.
  unsigned AddFile(CVXCatFile& file, CVXThumb& thumb, const SVXDBRec_3& shape);
  // Removes the file from every store, the catalog last. Needs no free disk space.
  unsigned RemoveFile(uint32_t oid);
  // Moves the file into the folder under `name` (empty: its own name). A file of that name
  // there is replaced; with `takeOverTarget` the moved file gets its properties and categories.
  unsigned MoveFile(uint32_t oid, uint32_t folderOid, const std::string& name, bool takeOverTarget);
  // Copies the file with its shape data, thumbnail, properties, XMP and categories. With
  // `takeOverTarget` a file of that name in the folder hands its properties and categories to
  // the copy instead.
  unsigned CopyFile(uint32_t oid, uint32_t folderOid, unsigned long& newOid,
                    const std::string& name, bool takeOverTarget);
  // Updates the catalog record only.
  unsigned SetFile(CVXCatFile& file);
  // Updates the record; with a bitmap the shape data too.
  unsigned SetFile(CVXCatFile& file, const CVXBitmap* bitmap, uint32_t crc);
  unsigned RenameFile(uint32_t oid, const std::string& name);
  unsigned GetFile(uint32_t oid, CVXCatFile& file);
  // The records of `count` files from `oids` under one hold of the lock, for a caller that
  // walks many files in turn; codes[i] is what GetFile would answer for oids[i]. Nothing is
  // logged: the caller asks GetFile again for a file it cannot do without.
  unsigned GetFiles(const uint32_t* oids, size_t count, std::vector<CVXCatFile>& files,
                    std::vector<unsigned>& codes);
  unsigned GetFiles(CBitVector& bits);
  unsigned GetFileGroups(uint32_t oid, std::vector<uint32_t>& groups);
  unsigned GetFileGroups(const std::vector<uint32_t>& oids, std::vector<uint32_t>& groups);
  unsigned ReorderGroup(uint32_t oid, uint32_t targetOid, bool before);
  // Adds the folder, or updates the stored folder of the same medium and location.
  unsigned AddFolder(CVXFolder& folder);
  // Removes the folder, its sub-folders and all their files from every store.
  unsigned RemoveFolder(uint32_t oid);
  unsigned GetFolder(uint32_t oid, CVXFolder& folder);
  unsigned SetFolder(const CVXFolder& folder);
  unsigned RenameFolder(uint32_t oid, const CVXURI& uri, const std::string& mediaId,
                        const std::string& mediaSerial);
  unsigned GetFolderFiles(uint32_t oid, std::vector<uint32_t>& files, bool recursive);
  unsigned GetFolderChildren(uint32_t oid, std::vector<uint32_t>& children, bool recursive);

  // ---- Thumbnails, shape data, image properties, XMP and full text ----

  // Smallest and largest thumbnail sizes of a set of files; every field is at least 40.
  struct SThumbSetInfo {
    uint32_t MinWidth = 0;
    uint32_t MaxWidth = 0;
    uint32_t MinHeight = 0;
    uint32_t MaxHeight = 0;
  };

  // Stores `thumb` as the thumbnail of `oid`; the thumbnail takes that OID.
  unsigned AddThumb(uint32_t oid, CVXThumb& thumb);
  // Stores `thumb` under the OID it carries.
  unsigned SetThumb(const CVXThumb& thumb);
  unsigned RemoveThumb(uint32_t oid);
  // 10020 for OID 0 or a file without thumbnail.
  unsigned GetThumb(uint32_t oid, CVXThumb& thumb);
  unsigned GetThumbSetInfo(const std::vector<uint32_t>& oids, SThumbSetInfo& info);
  unsigned GetThumbSetInfo(const CBitVector& oids, SThumbSetInfo& info);
  // The thumbnail settings; not under the lock.
  SVXThumbInfoNew GetThumbInfo() const { return thumbInfo_; }
  // Keeps the settings, and stores them as record 5/1 when the engine is open and mutable.
  void SetThumbInfo(const SVXThumbInfoNew& info);

  // Record 2/OID, 1601 bytes.
  unsigned GetShapeData(uint32_t oid, SVXDBRec_3& record);
  // The records of `sels` back to back, 1601 bytes each, in one read of the store.
  unsigned GetShapeData(const std::vector<CQRLBlobDB::SSelector>& sels, void* buffer);

  // Image properties: one row of table 1000 per file, keyed by the file's OID. Changes mark
  // the persistent selections with property selectors for re-evaluation.
  unsigned AddImageProperties(uint32_t oid, const std::vector<CVXProperty>& properties);
  unsigned SetImageProperties(uint32_t oid, const std::vector<CVXProperty>& properties);
  unsigned RemoveImageProperties(uint32_t oid);
  unsigned GetImageProperties(uint32_t oid, std::vector<CVXProperty>& properties);
  unsigned GetImagePropertiesTable(CVXTable& table);

  // XMP and full text, straight to the XMP database and not under the lock (it has its own):
  // 10001 when it answers 0, else 10020.
  unsigned SetXMP(SXMPRecord* record, bool pending);
  unsigned GetXMP(SXMPRecord* record, bool clearPending);
  unsigned GetXMPPendingUpdates(std::vector<uint32_t>& oids);
  // XMP and full text of the file in one transaction of the XMP database; 10002 when it
  // cannot begin.
  unsigned DeleteXMP(uint32_t oid);
  unsigned SetXMPFTI(uint32_t oid, const std::vector<SFTIRecord>& records);
  unsigned GetXMPFTI(uint32_t oid, std::vector<SFTIRecord>& records);
  unsigned DeleteXMPFTI(uint32_t oid);
  // `flag`, `a` and `b` are those of CVXXMPDB::FTIQuery. Null texts count as empty.
  unsigned FindXMPFTI(const char* tag, const char* text, int flag, std::vector<uint32_t>& oids,
                      int32_t a, int32_t b);
  unsigned GetXMPFTITags(std::vector<SFTITag>& tags);
  unsigned GroupXMPFTITags(const std::string& tag, std::vector<std::string>& values, int32_t a,
                           int32_t b);

  // ---- Names, selections over the catalog, sort arrays, statistics, catalog forwards ----

  // How the file sets of several categories or folders are combined. Any value other than
  // soIntersect unites.
  enum ESelectOp : unsigned {
    soUnion = 0,
    soIntersect = 1,
  };

  // Counts and store sizes of the open database, filled by GetStats.
  struct SVXStats {
    uint32_t Version = 0;  // 768
    uint32_t Files = 0;
    uint32_t Folders = 0;
    uint32_t Groups = 0;
    uint32_t Properties = 0;  // rows of the image properties table
    int32_t LastUpdate = 0;
    uint64_t FileBytes = 0;  // sum of the sizes of all files
    int64_t MatchDBSize = 0;
    int64_t CatalogDBSize = 0;
    int64_t ThumbDBSize = 0;
    int64_t PropDBSize = 0;  // 0 when there is no property store
    int64_t XMPDBSize = 0;
  };

  // False for an empty name or one that holds any of " @ \ | /. Not under the lock.
  static bool IsValidName(const std::string& name);
  // 10001 or 10123, by IsValidName.
  unsigned IsValidSelectionTemplateName(const std::string& name) const;
  // 10123 for an invalid category name (IsValidName, and none of = . ; [ ] @ < >); 10124 when a
  // sibling under `parentOid` (0: the top level) has that name exactly, with case.
  unsigned IsValidGroupName(const std::string& name, uint32_t parentOid);

  // Selections over the catalog. Each empties `out` first and answers 10502 when closed.
  unsigned SelectCategories(const std::vector<uint32_t>& groups, ESelectOp op, CBitVector& out);
  // With soIntersect the first folder's set is intersected too, so the result is empty.
  unsigned SelectFolders(const std::vector<uint32_t>& folders, ESelectOp op, bool recursive,
                         CBitVector& out);
  unsigned SelectFileFormats(const CBitVector& formats, CBitVector& out);
  unsigned SelectCRC(uint32_t crc, CBitVector& out);
  // A square image is both portrait and landscape.
  unsigned SelectByOrientation(bool portrait, CBitVector& out);

  // Stored sort arrays: a 32-bit count and the OIDs, under a selector of the caller's choice.
  unsigned UpdateSortArray(const CQRLBlobDB::SSelector& sel, const std::vector<uint32_t>& oids);
  // Empties `oids` first; 10020 when there is no such array.
  unsigned GetSortArray(const CQRLBlobDB::SSelector& sel, std::vector<uint32_t>& oids);
  // 10020, not logged, when there is no such array.
  unsigned RemoveSortArray(const CQRLBlobDB::SSelector& sel);

  unsigned GetStats(SVXStats& stats);
  // The folder's URI followed by the file's name; 10020 when the file or its folder is missing.
  unsigned GetFileURI(uint32_t oid, CVXURI& uri);
  unsigned GetFileFolder(uint32_t oid, unsigned long& folder);

  // Reorders `oids` into the order in which the records of `type` lie in `store`.
  unsigned OptimizeForSequentialAccess(CQRLBlobDB& store, uint16_t type,
                                       std::vector<uint32_t>& oids);
  // The same for the OIDs of `bits`, delivered in `oids`.
  unsigned OptimizeForSequentialAccess(CQRLBlobDB& store, uint16_t type, const CBitVector& bits,
                                       std::vector<uint32_t>& oids);
  // The same on the shape data of the match store.
  unsigned OptimizeShapeDataAccess(std::vector<uint32_t>& oids);
  unsigned OptimizeShapeDataAccess(const CBitVector& bits, std::vector<uint32_t>& oids);

  // Categories, straight to the catalog. AddGroup gives `group` a new OID first.
  unsigned AddGroup(CVXGroup& group);
  unsigned RemoveGroup(uint32_t oid);
  unsigned SetGroup(const CVXGroup& group);
  unsigned GetGroup(uint32_t oid, CVXGroup& group);
  unsigned GetGroupImages(uint32_t oid, std::vector<uint32_t>& files);
  unsigned GetFullGroupName(uint32_t oid, std::string& name);
  unsigned GetGroupReferrers(uint32_t oid, unsigned refType, std::vector<uint32_t>& groups);
  // Appends below what `children` holds already.
  unsigned GetGroupChildrenRecursive(uint32_t oid, std::vector<uint32_t>& children);
  unsigned GroupDependsOn(uint32_t oid, uint32_t otherOid, bool& depends);
  unsigned GetRootFolders(std::vector<uint32_t>& folders);
  unsigned GetFolders(std::vector<uint32_t>& folders);
  unsigned GetGroups(std::vector<uint32_t>& groups);
  unsigned RemoveFileTransform(uint32_t oid);
  // Does nothing and answers 10001 on a read-only catalog.
  unsigned ClearDynamicGroup(uint32_t oid);

 protected:
  bool Mutable() const;
  // True when the disk of the match store has at least `bytes` free, or the size is unknown.
  bool DiskSpaceCheck(uint64_t bytes) const;
  // Preamble of every mutating operation: 10501 when not mutable, 10005 when the disk is full.
  unsigned CheckMutable_(uint64_t bytes) const;
  void SetUpdated_();

  CQRLBlobDB& MatchStore() { return matchDB_; }
  CQRLBlobDB& ThumbStore() { return thumbDB_; }
  CQRLBlobDB& SortStore() { return sortDB_; }
  SelTempStore& TemplateStore() { return templates_; }

  // ---- protected: files and folders ----

  // Computes the shape data of `bitmap` and stores it as record 2/OID of `file`. A bitmap
  // without pixels gives 10020 and stores nothing.
  unsigned ProcessFile(CVXCatFile& file, const CVXBitmap& bitmap, bool update, uint32_t crc);
  // Removal from every store but the catalog.
  unsigned RemoveDependendItems(uint32_t oid);
  unsigned RemoveFolderDependends(uint32_t oid, bool recursive);
  // The frame of a public operation: the lock (unless `locked` is false), "+ VXEngine::<name>"
  // and "- VXEngine::<name>", exceptions of `body` turned into codes, a failure logged; with
  // `quietMiss` 10020 is an ordinary answer and is not logged.
  unsigned Framed_(const char* name, bool locked, const std::function<unsigned()>& body,
                   bool quietMiss = false);
  // The preamble without the disk check, for operations that free space.
  unsigned CheckMutableNoDisk_(bool logged = true) const;

 private:
  // Every loaded match plug-in forgets the image.
  void RemoveImageFromPlugIns_(uint32_t oid);
  // Drops what AddFile wrote for a new OID that did not make it into the catalog.
  void ForgetNewFile_(uint32_t oid);
  // Removes data that lies under `oid` in the stores although the catalog never listed it.
  void ClearLeftovers_(uint32_t oid);
  // A new file OID from the catalog, free of leftovers.
  uint32_t NewFileOid_();
  // The first file of the folder named `name` by CVXCatFile::CompareNames, other than `skip`.
  uint32_t FindFileInFolder_(uint32_t folderOid, const std::string& name, uint32_t skip) const;
  unsigned AddFileFromThumb_(CVXCatFile& file, CVXThumb& thumb, const SVXDBRec_3& shape);
  unsigned CopyFile_(uint32_t oid, uint32_t folderOid, unsigned long& newOid,
                     const std::string& name, bool takeOverTarget);
  // Gives `to` the shape data, thumbnail, XMP and (unless `skipProperties`) the properties of
  // `from`. Throws when the thumbnail or the properties cannot be stored.
  void CopyDependents_(uint32_t from, uint32_t to, bool skipProperties);
  // What a file takes over from the file it replaced, or a copy from its source. Failures are
  // logged only.
  void ApplyPropertiesAndGroups_(uint32_t oid, const std::vector<CVXProperty>& properties,
                                 const std::vector<uint32_t>& groups);

 protected:
  // ---- protected: thumbnails and properties ----

  struct SThumbSize {
    uint32_t Width = 0;
    uint32_t Height = 0;
  };
  // Store work of the thumbnail operations; the caller holds the lock and passed the preamble.
  unsigned StoreThumb_(const CVXThumb& thumb);
  unsigned ReadThumb_(uint32_t oid, CVXThumb& thumb);
  // Size of the thumbnail of `oid`, from the cache or else from the store.
  bool ThumbSize_(uint32_t oid, SThumbSize& size);
  // Passes `rc` on; on success first marks the selections that read properties for
  // re-evaluation.
  unsigned InvalidateForProperties_(unsigned rc);

  // ---- protected: names, selections, statistics ----

  mutable std::recursive_mutex lock_;

 private:
  void CreateStores_();
  void OpenStores_();
  void LoadCoreInfo_();
  void LoadThumbInfo_();
  void OpenXMPDB_();
  unsigned LoadPlugIns(const std::string& folder, bool onlyKnown);
  unsigned FreePlugIns();
  void InitCoreInfo_();
  unsigned CreatePropertyTable_();
  std::string Path_(const char* ext) const;

  CQRLLogfile* log_ = nullptr;  // not owned
  bool modified_ = false;
  std::atomic<uint64_t> changes_{0};
  SVXCreateInfo info_;
  SVXCoreInfo coreInfo_;
  SVXThumbInfoNew thumbInfo_;
  VXCallback callback_ = nullptr;
  void* callbackUser_ = nullptr;
  CQRLBlobDB matchDB_;
  CVXCatalog catalog_;
  std::unique_ptr<CVXPropDB> propDB_;
  CQRLBlobDB thumbDB_;
  std::unique_ptr<CVXXMPDB> xmpDB_;
  CQRLBlobDB sortDB_;
  SelTempStore templates_;

  // ---- state: thumbnails and properties ----

  // Width and height of thumbnails seen, by file OID; emptied by Close and ReleaseCaches.
  std::map<uint32_t, SThumbSize> thumbSizes_;
  // The shape calculator of ProcessFile, kept so that its luminance buffer serves a run of
  // images; made on first use, dropped by Close and ReleaseCaches. Used only under the lock.
  std::unique_ptr<CShape> shaper_;

  // ---- state: names, selections, statistics ----
};
