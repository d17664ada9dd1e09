#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace vxhost {

// The host's file format numbers, stored in CVXCatFile::Format. Small numbers: the library
// selects formats through a bit vector indexed by them. Never renumber.
enum HostFormat : uint32_t {
  kFormatUnknown = 0,
  kFormatJpeg = 1,
  kFormatPng = 2,
  kFormatTiff = 3,
  kFormatWebp = 4,
  kFormatHeif = 5,
  kFormatGif = 6,
  kFormatBmp = 7,
  kFormatOther = 8,  // decodable, but by none of the loaders above
};

// "jpeg", "png", ... ; "unknown" for numbers we do not know.
const char* FormatName(uint32_t format);
// From a libvips loader name such as "jpegload" or "pngload_source"; kFormatOther for any
// other loader, kFormatUnknown for an empty name.
uint32_t FormatFromLoader(std::string_view loader);
// From a file name's extension, case-insensitively; kFormatUnknown when not an image name.
uint32_t FormatFromFileName(std::string_view name);
// The extensions (lower case, without the dot) that FormatFromFileName knows: the files a
// folder scan picks up.
const std::vector<std::string>& ImageExtensions();

}  // namespace vxhost
