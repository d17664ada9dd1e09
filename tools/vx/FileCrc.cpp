#include "FileCrc.h"

#include <fcntl.h>
#include <unistd.h>
#include <zlib.h>

#include <cerrno>
#include <vector>

namespace vxhost {

HostStatus ComputeFileCrc(const std::string& path, uint32_t* crc) {
  *crc = 0;
  int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return HostStatus::IoError(path, errno);
  ::posix_fadvise(fd, 0, 0, POSIX_FADV_SEQUENTIAL);
  constexpr size_t kBlock = size_t{1} << 20;
  std::vector<Bytef> block(kBlock);
  uLong sum = ::crc32(0L, Z_NULL, 0);
  for (;;) {
    ssize_t n = ::read(fd, block.data(), kBlock);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {  // a directory fails here too, with EISDIR
      int err = errno;
      ::close(fd);
      return HostStatus::IoError(path, err);
    }
    if (n == 0) break;
    sum = ::crc32(sum, block.data(), static_cast<uInt>(n));
  }
  ::close(fd);
  *crc = static_cast<uint32_t>(sum);
  return HostStatus::Ok();
}

}  // namespace vxhost
