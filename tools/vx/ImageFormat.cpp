#include "ImageFormat.h"

#include <algorithm>
#include <cctype>

namespace vxhost {
namespace {

struct FormatEntry {
  const char* ext;
  uint32_t format;
};

const FormatEntry kExtensions[] = {
    {"jpg", kFormatJpeg},  {"jpeg", kFormatJpeg}, {"png", kFormatPng},   {"tif", kFormatTiff},
    {"tiff", kFormatTiff}, {"webp", kFormatWebp}, {"heic", kFormatHeif}, {"heif", kFormatHeif},
    {"gif", kFormatGif},   {"bmp", kFormatBmp},
};

// Loader name prefixes; libvips names loaders "<format>load[_source|_buffer]".
const FormatEntry kLoaders[] = {
    {"jpegload", kFormatJpeg}, {"pngload", kFormatPng},   {"tiffload", kFormatTiff},
    {"webpload", kFormatWebp}, {"heifload", kFormatHeif}, {"gifload", kFormatGif},
};

std::string Lower(std::string_view s) {
  std::string out(s);
  for (char& c : out) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
  return out;
}

}  // namespace

const char* FormatName(uint32_t format) {
  static const char* const kNames[] = {"unknown", "jpeg", "png", "tiff", "webp",
                                       "heif",    "gif",  "bmp", "other"};
  return format < std::size(kNames) ? kNames[format] : "unknown";
}

uint32_t FormatFromLoader(std::string_view loader) {
  if (loader.empty()) return kFormatUnknown;
  for (const auto& e : kLoaders) {
    if (loader.starts_with(e.ext)) return e.format;
  }
  return kFormatOther;
}

uint32_t FormatFromFileName(std::string_view name) {
  size_t dot = name.rfind('.');
  if (dot == std::string_view::npos || name.find('/', dot) != std::string_view::npos) {
    return kFormatUnknown;
  }
  std::string ext = Lower(name.substr(dot + 1));
  for (const auto& e : kExtensions) {
    if (ext == e.ext) return e.format;
  }
  return kFormatUnknown;
}

const std::vector<std::string>& ImageExtensions() {
  static const std::vector<std::string> kList = [] {
    std::vector<std::string> list;
    for (const auto& e : kExtensions) list.emplace_back(e.ext);
    return list;
  }();
  return kList;
}

}  // namespace vxhost
