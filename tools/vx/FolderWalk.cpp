#include "FolderWalk.h"

#include <sys/stat.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>
#include <filesystem>

namespace vxhost {
namespace {

namespace fs = std::filesystem;

bool EndsWithExtension(std::string_view name, std::string_view ext) {
  // "x.jpg" but not ".jpg": a name needs a stem.
  if (name.size() < ext.size() + 2 || name[name.size() - ext.size() - 1] != '.') return false;
  std::string_view tail = name.substr(name.size() - ext.size());
  return std::equal(tail.begin(), tail.end(), ext.begin(), ext.end(), [](char a, char b) {
    return std::tolower(static_cast<unsigned char>(a)) ==
           std::tolower(static_cast<unsigned char>(b));
  });
}

std::string JoinPath(const std::string& dir, const std::string& name) {
  return dir.ends_with('/') ? dir + name : dir + "/" + name;
}

}  // namespace

FolderWalk::FolderWalk(std::vector<std::string> extensions)
    : FolderWalk(std::move(extensions), VolumeTable()) {}

FolderWalk::FolderWalk(std::vector<std::string> extensions, VolumeTable volumes)
    : extensions_(std::move(extensions)), volumes_(std::move(volumes)) {}

bool FolderWalk::IsCandidate(std::string_view fileName) const {
  return std::any_of(extensions_.begin(), extensions_.end(),
                     [&](const std::string& ext) { return EndsWithExtension(fileName, ext); });
}

HostStatus FolderWalk::Walk(const std::vector<std::string>& roots, const Visitor& visit) {
  HostStatus result;
  seen_.clear();
  problems_.clear();
  for (const auto& root : roots) {
    std::error_code ec;
    fs::path canonical = fs::canonical(root, ec);
    if (ec || !fs::is_directory(canonical, ec)) {
      std::string why = ec ? ec.message() : "not a directory";
      problems_.push_back({root, why});
      if (result.ok()) {
        result = HostStatus(HostStatus::kIoError, std::string(root).append(": ").append(why));
      }
      continue;
    }
    std::vector<Pending> stack{{canonical.string(), std::string()}};
    while (!stack.empty()) {
      Pending dir = std::move(stack.back());
      stack.pop_back();
      if (!VisitDirectory(dir, visit, &stack)) return result;
    }
  }
  return result;
}

bool FolderWalk::VisitDirectory(const Pending& dir, const Visitor& visit,
                                std::vector<Pending>* stack) {
  struct stat st;
  if (::stat(dir.path.c_str(), &st) != 0) {
    problems_.push_back({dir.path, std::strerror(errno)});
    return true;
  }
  if (!seen_.insert({st.st_dev, st.st_ino}).second) return true;  // a loop or an overlap
  std::error_code ec;
  fs::directory_iterator it(dir.path, ec);
  if (ec) {
    problems_.push_back({dir.path, ec.message()});
    return true;
  }
  WalkDirectory out;
  out.path = dir.path;
  out.parentPath = dir.parentPath;
  std::vector<std::string> children;
  for (fs::directory_iterator end; it != end; it.increment(ec)) {
    std::string name = it->path().filename().string();
    struct stat entry;
    if (::stat(it->path().c_str(), &entry) != 0) continue;  // a dangling link
    if (S_ISDIR(entry.st_mode)) {
      children.push_back(std::move(name));
    } else if (S_ISREG(entry.st_mode) && IsCandidate(name)) {
      out.files.push_back({std::move(name), static_cast<uint64_t>(entry.st_size),
                           static_cast<int64_t>(entry.st_mtim.tv_sec)});
    }
  }
  if (ec) problems_.push_back({dir.path, ec.message()});  // listed only in part
  std::sort(out.files.begin(), out.files.end(),
            [](const WalkFile& a, const WalkFile& b) { return a.name < b.name; });
  std::sort(children.rbegin(), children.rend());  // popped from the back: first name first
  for (auto& c : children) stack->push_back({JoinPath(dir.path, c), dir.path});
  out.volume = VolumeOf(dir.path, st.st_dev);
  return visit(out);
}

// Every directory of a device shares the mount and the serial; the lookup runs once per device
// on the canonical path, as a linked directory's own path may lie on another mount.
const VolumeIdentity& FolderWalk::VolumeOf(const std::string& path, dev_t device) {
  auto it = volumeCache_.find(device);
  if (it != volumeCache_.end()) return it->second;
  std::error_code ec;
  fs::path canonical = fs::canonical(path, ec);
  return volumeCache_[device] = volumes_.Identify(ec ? path : canonical.string());
}

}  // namespace vxhost
