#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include <vxcore3/vxcore3.h>

#include "Database.h"
#include "FolderWalk.h"
#include "ImageDecoder.h"
#include "Metadata.h"
#include "Progress.h"

namespace vx {

struct ImportOptions {
  unsigned threads = 0;  // 0: one per hardware thread
  vxhost::Progress::Mode progress = vxhost::Progress::Mode::kAuto;
  bool showProgress = true;
};

struct ImportCounts {
  uint64_t imported = 0;  // new files
  uint64_t updated = 0;   // files whose size, date or content changed
  uint64_t unchanged = 0;
  uint64_t skipped = 0;  // unreadable, corrupt or not an image
};

// Brings folder trees into the database: folders first (on the caller's thread, parents before
// children), then every candidate file on a pool of workers. A worker decodes, reads metadata
// and encodes the thumbnail on its own; the engine serialises the calls that store them. A file
// whose size, date and CRC match its record is left alone.
class Importer {
 public:
  // `db` is not owned; `table` is the image property table as defined.
  Importer(Database* db, const CVXTable& table, const ImportOptions& options);
  Importer(const Importer&) = delete;
  Importer& operator=(const Importer&) = delete;

  ImportCounts Run(const std::vector<std::string>& roots);
  // One line per skipped file or unreadable folder, "path: reason", sorted by path.
  std::vector<std::string> Problems() const;

 private:
  struct Task {
    std::string path;
    std::string name;
    uint32_t folder = 0;
    uint64_t size = 0;
    int64_t mtime = 0;
    bool exists = false;  // `record` is the catalog's
    CVXCatFile record;
  };
  enum class Outcome { kImported, kUpdated, kUnchanged, kSkipped };

  void Collect_(const vxhost::WalkDirectory& dir);
  uint32_t AddFolder_(const vxhost::WalkDirectory& dir);
  void Work_(vxhost::Progress* progress);
  Outcome Import_(Task& task);
  // Stores what follows the catalog record: thumbnail, properties, XMP and full text.
  bool StoreDependents_(uint32_t oid, const vxhost::DecodedImage& image,
                        const vxhost::ImageMetadata& meta, std::string* error);
  std::vector<CVXProperty> PropertyRow_(const vxhost::ImageMetadata& meta) const;
  void Fail_(const Task& task, const std::string& reason);

  Database* db_;
  CVXTable table_;
  ImportOptions options_;
  vxhost::ImageDecoder decoder_;
  std::map<std::string, uint32_t> folders_;  // canonical path -> OID
  std::vector<Task> tasks_;
  std::atomic<size_t> next_{0};
  std::atomic<uint64_t> counts_[4] = {};  // by Outcome
  mutable std::mutex problemsMutex_;
  std::vector<std::string> problems_;
};

}  // namespace vx
