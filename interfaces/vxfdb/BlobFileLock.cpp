#include "BlobFileLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <mutex>
#include <set>
#include <utility>

#include "VXResult.h"

namespace {

using FileId = std::pair<dev_t, ino_t>;

// Files held by the stores of this process. Guarded by HeldMutex().
std::set<FileId>& HeldFiles() {
  static std::set<FileId> files;
  return files;
}

std::mutex& HeldMutex() {
  static std::mutex mutex;
  return mutex;
}

}  // namespace

CBlobFileLock::CBlobFileLock(CBlobFileLock&& other) noexcept
    : fd_(std::exchange(other.fd_, -1)), dev_(other.dev_), ino_(other.ino_) {}

CBlobFileLock& CBlobFileLock::operator=(CBlobFileLock&& other) noexcept {
  if (this != &other) {
    Release();
    fd_ = std::exchange(other.fd_, -1);
    dev_ = other.dev_;
    ino_ = other.ino_;
  }
  return *this;
}

unsigned CBlobFileLock::Acquire(const std::string& path, bool writable, bool create) {
  Release();
  std::lock_guard<std::mutex> guard(HeldMutex());
  struct stat st {};
  // Answer a holder in this process without opening (and later closing) a descriptor.
  if (::stat(path.c_str(), &st) == 0 && HeldFiles().count({st.st_dev, st.st_ino})) {
    return VX_SHARING_VIOLATION;
  }
  int flags = (writable ? O_RDWR : O_RDONLY) | O_CLOEXEC | (create ? O_CREAT : 0);
  int fd = ::open(path.c_str(), flags, 0644);
  if (fd < 0) return VX_NOT_FOUND;
  if (::fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
    ::close(fd);
    return VX_NOT_FOUND;
  }
  if (::flock(fd, LOCK_EX | LOCK_NB) != 0) {
    int error = errno;
    ::close(fd);
    return error == EWOULDBLOCK ? VX_SHARING_VIOLATION : VX_NOT_FOUND;
  }
  fd_ = fd;
  dev_ = st.st_dev;
  ino_ = st.st_ino;
  HeldFiles().insert({dev_, ino_});
  return VX_OK;
}

void CBlobFileLock::Release() {
  if (fd_ < 0) return;
  std::lock_guard<std::mutex> guard(HeldMutex());
  HeldFiles().erase({dev_, ino_});
  ::close(fd_);  // also drops the flock
  fd_ = -1;
}
