#include "VXEngine.h"

#include <algorithm>
#include <cstring>
#include <ctime>

#include "QRLLogfile.h"
#include "Shape.h"
#include "VXException.h"
#include "VXFile.h"
#include "VXFileSystem.h"
#include "VXLog.h"
#include "VXPropDB.h"
#include "VXResult.h"
#include "VXTable.h"
#include "VXXMPDB.h"

namespace {

using Sel = CQRLBlobDB::SSelector;
const Sel kCoreInfo(1, 1);
const Sel kCoreInfoCopy(4, 1);
const Sel kThumbInfo(5, 1);
constexpr uint16_t kShapeRecord = 2;

}  // namespace

CVXEngine::CVXEngine() {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  thumbInfo_.Depth = 24;
  thumbInfo_.Quality = 85;
  propDB_ = std::make_unique<CVXPropDB>();
  xmpDB_ = std::make_unique<CVXXMPDB>();
  catalog_.SetEngine(this);
  templates_.SetEngine(this);
}

CVXEngine::~CVXEngine() { Close(); }

bool CVXEngine::IsModified() const { return modified_; }

void CVXEngine::SetLogFile(CQRLLogfile* log) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  log_ = log;
}

CQRLLogfile* CVXEngine::LogFile() const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  return log_;
}

bool CVXEngine::IsOpen() const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  return matchDB_.IsOpen();
}

bool CVXEngine::IsReadOnly() const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  return matchDB_.IsReadOnly();
}

bool CVXEngine::Mutable() const { return IsOpen() && !IsReadOnly(); }

std::string CVXEngine::Path_(const char* ext) const {
  return CVXFileSystem::ChangeExt(info_.Name, ext);
}

std::string CVXEngine::StorePath(const char* ext) const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  return ext && *ext ? Path_(ext) : info_.Name;
}

void CVXEngine::Notify(ECBMessage message, unsigned long a, unsigned long b, const char* text) {
  if (VXCallback callback = callback_) callback(message, callbackUser_, a, b, text);
}

void CVXEngine::BlobDBCallback_(CQRLBlobDB::ECBMessage message, unsigned long a, unsigned long b,
                                void* user, const char* /*text*/) {
  if (message == CQRLBlobDB::cbProgress && user) {
    static_cast<CVXEngine*>(user)->Notify(cbmProgress, a, b, nullptr);
  }
}

bool CVXEngine::DiskSpaceCheck(uint64_t bytes) const {
  if (!matchDB_.IsOpen()) return true;
  std::string drive;
  std::string name = matchDB_.GetName();
  CVXFileSystem::SplitPath(name, &drive, nullptr, nullptr, nullptr);
  uint64_t free = 0;
  // A POSIX path has no drive: the file system of the store itself is the one to ask.
  if (!CVXFileSystem::GetFreeDiskSpace(drive.empty() ? name : drive, free)) {
    VX_ERROR(log_, VX_DISK_FULL, "Unable to get disk free space");
    return false;
  }
  if ((free >> 32) != 0) return true;
  if (free < bytes) {
    VX_WARN(log_, "Insufficient disk space");
    return false;
  }
  return true;
}

unsigned CVXEngine::CheckMutable_(uint64_t bytes) const {
  if (!Mutable()) {
    VX_ERROR(log_, VX_NOT_MUTABLE, "Engine not mutable");
    return VX_NOT_MUTABLE;
  }
  return DiskSpaceCheck(bytes) ? VX_OK : VX_DISK_FULL;
}

void CVXEngine::SetUpdated_() {
  modified_ = true;
  changes_.fetch_add(1, std::memory_order_acq_rel);
  coreInfo_.LastUpdate = static_cast<int32_t>(std::time(nullptr));
}

void CVXEngine::InitCoreInfo_() {
  coreInfo_ = SVXCoreInfo{};
  std::memcpy(coreInfo_.Magic, "VXDB", 4);
  coreInfo_.Version = VX_CORE_INFO_VERSION;
  thumbInfo_ = info_.ThumbInfo;
  SetUpdated_();
}

// ---------------------------------------------------------------------------------------------
// Create

unsigned CVXEngine::Create(const SVXCreateInfo& info) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  VX_LOG(log_, 2, "+ VXEngine::Create");
  unsigned rc = VX_OK;
  try {
    info_ = info;
    Close();
    catalog_.Reset();
    InitCoreInfo_();
    CreateStores_();
  } catch (...) {
    rc = VXCodeOfCurrentException(log_, __LINE__, __FILE__);
  }
  if (rc != VX_OK) Close();
  VX_LOG(log_, 2, "- VXEngine::Create");
  if (rc != VX_OK) VX_ERROR(log_, rc, "VXEngine::Create");
  return rc;
}

void CVXEngine::CreateStores_() {
  unsigned rc = matchDB_.Create(info_.Name, info_.CreateFlag ? 1 : 0);
  if (rc != VX_OK) VX_THROW(rc);
  if ((rc = matchDB_.Set(kCoreInfo, &coreInfo_, sizeof coreInfo_, 0)) != VX_OK) {
    VX_ERROR(log_, rc, "Adding core info");
    VX_THROW(rc);
  }
  if ((rc = matchDB_.Set(kThumbInfo, &thumbInfo_, sizeof thumbInfo_, 0)) != VX_OK ||
      (rc = matchDB_.Set(kCoreInfoCopy, &coreInfo_, sizeof coreInfo_, 0)) != VX_OK) {
    VX_ERROR(log_, rc, "Adding core info copy");
    VX_THROW(rc);
  }
  VX_LOG(log_, 3, "New feature match database created");
  EnableCaching(info_.EnableCaching, info_.CacheSize);

  propDB_->SetLogfile(log_);
  if ((rc = propDB_->Create(Path_(".vxp"))) != VX_OK || (rc = CreatePropertyTable_()) != VX_OK) {
    VX_ERROR(log_, rc, "Creating property database");
    VX_THROW(rc);
  }
  thumbDB_.SetLogFile(log_);
  if ((rc = thumbDB_.Create(Path_(".vxt"), 0)) != VX_OK) {
    VX_ERROR(log_, rc, "Creating thumbnail database");
    VX_THROW(rc);
  }
  sortDB_.SetLogFile(log_);
  if ((rc = sortDB_.Create(Path_(".vxlt"), 0)) != VX_OK) {
    VX_ERROR(log_, rc, "Creating sort database");
    VX_THROW(rc);
  }
  if ((rc = templates_.Create(Path_(".vxl"))) != VX_OK) {
    VX_ERROR(log_, rc, "Creating selection template database");
    VX_THROW(rc);
  }
  catalog_.Create(Path_(".vxc"));

  VX_LOG(log_, 3, "  Creating XMPDB");
  xmpDB_->SetLogFile(log_);
  if (int xrc = xmpDB_->Create(Path_(".v3x")); xrc != 0) {
    VX_LOGF(log_, 1, "    Failed to create database with %ld '%s'", static_cast<long>(xrc),
            xmpDB_->GetLastErrorMsg().c_str());
  } else {
    VX_LOG(log_, 3, "  Creating XMPDB completed");
  }
  if (!info_.PlugInFolder.empty()) {
    // Each loaded plug-in gets its store and its id pair here once plug-ins can be loaded.
    LoadPlugIns(info_.PlugInFolder, false);
  }
}

// The image properties table exists from the start, without columns: the host defines the
// columns it fills.
unsigned CVXEngine::CreatePropertyTable_() {
  CVXTable table(VX_IMAGE_PROPERTIES_TABLE);
  table.Properties().Name = "Image Properties";
  return propDB_->CreateTable(table);
}

// ---------------------------------------------------------------------------------------------
// Open

unsigned CVXEngine::Open(const SVXCreateInfo& info, VXCallback callback, void* user) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  VX_LOG(log_, 2, "+ VXEngine::Open");
  unsigned rc = VX_OK;
  try {
    info_ = info;
    callback_ = callback;
    callbackUser_ = user;
    Close();
    OpenStores_();
  } catch (...) {
    rc = VXCodeOfCurrentException(log_, __LINE__, __FILE__);
  }
  callback_ = nullptr;
  callbackUser_ = nullptr;
  if (rc != VX_OK) Close();
  VX_LOG(log_, 2, "- VXEngine::Open");
  if (rc != VX_OK) VX_ERROR(log_, rc, "VXEngine::Open");
  return rc;
}

// Opens the stores in their fixed order. The first fatal store throws; the XMP store only logs
// and the sort store is recreated when it cannot be opened.
void CVXEngine::OpenStores_() {
  VX_LOG(log_, 3, "  Loading catalog");
  catalog_.Reset();
  catalog_.Open(Path_(".vxc"), info_.ReadOnly);
  VX_LOG(log_, 3, "  Done.");

  VX_LOG(log_, 3, "  Opening feature match database");
  matchDB_.SetLogFile(log_);
  unsigned rc = matchDB_.Open(info_.Name, info_.ReadOnly);
  if (rc == VX_SHARING_VIOLATION) {
    VX_ERROR(log_, rc,
             "Error opening feature match database. Database already opened by another "
             "application!");
    VX_THROW(rc);
  }
  if (rc != VX_OK) {
    VX_ERROR(log_, rc,
             "Error opening feature match database. Potential database corruption. Run "
             "Diagnosis & Repair!");
    VX_THROW(rc);
  }
  VX_LOG(log_, 3, "  Done");
  EnableCaching(info_.EnableCaching, info_.CacheSize);
  LoadCoreInfo_();
  LoadThumbInfo_();

  VX_LOG(log_, 3, "  Opening properties database");
  propDB_->SetLogfile(log_);
  if ((rc = propDB_->Open(Path_(".vxp"), info_.ReadOnly)) != VX_OK) {
    VX_ERROR(log_, rc, "Opening property database");
    VX_THROW(rc);
  }
  VX_LOG(log_, 3, "  Opening thumbnail database");
  thumbDB_.SetLogFile(log_);
  if ((rc = thumbDB_.Open(Path_(".vxt"), info_.ReadOnly)) != VX_OK) {
    // The wording names the match store on purpose; hosts match on it.
    VX_ERROR(log_, rc,
             "Error opening feature match database. Potential database corruption. Run "
             "Diagnosis & Repair!");
    VX_THROW(rc);
  }
  OpenXMPDB_();

  VX_LOG(log_, 3, "  Opening sort database");
  sortDB_.SetLogFile(log_);
  if (sortDB_.Open(Path_(".vxlt"), info_.ReadOnly) != VX_OK &&
      (rc = sortDB_.Create(Path_(".vxlt"), 0)) != VX_OK) {
    VX_ERROR(log_, rc,
             "Error opening sort database. Potential database corruption. Run Diagnosis & "
             "Repair!");
    VX_THROW(rc);
  }
  VX_LOG(log_, 3, "  Opening selection templates database");
  if ((rc = templates_.Open(Path_(".vxl"), info_.ReadOnly)) != VX_OK) {
    VX_ERROR(log_, rc, "Opening selection template database");
    VX_THROW(rc);
  }
  VX_LOG(log_, 3, "  Loading plug-in modules");
  if ((rc = LoadPlugIns(info_.PlugInFolder, true)) != VX_OK) {
    VX_ERROR(log_, rc, "Loading plug-in modules");
    VX_THROW(rc);
  }
}

// Reads the core info from 1/1, falling back to the copy in 4/1.
void CVXEngine::LoadCoreInfo_() {
  auto read = [this](const Sel& sel) {
    SVXCoreInfo info;
    unsigned rc = matchDB_.GetExact(sel, &info, sizeof info);
    if (rc == VX_OK) coreInfo_ = info;
    return rc;
  };
  if (read(kCoreInfo) == VX_OK) return;
  VX_WARN(log_, "Loading core info");
  VX_LOG(log_, 3, "Loading core info copy");
  if (unsigned rc = read(kCoreInfoCopy); rc != VX_OK) {
    VX_ERROR(log_, rc, "Loading core info copy");
    VX_THROW(rc);
  }
}

// Reads the thumbnail settings from 5/1. A database that lacks the record gets one seeded from
// the old fields of the core info; an unreadable record is replaced by defaults.
void CVXEngine::LoadThumbInfo_() {
  if (matchDB_.HasRecord(kThumbInfo)) {
    SVXThumbInfoNew info;
    unsigned rc = matchDB_.GetExact(kThumbInfo, &info, sizeof info);
    if (rc == VX_OK) {
      thumbInfo_ = info;
      return;
    }
    // The wording names the core info copy on purpose; hosts match on it.
    VX_WARN(log_, "Loading core info copy");
    thumbInfo_ = SVXThumbInfoNew{};
    thumbInfo_.Width = thumbInfo_.Height = 200;
    thumbInfo_.Depth = 24;
    thumbInfo_.Quality = 75;
  } else {
    thumbInfo_ = SVXThumbInfoNew{};
    thumbInfo_.Field0 = coreInfo_.OldThumbField0;
    thumbInfo_.Width = coreInfo_.OldThumbWidth;
    thumbInfo_.Height = coreInfo_.OldThumbHeight;
    thumbInfo_.Depth = coreInfo_.OldThumbDepth;
    thumbInfo_.Quality = coreInfo_.OldThumbQuality;
  }
  thumbInfo_.Version = 1;
  if (unsigned rc = matchDB_.Set(kThumbInfo, &thumbInfo_, sizeof thumbInfo_, 0); rc != VX_OK) {
    VX_ERROR(log_, rc, "Storing thumbnail settings");
  }
}

// The XMP store is not fatal: a failure to create or open it is logged and the open goes on.
void CVXEngine::OpenXMPDB_() {
  VX_LOG(log_, 3, "  Opening XMP database");
  std::string path = Path_(".v3x");
  xmpDB_->SetLogFile(log_);
  if (!CVXFile::FileExists(path)) {
    VX_LOG(log_, 3, "    Creating XMP database");
    if (int rc = xmpDB_->Create(path); rc != 0) {
      VX_LOGF(log_, 1, "    Failed to create database with %ld '%s'", static_cast<long>(rc),
              xmpDB_->GetLastErrorMsg().c_str());
    }
    xmpDB_->Close();
  }
  if (int rc = xmpDB_->Open(path); rc != 0) {
    VX_LOGF(log_, 1, "    Failed to open database with %ld '%s'", static_cast<long>(rc),
            xmpDB_->GetLastErrorMsg().c_str());
  }
}

// ---------------------------------------------------------------------------------------------
// Flush and Close

unsigned CVXEngine::Flush() {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  VX_LOG(log_, 2, "+ VXEngine::Flush");
  VX_LOG(log_, 3, "Flushing catalog to disk");
  catalog_.Flush();
  VX_LOG(log_, 3, "Done");
  unsigned rc = VX_OK;
  if (matchDB_.IsOpen() && !matchDB_.IsReadOnly() && IsModified()) {
    // Main copy first, then the backup: a crash between the two leaves one intact copy.
    VX_LOG(log_, 3, "Flushing core info");
    if (unsigned r = matchDB_.Set(kCoreInfo, &coreInfo_, sizeof coreInfo_, 0); r != VX_OK) {
      VX_ERROR(log_, r, "Flushing core info");
    }
    if (unsigned r = matchDB_.Set(kCoreInfoCopy, &coreInfo_, sizeof coreInfo_, 0); r != VX_OK) {
      VX_ERROR(log_, r, "Flushing core info copy");
    }
    VX_LOG(log_, 3, "Flushing match feature database");
    matchDB_.Flush();
    VX_LOG(log_, 3, "Flushing property database");
    VX_LOG(log_, 3, "Flushing selection storage");
    rc = templates_.Flush();
  }
  modified_ = false;
  VX_LOG(log_, 2, "- VXEngine::Flush");
  return rc;
}

unsigned CVXEngine::Close() {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  changes_.fetch_add(1, std::memory_order_acq_rel);
  VX_LOG(log_, 2, "+ VXEngine::Close");
  unsigned rc = VX_OK;
  // A failed Open may have opened the catalog before the match store: close whatever is open.
  if (matchDB_.IsOpen() || catalog_.BlobDB().IsOpen()) {
    Flush();
    if (matchDB_.IsOpen()) {
      matchDB_.Close();
      VX_LOG(log_, 3, "    Match Database closed");
    }
    catalog_.Close();
    VX_LOG(log_, 3, "    Catalog Database closed");
    if (propDB_->Close() != VX_OK) VX_ERROR(log_, VX_NOT_FOUND, "Closing Property Database");
    VX_LOG(log_, 3, "    Property Database closed");
    if (thumbDB_.IsOpen() && thumbDB_.Close() != VX_OK) {
      VX_ERROR(log_, VX_NOT_FOUND, "Closing Thumbnail Database");
    }
    VX_LOG(log_, 3, "    Thumbnail Database closed");
    xmpDB_->Close();
    VX_LOG(log_, 3, "  XMP database closed");
    if (sortDB_.IsOpen() && sortDB_.Close() != VX_OK) {
      VX_ERROR(log_, VX_NOT_FOUND, "Closing Sort Database");
    }
    VX_LOG(log_, 3, "    Sort Database closed");
    if (templates_.Close() != VX_OK) {
      VX_ERROR(log_, VX_NOT_FOUND, "Closing Selection Template Store");
    }
    VX_LOG(log_, 3, "    Selection Template Store closed");
    if ((rc = FreePlugIns()) != VX_OK) VX_ERROR(log_, rc, "Unloading plug-in modules");
    VX_LOG(log_, 3, "    Plug-in modules unloaded");
  }
  thumbSizes_.clear();
  shaper_.reset();
  VX_LOG(log_, 2, "Done");
  return rc;
}

// Plug-in modules come with the plug-in host; until then there is nothing to load or free.
unsigned CVXEngine::LoadPlugIns(const std::string& /*folder*/, bool /*onlyKnown*/) {
  VX_LOG(log_, 2, "+ VXEngine::Loading Plug-Ins");
  FreePlugIns();
  VX_LOG(log_, 2, "- Done");
  return VX_OK;
}

unsigned CVXEngine::FreePlugIns() {
  VX_LOG(log_, 2, "+ VXEngine::Unloading Plug-Ins");
  VX_LOG(log_, 2, "- Done");
  return VX_OK;
}

// ---------------------------------------------------------------------------------------------
// Small accessors

unsigned CVXEngine::GetPathAndName(std::string& name) const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  if (!matchDB_.IsOpen()) {
    name.clear();
    return VX_NOT_OPEN;
  }
  name = matchDB_.GetName();
  return VX_OK;
}

void CVXEngine::GetAppData(uint8_t (&data)[VX_APP_DATA_SIZE]) const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  std::memcpy(data, coreInfo_.AppData, VX_APP_DATA_SIZE);
}

unsigned CVXEngine::SetAppData(const void* data, size_t size) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  if (!data && size) return VX_NOT_FOUND;
  std::memcpy(coreInfo_.AppData, data, std::min<size_t>(size, VX_APP_DATA_SIZE));
  SetUpdated_();
  return VX_OK;
}

int32_t CVXEngine::LastUpdate() const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  return coreInfo_.LastUpdate;
}

int32_t CVXEngine::LastPersistantSelectionUpdate() const {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  return catalog_.LastPersistantSelectionUpdate();
}

void CVXEngine::EnableCaching(bool enable, unsigned size) {
  if (!enable) ReleaseCaches();
  matchDB_.EnableCaching(enable, size, 0);
  if (matchDB_.CachingEnabled()) matchDB_.EnableSelectorCache(kShapeRecord, true);
}

void CVXEngine::ReleaseCaches() {
  Flush();
  matchDB_.ReleaseCaches();
  thumbDB_.ReleaseCaches();
  sortDB_.ReleaseCaches();
  std::lock_guard<std::recursive_mutex> lock(lock_);
  thumbSizes_.clear();
  shaper_.reset();
}
