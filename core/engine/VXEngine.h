#pragma once

#include <cstdint>
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
  SVXThumbInfoNew GetThumbInfo() const { return thumbInfo_; }
  void SetThumbInfo(const SVXThumbInfoNew& info) { thumbInfo_ = info; }

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

  // ---- Thumbnails, shape data, image properties, XMP and full text ----

  // ---- Names, selections over the catalog, sort arrays, statistics, catalog forwards ----

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

  // ---- protected: thumbnails and properties ----

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

  // ---- state: names, selections, statistics ----
};
