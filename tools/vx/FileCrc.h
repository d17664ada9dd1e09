#pragma once

#include <cstdint>
#include <string>

#include "HostStatus.h"

namespace vxhost {

// zlib's CRC-32 of a whole file, read in 1 MiB blocks: the content checksum handed to
// CVXEngine::AddFile. An empty file gives 0.
HostStatus ComputeFileCrc(const std::string& path, uint32_t* crc);

}  // namespace vxhost
