// Thumbnails with their size cache, shape data, image properties, and the XMP and full-text
// pass-through of the engine.
#include "VXEngine.h"

#include <algorithm>

#include "QRLLogfile.h"
#include "SQLiteTransaction.h"
#include "VXLog.h"
#include "VXMatchInfo.h"
#include "VXMemFile.h"
#include "VXPropDB.h"
#include "VXResult.h"
#include "VXTable.h"
#include "VXThumb.h"
#include "VXXMPDB.h"

namespace {

using Sel = CQRLBlobDB::SSelector;
constexpr uint16_t kShapeRecord = 2;
constexpr uint16_t kThumbRecord = 3;
const Sel kThumbInfo(5, 1);
constexpr uint64_t kThumbSpace = 0x80000;
// A thumbnail is built and read in one memory file; most fit the first allocation.
constexpr size_t kThumbBuffer = 16384;
constexpr size_t kThumbGrowth = 4096;
constexpr uint32_t kMinThumbSetSize = 40;

// The XMP database answers 0 or an error of its own; the engine's callers see one code.
unsigned XMPResult(int rc) { return rc == 0 ? VX_OK : VX_NOT_FOUND; }

// Orders a folded minimum and maximum and lifts both to the smallest size a set may show.
void Limit(uint32_t& low, uint32_t& high) {
  uint32_t a = std::min(low, high);
  uint32_t b = std::max(low, high);
  low = std::max(a, kMinThumbSetSize);
  high = std::max(b, kMinThumbSetSize);
}

}  // namespace

// ---------------------------------------------------------------------------------------------
// Thumbnails

unsigned CVXEngine::StoreThumb_(const CVXThumb& thumb) {
  CVXMemFile mem(false, kThumbBuffer, kThumbGrowth);
  thumb.Write(mem);
  return thumbDB_.Set(Sel(kThumbRecord, thumb.Oid()), mem.GetBuffer(),
                      static_cast<unsigned>(mem.GetFileSize()));
}

unsigned CVXEngine::ReadThumb_(uint32_t oid, CVXThumb& thumb) {
  Sel sel(kThumbRecord, oid);
  unsigned size = 0;
  unsigned rc = thumbDB_.GetSize(sel, size);
  if (rc != VX_OK) return rc;
  CVXMemFile mem(false, kThumbBuffer, kThumbGrowth);
  if ((rc = thumbDB_.Get(sel, mem.GetBuffer(size), size)) != VX_OK) return rc;
  thumb.Read(mem);
  thumbSizes_[oid] = SThumbSize{thumb.Width(), thumb.Height()};
  return VX_OK;
}

unsigned CVXEngine::AddThumb(uint32_t oid, CVXThumb& thumb) {
  return Framed_("AddThumb", true, [&] {
    unsigned rc = CheckMutable_(kThumbSpace);
    if (rc != VX_OK) return rc;
    SetUpdated_();
    thumb.Oid() = oid;
    rc = StoreThumb_(thumb);
    thumbSizes_.erase(oid);
    return rc;
  });
}

unsigned CVXEngine::SetThumb(const CVXThumb& thumb) {
  return Framed_("SetThumb", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    SetUpdated_();
    if ((rc = StoreThumb_(thumb)) == VX_OK) {
      thumbSizes_[thumb.Oid()] = SThumbSize{thumb.Width(), thumb.Height()};
    }
    return rc;
  });
}

unsigned CVXEngine::RemoveThumb(uint32_t oid) {
  return Framed_("RemoveThumb", true, [&] {
    unsigned rc = CheckMutableNoDisk_(false);
    if (rc != VX_OK) return rc;
    SetUpdated_();
    rc = thumbDB_.Remove(Sel(kThumbRecord, oid));
    thumbSizes_.erase(oid);
    return rc;
  });
}

// A missing thumbnail is an everyday answer and is not logged.
unsigned CVXEngine::GetThumb(uint32_t oid, CVXThumb& thumb) {
  return Framed_(
      "GetThumb", true, [&] { return oid == 0 ? unsigned{VX_NOT_FOUND} : ReadThumb_(oid, thumb); },
      true);
}

bool CVXEngine::ThumbSize_(uint32_t oid, SThumbSize& size) {
  if (auto it = thumbSizes_.find(oid); it != thumbSizes_.end()) {
    size = it->second;
    return true;
  }
  CVXThumb thumb;
  try {
    if (oid == 0 || ReadThumb_(oid, thumb) != VX_OK) return false;
  } catch (...) {
    VXCodeOfCurrentException(log_, __LINE__, __FILE__);  // a damaged thumbnail counts as none
    return false;
  }
  size = SThumbSize{thumb.Width(), thumb.Height()};
  return true;
}

unsigned CVXEngine::GetThumbSetInfo(const std::vector<uint32_t>& oids, SThumbSetInfo& info) {
  return Framed_("GetThumbSetInfo", true, [&] {
    info = SThumbSetInfo{};
    for (uint32_t oid : oids) {
      SThumbSize size;
      if (!ThumbSize_(oid, size)) continue;
      // The minimums start at 0 and so stay 0; Limit turns them into the floor of 40.
      info.MinWidth = std::min(info.MinWidth, size.Width);
      info.MaxWidth = std::max(info.MaxWidth, size.Width);
      info.MinHeight = std::min(info.MinHeight, size.Height);
      info.MaxHeight = std::max(info.MaxHeight, size.Height);
    }
    Limit(info.MinWidth, info.MaxWidth);
    Limit(info.MinHeight, info.MaxHeight);
    return VX_OK;
  });
}

unsigned CVXEngine::GetThumbSetInfo(const CBitVector& oids, SThumbSetInfo& info) {
  std::vector<uint32_t> list;
  oids.Convert(list);
  return GetThumbSetInfo(list, info);
}

// Takes the lock, unlike GetThumbInfo: the match store must not see two writers at once.
void CVXEngine::SetThumbInfo(const SVXThumbInfoNew& info) {
  std::lock_guard<std::recursive_mutex> lock(lock_);
  thumbInfo_ = info;
  if (Mutable()) matchDB_.Set(kThumbInfo, &thumbInfo_, sizeof thumbInfo_, 0);
}

// ---------------------------------------------------------------------------------------------
// Shape data

unsigned CVXEngine::GetShapeData(uint32_t oid, SVXDBRec_3& record) {
  return Framed_("GetShapeData", true,
                 [&] { return matchDB_.GetExact(Sel(kShapeRecord, oid), &record, sizeof record); });
}

unsigned CVXEngine::GetShapeData(const std::vector<CQRLBlobDB::SSelector>& sels, void* buffer) {
  return Framed_("GetShapeData", true, [&]() -> unsigned {
    if (!buffer && !sels.empty()) return VX_NOT_FOUND;
    // The bound keeps a damaged record of another size from writing past the caller's buffer.
    return matchDB_.Get(sels, buffer, uint64_t{sizeof(SVXDBRec_3)} * sels.size());
  });
}

// ---------------------------------------------------------------------------------------------
// Image properties

unsigned CVXEngine::InvalidateForProperties_(unsigned rc) {
  if (rc == VX_OK) catalog_.InvalidatePersistantSelectionsForProps();
  return rc;
}

unsigned CVXEngine::AddImageProperties(uint32_t oid, const std::vector<CVXProperty>& properties) {
  return Framed_("AddImageProperties", true, [&] {
    unsigned rc = CheckMutable_(kThumbSpace);
    if (rc != VX_OK) return rc;
    SetUpdated_();
    unsigned long key = oid;
    return InvalidateForProperties_(
        propDB_->AddRecord(VX_IMAGE_PROPERTIES_TABLE, key, properties, true));
  });
}

unsigned CVXEngine::SetImageProperties(uint32_t oid, const std::vector<CVXProperty>& properties) {
  return Framed_("SetImageProperties", true, [&] {
    unsigned rc = CheckMutable_(kThumbSpace);
    if (rc != VX_OK) return rc;
    SetUpdated_();
    if (propDB_->HasRecord(VX_IMAGE_PROPERTIES_TABLE, oid)) {
      rc = propDB_->SetRecord(VX_IMAGE_PROPERTIES_TABLE, oid, properties);
    } else {
      unsigned long key = oid;
      rc = propDB_->AddRecord(VX_IMAGE_PROPERTIES_TABLE, key, properties, true);
    }
    return InvalidateForProperties_(rc);
  });
}

// A file without properties has nothing to remove, which counts as success.
unsigned CVXEngine::RemoveImageProperties(uint32_t oid) {
  return Framed_("RemoveImageProperties", true, [&] {
    unsigned rc = CheckMutableNoDisk_();
    if (rc != VX_OK) return rc;
    SetUpdated_();
    rc = propDB_->RemoveRecord(VX_IMAGE_PROPERTIES_TABLE, oid);
    return InvalidateForProperties_(rc == VX_NOT_FOUND ? VX_OK : rc);
  });
}

unsigned CVXEngine::GetImageProperties(uint32_t oid, std::vector<CVXProperty>& properties) {
  return Framed_("GetImageProperties", true,
                 [&] { return propDB_->GetRecord(VX_IMAGE_PROPERTIES_TABLE, oid, properties); });
}

unsigned CVXEngine::GetImagePropertiesTable(CVXTable& table) {
  return Framed_("GetImagePropertiesTable", true, [&] {
    table.Properties().Table = VX_IMAGE_PROPERTIES_TABLE;
    return propDB_->GetTable(table);
  });
}

// ---------------------------------------------------------------------------------------------
// XMP and full text: the XMP database serialises its own callers, so none of these takes the
// engine's lock.

unsigned CVXEngine::SetXMP(SXMPRecord* record, bool pending) {
  return Framed_("SetXMP", false,
                 [&] { return record ? XMPResult(xmpDB_->Set(*record, pending)) : VX_NOT_FOUND; });
}

unsigned CVXEngine::GetXMP(SXMPRecord* record, bool clearPending) {
  return Framed_("GetXMP", false, [&] {
    return record ? XMPResult(xmpDB_->Get(*record, clearPending)) : VX_NOT_FOUND;
  });
}

unsigned CVXEngine::GetXMPPendingUpdates(std::vector<uint32_t>& oids) {
  return Framed_("GetXMPPendingUpdates", false,
                 [&] { return XMPResult(xmpDB_->GetPendingUpdates(oids)); });
}

unsigned CVXEngine::DeleteXMP(uint32_t oid) {
  return Framed_("DeleteXMP", false, [&] {
    CSQLiteTransaction transaction(*xmpDB_);
    if (!transaction.BeginTrans()) return unsigned{VX_UNKNOWN_EXCEPTION};
    if (xmpDB_->Delete(oid) != 0) return unsigned{VX_NOT_FOUND};
    unsigned rc = DeleteXMPFTI(oid);
    if (rc == VX_OK && !transaction.Commit()) rc = VX_NOT_FOUND;
    return rc;
  });
}

unsigned CVXEngine::SetXMPFTI(uint32_t oid, const std::vector<SFTIRecord>& records) {
  return Framed_("SetXMPFTI", false, [&] { return XMPResult(xmpDB_->FTISetU(oid, records)); });
}

unsigned CVXEngine::GetXMPFTI(uint32_t oid, std::vector<SFTIRecord>& records) {
  return Framed_("GetXMPFTI", false, [&] { return XMPResult(xmpDB_->FTIGet(oid, records)); });
}

unsigned CVXEngine::DeleteXMPFTI(uint32_t oid) {
  return Framed_("DeleteXMPFTI", false, [&] { return XMPResult(xmpDB_->FTIDelete(oid)); });
}

unsigned CVXEngine::FindXMPFTI(const char* tag, const char* text, int flag,
                               std::vector<uint32_t>& oids, int32_t a, int32_t b) {
  return Framed_("FindXMPFTI", false, [&] {
    return XMPResult(xmpDB_->FTIQuery(tag ? tag : "", text ? text : "", flag, oids, a, b));
  });
}

unsigned CVXEngine::GetXMPFTITags(std::vector<SFTITag>& tags) {
  return Framed_("GetXMPFTITags", false, [&] { return XMPResult(xmpDB_->FTIGetTags(tags)); });
}

unsigned CVXEngine::GroupXMPFTITags(const std::string& tag, std::vector<std::string>& values,
                                    int32_t a, int32_t b) {
  return Framed_("GroupXMPFTITags", false,
                 [&] { return XMPResult(xmpDB_->FTIGroupTags(tag, values, a, b)); });
}
