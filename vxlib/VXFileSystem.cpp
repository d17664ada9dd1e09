#include "VXFileSystem.h"

#include <sys/statvfs.h>

#include <cctype>
#include <filesystem>
#include <system_error>

namespace {

struct PathParts {
  size_t dirStart = 0;   // end of the drive
  size_t nameStart = 0;  // end of the directory
  size_t extStart = 0;   // end of the name
};

PathParts Parse(const std::string& path) {
  PathParts parts;
  if (path.size() >= 2 && path[1] == ':' && std::isalpha(static_cast<unsigned char>(path[0]))) {
    parts.dirStart = 2;
  }
  size_t slash = path.find_last_of("/\\");
  parts.nameStart =
      slash == std::string::npos || slash < parts.dirStart ? parts.dirStart : slash + 1;
  size_t dot = path.rfind('.');
  parts.extStart = dot == std::string::npos || dot <= parts.nameStart ? path.size() : dot;
  return parts;
}

}  // namespace

std::string CVXFileSystem::ChangeExt(const std::string& path, const std::string& ext) {
  std::string out = path.substr(0, Parse(path).extStart);
  if (!ext.empty() && ext[0] != '.') out += '.';
  return out + ext;
}

void CVXFileSystem::SplitPath(const std::string& path, std::string* drive, std::string* dir,
                              std::string* name, std::string* ext) {
  PathParts p = Parse(path);
  if (drive) *drive = path.substr(0, p.dirStart);
  if (dir) *dir = path.substr(p.dirStart, p.nameStart - p.dirStart);
  if (name) *name = path.substr(p.nameStart, p.extStart - p.nameStart);
  if (ext) *ext = path.substr(p.extStart);
}

bool CVXFileSystem::GetFreeDiskSpace(const std::string& path, uint64_t& bytes) {
  namespace fs = std::filesystem;
  std::error_code ec;
  fs::path at = path.empty() ? fs::path(".") : fs::path(path);
  while (!fs::is_directory(at, ec)) {
    fs::path up = at.parent_path();
    if (up.empty()) up = ".";
    if (up == at) return false;
    at = std::move(up);
  }
  struct statvfs st {};
  if (::statvfs(at.c_str(), &st) != 0) return false;
  bytes = static_cast<uint64_t>(st.f_bavail) * st.f_frsize;
  return true;
}
