#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "HostStatus.h"
#include "ImageFormat.h"
#include "VolumeTable.h"

namespace vxhost {

struct WalkFile {
  std::string name;  // within its directory
  uint64_t size = 0;
  int64_t mtime = 0;  // seconds since 1970
};

struct WalkDirectory {
  std::string path;             // the root as made canonical, then names appended
  std::string parentPath;       // empty for a root
  std::vector<WalkFile> files;  // the image candidates, by name
  VolumeIdentity volume;
};

struct WalkProblem {
  std::string path;
  std::string message;
};

// Walks folder trees for image files. Every directory is reported once, before its
// sub-directories (pre-order, names in byte order), with its candidate files, so that a parent
// is always known before its children. Links to directories are followed, but a directory
// already reached (same device and inode) is not entered again: this ends link loops and
// overlapping roots. Directories that cannot be read are recorded as problems and skipped.
class FolderWalk {
 public:
  // Return false to stop the walk.
  using Visitor = std::function<bool(const WalkDirectory&)>;

  // `extensions`: lower case, without the dot; matched case-insensitively.
  explicit FolderWalk(std::vector<std::string> extensions = ImageExtensions());
  // With a volume table of the caller's (tests).
  FolderWalk(std::vector<std::string> extensions, VolumeTable volumes);

  // Ok when every root could be read (stopping early included); else kIoError naming the
  // first root that failed, the others having been walked all the same. Each call starts
  // afresh: problems() then holds this walk's.
  HostStatus Walk(const std::vector<std::string>& roots, const Visitor& visit);

  bool IsCandidate(std::string_view fileName) const;
  const std::vector<WalkProblem>& problems() const { return problems_; }

 private:
  struct Pending {
    std::string path;
    std::string parentPath;
  };

  // Reads one directory; false when the visitor asked to stop.
  bool VisitDirectory(const Pending& dir, const Visitor& visit, std::vector<Pending>* stack);
  const VolumeIdentity& VolumeOf(const std::string& path, dev_t device);

  std::vector<std::string> extensions_;
  VolumeTable volumes_;
  std::map<dev_t, VolumeIdentity> volumeCache_;
  std::set<std::pair<dev_t, ino_t>> seen_;
  std::vector<WalkProblem> problems_;
};

}  // namespace vxhost
