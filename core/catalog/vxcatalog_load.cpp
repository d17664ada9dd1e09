// Bulk loading of the catalog: files in batches, folders and categories one at a time, each with
// its progress messages.

#include <algorithm>
#include <condition_variable>
#include <exception>
#include <mutex>
#include <system_error>
#include <thread>
#include <utility>

#include "VXEngineTypes.h"
#include "vxcatalog_frame.h"
#include "xstring.h"

namespace {

constexpr size_t kFileBatch = 5000;

// Percentage of a load: truncated, at most 100, and 100 when there is nothing to load.
unsigned Percent(size_t done, size_t total) {
  double value = done * 100.0 / static_cast<double>(total ? total : 1);
  return static_cast<unsigned>(std::min(100.0, value));
}

// One batch of file records: their OIDs and their bytes one behind the other.
struct SFileBatch {
  std::vector<uint32_t> oids;
  std::vector<uint8_t> bytes;
};

// Passes batches from the thread that reads the store to the one that decodes them. One read
// batch waits at most, so the reader stays a batch ahead and the bytes are still in the cache
// when they are decoded; the buffers go round between the two threads.
class CBatchHandoff {
 public:
  // Reader: hands over the batch, getting emptied buffers back; false once the decoder left.
  bool Put(std::vector<uint32_t>& oids, std::vector<uint8_t>& bytes) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return !full_ || abandoned_; });
    if (abandoned_) return false;
    slot_.oids.swap(oids);
    slot_.bytes.swap(bytes);
    full_ = true;
    changed_.notify_all();
    return true;
  }
  void Finish(unsigned rc, std::exception_ptr error) {
    std::lock_guard lock(mutex_);
    rc_ = rc;
    error_ = std::move(error);
    finished_ = true;
    changed_.notify_all();
  }
  // Decoder: the next batch into `batch`, whose old buffers go back to the reader; false when
  // the reader has finished and nothing waits.
  bool Take(SFileBatch& batch) {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return full_ || finished_; });
    if (!full_) return false;
    batch.oids.swap(slot_.oids);
    batch.bytes.swap(slot_.bytes);
    slot_.oids.clear();
    slot_.bytes.clear();
    full_ = false;
    changed_.notify_all();
    return true;
  }
  // Decoder: stops taking; a reader waiting to put returns.
  void Abandon() {
    std::lock_guard lock(mutex_);
    abandoned_ = true;
    changed_.notify_all();
  }
  // The reader's result; only after it has been joined.
  unsigned Result(std::exception_ptr& error) const {
    error = error_;
    return rc_;
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  SFileBatch slot_;
  bool full_ = false;
  bool finished_ = false;
  bool abandoned_ = false;
  unsigned rc_ = VX_OK;
  std::exception_ptr error_;
};

// Decodes the batches into the file map while the store is still being read, and keeps where and
// how the first of them failed: the catalog reports that failure afterwards, in its place among
// the batches.
class CFileDecoder {
 public:
  explicit CFileDecoder(std::map<uint32_t, CVXCatFile>& files) : files_(files) {}
  CFileDecoder(const CFileDecoder&) = delete;
  CFileDecoder& operator=(const CFileDecoder&) = delete;
  ~CFileDecoder() { Discard_(error_); }

  void Decode(const std::vector<uint32_t>& oids, const std::vector<uint8_t>& bytes) {
    size_t first = listed_;
    listed_ += oids.size();
    if (failed_) return;
    if (bytes.size() > UINT32_MAX) {  // the batch's size would not have been taken
      failedOids_ = oids;
      return Fail_(first, nullptr);
    }
    const uint8_t* at = bytes.data();
    const uint8_t* end = at + bytes.size();
    try {
      // OIDs rise, so each record goes at the end. A record that does not read is not added.
      for (uint32_t oid : oids) {
        files_.emplace_hint(files_.end(), std::piecewise_construct, std::forward_as_tuple(oid),
                            std::forward_as_tuple(at, end));
      }
    } catch (...) {
      return Fail_(first, std::current_exception());
    }
  }
  // The listing failed after all: nothing is loaded.
  void Clear() {
    files_.clear();
    listed_ = 0;
    failed_ = false;
    Discard_(error_);
  }

  size_t Listed() const { return listed_; }
  bool FailsIn(size_t batch) const { return failed_ && batch == failedBatch_; }
  // The failure of the failing batch, logged as the load in sequence logs it: the record's
  // exception, or the store's refusal to size the batch.
  unsigned Failure(CQRLBlobDB& store, CQRLLogfile* log) {
    if (!error_) {
      std::vector<CQRLBlobDB::SSelector> batch;
      for (uint32_t oid : failedOids_) batch.emplace_back(CVXCatalog::rtFile, oid);
      unsigned total = 0;
      unsigned rc = store.GetSize(batch, total);
      return rc == VX_OK ? VX_NOT_FOUND : rc;
    }
    try {
      std::rethrow_exception(std::exchange(error_, nullptr));
    } catch (...) {
      return VXCodeOfCurrentException(log, __LINE__, __FILE__);
    }
  }

 private:
  void Fail_(size_t first, std::exception_ptr error) {
    failed_ = true;
    failedBatch_ = first / kFileBatch;
    error_ = std::move(error);
  }
  // The library throws by pointer: an error that is never reported must still be freed.
  static void Discard_(std::exception_ptr& error) {
    if (!error) return;
    try {
      std::rethrow_exception(std::exchange(error, nullptr));
    } catch (CVXException* e) {
      delete e;
    } catch (...) {
    }
  }

  std::map<uint32_t, CVXCatFile>& files_;
  size_t listed_ = 0;  // records the store listed
  bool failed_ = false;
  size_t failedBatch_ = 0;
  std::exception_ptr error_;  // of the record that did not read; null for a size failure
  std::vector<uint32_t> failedOids_;
};

// Reads all file records on a second thread and decodes them here as they come. The reader
// touches only the store and the handoff, and is joined on every way out.
unsigned ReadFiles(CQRLBlobDB& store, CFileDecoder& decoder) {
  CBatchHandoff handoff;
  std::thread reader;
  try {
    reader = std::thread([&store, &handoff] {
      unsigned rc = VX_OK;
      std::exception_ptr error;
      try {
        rc = store.GetAll(CVXCatalog::rtFile, kFileBatch, [&](auto& oids, auto& bytes) {
          return handoff.Put(oids, bytes) ? unsigned{VX_OK} : unsigned{VX_NOT_FOUND};
        });
      } catch (...) {
        error = std::current_exception();
      }
      handoff.Finish(rc, std::move(error));
    });
  } catch (const std::system_error&) {
    // No second thread to be had: read and decode in turn.
    try {
      return store.GetAll(CVXCatalog::rtFile, kFileBatch, [&](auto& oids, auto& bytes) {
        decoder.Decode(oids, bytes);
        return unsigned{VX_OK};
      });
    } catch (...) {
      decoder.Clear();  // the listing itself failed
      throw;
    }
  }
  {
    struct SJoin {
      CBatchHandoff& handoff;
      std::thread& reader;
      ~SJoin() {
        handoff.Abandon();
        reader.join();
      }
    } join{handoff, reader};
    SFileBatch batch;
    while (handoff.Take(batch)) decoder.Decode(batch.oids, batch.bytes);
  }
  std::exception_ptr error;
  unsigned rc = handoff.Result(error);
  if (error) {
    decoder.Clear();  // the listing itself failed
    std::rethrow_exception(error);
  }
  return rc;
}

}  // namespace

// Files, the largest population, are read in batches of 5000 in the store's physical order. The
// store lists them and reads all batches in one walk on a second thread while this one decodes
// them as they arrive, so that reading and decoding overlap. Only then follow the progress
// messages and any failure, batch by batch, as a load in strict sequence sends and logs them:
// a failed listing loads nothing, and a batch that fails ends the load with the batches before
// it and those of its records that were read before the failure. The map fills ahead of the
// messages: a callback that looks at it sees more files than its percentage says.
unsigned CVXCatalog::LoadFiles() {
  files_.clear();
  CFileDecoder decoder(files_);
  unsigned rc = ReadFiles(store_, decoder);
  if (rc != VX_OK) decoder.Clear();
  Notify(cbmLoadFiles, 0, 0, nullptr);
  Notify(cbmLoadProgress, 0, 0, nullptr);
  unsigned lastPercent = 0;
  size_t total = decoder.Listed();
  for (size_t at = 0; rc == VX_OK && at < total; at += kFileBatch) {
    if (decoder.FailsIn(at / kFileBatch)) {
      rc = decoder.Failure(store_, Log_());
      break;
    }
    unsigned percent = Percent(std::min(total, at + kFileBatch), total);
    if (percent != lastPercent) Notify(cbmLoadProgress, percent, 0, nullptr);
    lastPercent = percent;
  }
  Notify(cbmLoadProgress, 100, 0, nullptr);
  Notify(cbmLoadStageEnded, 0, 0, nullptr);
  if (rc != VX_OK) VX_ERROR(Log_(), rc, "Loading files");
  return rc;
}

// One walk of the store reads all records of the type, in the store's order, which is also the
// order for sequential access. Each is then read from a memory file of its own, as a single Get
// would hand it over, so a bad record fails alone and at its place.
template <typename T>
unsigned CVXCatalog::LoadEach_(ERecordType type, std::map<uint32_t, T>& loaded) {
  std::vector<uint32_t> oids;
  std::vector<size_t> ends;
  std::vector<uint8_t> bytes;
  unsigned rc = store_.GetAll(type, 1, [&](auto& oid, auto& record) {
    oids.push_back(oid.front());
    bytes.insert(bytes.end(), record.begin(), record.end());
    ends.push_back(bytes.size());
    return unsigned{VX_OK};
  });
  if (rc != VX_OK) return rc;
  unsigned lastPercent = 0;
  for (size_t i = 0; i < oids.size(); ++i) {
    size_t begin = i ? ends[i - 1] : 0;
    CVXMemFile file(bytes.data() + begin, ends[i] - begin);
    T object;
    try {
      file >> object;
    } catch (...) {
      return VXCodeOfCurrentException(Log_(), __LINE__, __FILE__);
    }
    loaded.emplace(oids[i], std::move(object));
    unsigned percent = Percent(i + 1, oids.size());
    if (percent != lastPercent) Notify(cbmLoadProgress, percent, 0, nullptr);
    lastPercent = percent;
  }
  return VX_OK;
}

unsigned CVXCatalog::LoadFolders() {
  std::map<uint32_t, CVXFolder> loaded;
  Notify(cbmLoadFolders, 0, 0, nullptr);
  Notify(cbmLoadProgress, 0, 0, nullptr);
  unsigned rc = LoadEach_(rtFolder, loaded);
  if (rc == VX_OK) folders_ = std::move(loaded);
  RemapFolders_();
  ConnectChildren();
  Notify(cbmLoadProgress, 100, 0, nullptr);
  Notify(cbmLoadStageEnded, 0, 0, nullptr);
  return rc;
}

// A folder whose parent's path is not a prefix of its own was moved outside the catalog: it is
// linked to the folder one path element up on the same medium, if there is one. The walk starts
// again after each remap; a remap whose store failed changes no parent and does not restart it,
// so the walk always ends.
void CVXCatalog::RemapFolders_() {
  bool restart = true;
  while (restart) {
    restart = false;
    for (auto& [oid, f] : folders_) {
      if (RemapFolder_(oid, f)) {
        restart = true;
        break;
      }
    }
  }
}

bool CVXCatalog::RemapFolder_(uint32_t oid, CVXFolder& f) {
  CVXFolder* p = GetFolder(f.ParentFolder());
  if (!p) return false;
  if (_mbsupr(f.URI().AsString()).rfind(_mbsupr(p->URI().AsString()), 0) == 0) return false;
  VX_LOG(Log_(), 3, "  Remapping folder to new parent:");
  std::string path = CVXURI::StripTrailer(f.URI().URIPath());
  size_t slash = path.rfind('/');
  if (slash == std::string::npos) return false;
  path.resize(slash + 1);
  uint32_t found = 0;
  for (const auto& [coid, c] : folders_) {
    if (xstring_comparenocase(c.MediaID(), f.MediaID()) == 0 &&
        xstring_comparenocase(c.MediaSerial(), f.MediaSerial()) == 0 &&
        xstring_comparenocase(c.URI().AsString(), path) == 0) {
      found = coid;
      break;
    }
  }
  if (found == 0 || found == f.ParentFolder()) return false;
  VX_LOGF(Log_(), 3, "Mapped from %lu to %lu", static_cast<unsigned long>(f.ParentFolder()),
          static_cast<unsigned long>(found));
  p->RemoveChild(oid);
  if (StoreFolder(f.ParentFolder()) != VX_OK) return false;
  CVXFolder& c = folders_.at(found);
  f.ParentFolder() = found;
  f.MediaID() = c.MediaID();
  f.MediaSerial() = c.MediaSerial();
  if (StoreFolder(oid) == VX_OK) {
    c.AddChild(oid);
    StoreFolder(found);
  }
  return true;
}

// Categories are read one at a time, in no particular order. "@Interactive" is remembered.
unsigned CVXCatalog::LoadGroups() {
  std::map<uint32_t, CVXGroup> loaded;
  Notify(cbmLoadGroups, 0, 0, nullptr);
  Notify(cbmLoadProgress, 0, 0, nullptr);
  unsigned rc = LoadEach_(rtGroup, loaded);
  if (rc == VX_OK) {
    for (const auto& [oid, group] : loaded) {
      if (group.Name() == "@Interactive") interactiveGroup_ = oid;
    }
    groups_ = std::move(loaded);
    PrepareInteractiveGroup_();
  }
  Notify(cbmLoadProgress, 100, 0, nullptr);
  Notify(cbmLoadStageEnded, 0, 0, nullptr);
  return rc;
}

// The interactive selection never survives a close: its formula is emptied at every load. A
// catalog without the category gets one.
void CVXCatalog::PrepareInteractiveGroup_() {
  // The map's record is cleared in place, so that a read-only store, which UpdateGroup leaves
  // alone, forgets the formula as well.
  if (CVXGroup* record = GetGroup(interactiveGroup_); record && interactiveGroup_ != 0) {
    record->SetExpression(*this, "");
    CVXGroup copy = *record;
    UpdateGroup(copy);
    return;
  }
  CVXGroup group(GenerateGroupOID());
  group.Name() = "@Interactive";
  group.Description() =
      "This special category represents the result of your @interactive selection. Drag "
      "categories to the Category Builder window to define the contents of this category.";
  group.Parent() = 0;
  group.Flags() = gfSystem | gfSealed;
  group.SortSequence() = -2;
  // A read-only store cannot take it; the catalog opens all the same.
  if (AddGroup(group) == VX_OK) interactiveGroup_ = group.Oid();
}
