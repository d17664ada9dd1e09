#include "HostStatus.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace vxhost {

const char* HostStatus::CodeName(Code code) {
  switch (code) {
    case kOk:
      return "ok";
    case kIoError:
      return "i/o error";
    case kUnsupported:
      return "unsupported";
    case kCorrupt:
      return "corrupt";
    case kTooLarge:
      return "too large";
    case kInvalidInput:
      return "invalid input";
  }
  return "unknown";
}

HostStatus HostStatus::IoError(const std::string& path, int err) {
  return HostStatus(kIoError, path + ": " + std::strerror(err));
}

HostStatus HostStatus::CheckReadable(const std::string& path) {
  int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return IoError(path, errno);
  struct stat st;
  int rc = ::fstat(fd, &st);
  int err = errno;
  ::close(fd);
  if (rc != 0) return IoError(path, err);
  if (!S_ISREG(st.st_mode)) return HostStatus(kIoError, path + ": not a regular file");
  return Ok();
}

std::string HostStatus::ToString() const {
  if (message_.empty()) return CodeName(code_);
  return std::string(CodeName(code_)) + ": " + message_;
}

}  // namespace vxhost
