#pragma once

#include <cstdint>
#include <string>

// Path helpers. Paths may come in Windows form ("c:\pics\a.jpg", "\\server\share\x") or POSIX
// form ("/photos/a.jpg"); both "/" and "\" separate components, and a drive is a letter and a
// colon at the start. Nothing here touches the disk except GetFreeDiskSpace.
class CVXFileSystem {
 public:
  CVXFileSystem() = delete;

  // `path` with the extension of its last component replaced by `ext` (".vxc"; a missing dot is
  // added, an empty `ext` drops the extension), or with `ext` appended when it has none.
  static std::string ChangeExt(const std::string& path, const std::string& ext);
  // Splits `path` so that drive + dir + name + ext == path. Each output may be null. dir keeps
  // its trailing separator; ext starts at the last dot of the last component, except that a
  // leading dot belongs to the name (".profile" has no extension). A UNC prefix stays in dir.
  static void SplitPath(const std::string& path, std::string* drive, std::string* dir,
                        std::string* name, std::string* ext);
  // Bytes available to an unprivileged user on the file system that holds `path` (or would hold
  // it: the nearest existing directory above it is asked; empty means the current directory).
  // False if no directory can be asked.
  static bool GetFreeDiskSpace(const std::string& path, uint64_t& bytes);
};
