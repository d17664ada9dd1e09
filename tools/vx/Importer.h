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

// Where an import's time went, in seconds. The stages are summed over the workers, so with
// several workers they add up to more than `wall`.
struct ImportTimes {
  double wall = 0;       // the whole run, walk included
  double crc = 0;        // reading files for their CRC-32
  double decode = 0;     // libvips: decoding and shrinking
  double metadata = 0;   // exiv2
  double thumbnail = 0;  // encoding the JPEG thumbnails
  double library = 0;    // inside vxcore3: AddFile, AddThumb, properties, XMP, full text
};

struct ImportCounts {
  uint64_t imported = 0;  // new files
  uint64_t updated = 0;   // files whose size, date or content changed
  uint64_t unchanged = 0;
  uint64_t skipped = 0;  // unreadable, corrupt or not an image
  ImportTimes times;
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
  enum Stage { kCrc, kDecode, kMetadata, kThumbnail, kLibrary, kStages };

  void Collect_(const vxhost::WalkDirectory& dir);
  uint32_t AddFolder_(const vxhost::WalkDirectory& dir);
  // Takes tasks until none is left; `progress` may be null.
  void Work_(vxhost::Progress* progress);
  Outcome Import_(Task& task);
  // The JPEG thumbnail the database's settings ask for.
  vxhost::HostStatus Thumbnail_(const vxhost::DecodedImage& image, vxhost::EncodedJpeg* jpeg) const;
  // Stores what follows the catalog record: thumbnail, properties, XMP and full text.
  bool StoreDependents_(uint32_t oid, const vxhost::EncodedJpeg& thumbnail,
                        const vxhost::ImageMetadata& meta, std::string* error);
  // Runs `step` and adds its duration to the stage's total; returns what `step` returns.
  template <typename Step>
  auto Timed_(Stage stage, Step step);
  std::vector<CVXProperty> PropertyRow_(const vxhost::ImageMetadata& meta) const;
  void Fail_(const Task& task, const std::string& reason);

  Database* db_;
  CVXTable table_;
  ImportOptions options_;
  vxhost::ImageDecoder decoder_;
  SVXThumbInfoNew thumbInfo_;                // the database's, read once before the workers start
  std::map<std::string, uint32_t> folders_;  // canonical path -> OID
  std::vector<Task> tasks_;
  std::atomic<size_t> next_{0};
  std::atomic<uint64_t> counts_[4] = {};  // by Outcome
  std::atomic<int64_t> nanos_[kStages] = {};
  mutable std::mutex problemsMutex_;
  std::vector<std::string> problems_;
};

}  // namespace vx
