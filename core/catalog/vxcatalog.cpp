#include "vxcatalog.h"

#include <algorithm>
#include <vector>

#include "VXEngine.h"
#include "VXException.h"
#include "VXLog.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "vxcatalog_frame.h"
#include "xstring.h"

namespace {

const CQRLBlobDB::SSelector kHeaderSel(CVXCatalog::rtHeader, 1);
const CQRLBlobDB::SSelector kHeaderCopySel(CVXCatalog::rtHeaderCopy, 1);

}  // namespace

CVXCatalog::CVXCatalog() : lastPersSelUpdate_(static_cast<int32_t>(std::time(nullptr))) {}

CVXCatalog::~CVXCatalog() = default;

CQRLLogfile* CVXCatalog::Log_() const { return engine_ ? engine_->LogFile() : nullptr; }

void CVXCatalog::Notify(unsigned message, unsigned long a, unsigned long b, const char* c) {
  if (engine_) engine_->Notify(static_cast<ECBMessage>(message), a, b, c);
}

void CVXCatalog::Reset() {
  VX_LOG(Log_(), 2, "+ CVXCatalog::Reset");
  try {
    dirty_ = false;
    groups_.clear();
    files_.clear();
    folders_.clear();
    header_ = SVXCatalogHeader{};
  } catch (...) {
    VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
    throw;
  }
  VX_LOG(Log_(), 2, "- CVXCatalog::Reset");
}

// Writes the main header, then the copy. A crash between the two leaves one whole copy; only the
// main write decides the result.
unsigned CVXCatalog::StoreHeader() {
  unsigned rc = store_.Set(kHeaderSel, &header_, sizeof header_, 0);
  if (store_.Set(kHeaderCopySel, &header_, sizeof header_, 0) != VX_OK) {
    VX_ERROR(Log_(), VX_NOT_FOUND, "Header Copy");
  }
  return rc;
}

unsigned CVXCatalog::LoadHeader() {
  header_ = SVXCatalogHeader{};
  SVXCatalogHeader buffer;
  unsigned rc = store_.GetExact(kHeaderSel, &buffer, sizeof buffer);
  if (rc != VX_OK) {
    VX_WARN(Log_(), "Failed to load original header. Reverting to backup copy!");
    rc = store_.GetExact(kHeaderCopySel, &buffer, sizeof buffer);
  }
  if (rc == VX_OK) header_ = buffer;
  return rc;
}

void CVXCatalog::Create(const std::string& path) {
  VX_LOG(Log_(), 2, "+ CVXCatalog::Create");
  try {
    persSelDirty_ = false;
    store_.SetLogFile(Log_());
    Close();
    store_.SetLogFile(Log_());
    unsigned rc = store_.Create(path, 0);
    if (rc != VX_OK) VX_THROW(rc);
    rc = StoreHeader();
    if (rc != VX_OK) VX_THROW(rc);
    CreateContent_();
  } catch (...) {
    unsigned rc = VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
    VX_THROW(rc);
  }
  VX_LOG(Log_(), 2, "- CVXCatalog::Create");
}

// A new catalog holds the super category "@All".
void CVXCatalog::CreateContent_() {
  CVXGroup all(VX_ALL_GROUP_OID);
  all.Name() = "@All";
  all.Description() = "This category virtually contains ALL images in your database.";
  all.Parent() = 0;
  groups_[all.Oid()] = all;
  unsigned rc = StoreGroup(all.Oid());
  if (rc != VX_OK) {
    VX_ERROR(Log_(), rc, "Creating super category");
    VX_THROW(rc);
  }
  VX_LOG(Log_(), 3, "  Super Category created");
}

void CVXCatalog::Open(const std::string& path, bool readOnly) {
  VX_LOG(Log_(), 2, "+ CVXCatalog::Open");
  try {
    store_.SetLogFile(Log_());
    Close();
    store_.SetLogFile(Log_());
    unsigned rc = store_.Open(path, readOnly);
    if (rc == VX_SHARING_VIOLATION) {
      VX_WARN(Log_(), "Sharing Violation while opening the database!");
      VX_THROW(rc);
    }
    if (rc != VX_OK) {
      VX_ERROR(Log_(), rc,
               "Error opening files database. Potential database corruption. Run Diagnosis & "
               "Repair!");
      VX_THROW(rc);
    }
    persSelDirty_ = true;
    dirty_ = false;
    interactiveGroup_ = 0;
    bool headerDamaged = false;
    if (LoadHeader() != VX_OK) {
      VX_ERROR(Log_(), VX_NOT_FOUND,
               "BOTH copies of the database header are damage. This is BAD. Check your disk for "
               "potential problems. Restore a backup copy of your database if possible.");
      headerDamaged = true;
    }
    OpenContent_(headerDamaged);
    Notify(cbmLoadStageEnded, 0, 0, nullptr);
  } catch (...) {
    unsigned rc = VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
    VX_THROW(rc);
  }
  VX_LOG(Log_(), 2, "- CVXCatalog::Open");
}

void CVXCatalog::OpenContent_(bool headerDamaged) {
  if (LoadFiles() != VX_OK) {
    VX_ERROR(Log_(), VX_NOT_FOUND, "Loading files");
    VX_THROW(VX_NOT_FOUND);
  }
  if (LoadFolders() != VX_OK) {
    VX_ERROR(Log_(), VX_NOT_FOUND, "Loading folders");
    VX_THROW(VX_NOT_FOUND);
  }
  if (LoadGroups() != VX_OK) {
    VX_ERROR(Log_(), VX_NOT_FOUND, "Loading groups");
    VX_THROW(VX_NOT_FOUND);
  }
  if (headerDamaged) RestoreHeader_();
  if (!store_.IsReadOnly()) CleanPersistantSelections_();
}

// Rebuilds a header whose two copies are lost from the loaded maps. The counters become the
// highest OID in use plus 1, so the next generated OID is two above it; the persistent selection
// counter restarts at 0.
void CVXCatalog::RestoreHeader_() {
  CQRLLogfile* log = Log_();
  VX_LOG(log, 3, "RESTORING damaged header information from database contents: ");
  header_.LastFileOid = HighestOid_(files_, 0) + 1;
  VX_LOGF(log, 3, "  Next file OID: %lu", static_cast<unsigned long>(header_.LastFileOid));
  header_.LastFolderOid = HighestOid_(folders_, 0) + 1;
  VX_LOGF(log, 3, "  Next folder OID: %lu", static_cast<unsigned long>(header_.LastFolderOid));
  header_.LastGroupOid = HighestOid_(groups_, VX_ALL_GROUP_OID) + 1;
  VX_LOGF(log, 3, "  Next group OID: %lu", static_cast<unsigned long>(header_.LastGroupOid));
  header_.LastPersSelOid = 0;
  VX_LOG(log, 3, "  Storing recovered header...");
  StoreHeader();
}

// Highest key of a map, leaving out `ignore`; 0 when there is none.
template <typename T>
uint32_t CVXCatalog::HighestOid_(const std::map<uint32_t, T>& map, uint32_t ignore) {
  for (auto it = map.rbegin(); it != map.rend(); ++it) {
    if (it->first != ignore) return it->first;
  }
  return 0;
}

unsigned CVXCatalog::Flush() { return VX_OK; }

void CVXCatalog::Close() {
  VX_LOG(Log_(), 2, "+ CVXCatalog::Close");
  Flush();
  if (store_.IsOpen()) {
    unsigned rc = store_.Close();
    if (rc != VX_OK) VX_ERROR(Log_(), rc, "Files Database");
  }
}

// Raises one counter of the header and stores the header at once: that write is what keeps the
// counters safe across a crash after adding. The new value is returned even when it failed.
uint32_t CVXCatalog::NextOid_(uint32_t SVXCatalogHeader::*field) {
  uint32_t value = ++(header_.*field);
  unsigned rc = StoreHeader();
  if (rc != VX_OK) VX_ERROR(Log_(), rc, "Storing header for a new OID");
  return value;
}

uint32_t CVXCatalog::GenerateFolderOID() { return NextOid_(&SVXCatalogHeader::LastFolderOid); }
uint32_t CVXCatalog::GenerateFileOID() { return NextOid_(&SVXCatalogHeader::LastFileOid); }
uint32_t CVXCatalog::GenerateGroupOID() { return NextOid_(&SVXCatalogHeader::LastGroupOid); }
uint32_t CVXCatalog::GeneratePersistantSelectionOID() {
  return NextOid_(&SVXCatalogHeader::LastPersSelOid);
}

unsigned CVXCatalog::StoreFile(uint32_t oid) { return StoreRecord_(rtFile, files_, oid); }
unsigned CVXCatalog::StoreFolder(uint32_t oid) { return StoreRecord_(rtFolder, folders_, oid); }
unsigned CVXCatalog::StoreGroup(uint32_t oid) { return StoreRecord_(rtGroup, groups_, oid); }

unsigned CVXCatalog::LoadFile(uint32_t oid, CVXCatFile& file) {
  return LoadRecord_(rtFile, oid, file);
}

unsigned CVXCatalog::LoadFolder(uint32_t oid, CVXFolder& folder) {
  unsigned rc = LoadRecord_(rtFolder, oid, folder);
  ConnectChildren();
  return rc;
}

unsigned CVXCatalog::LoadGroup(uint32_t oid, CVXGroup& group) {
  return LoadRecord_(rtGroup, oid, group);
}
