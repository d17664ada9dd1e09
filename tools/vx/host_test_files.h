#pragma once

// Image files for the host's tests, made with libvips and exiv2: good images of any size and
// band count, and forged ones.
#include <cstdint>
#include <string>

namespace vxhost_test {

// Saves w x h pixels of `bands` bytes each, the format chosen by the file's extension; an
// orientation other than 0 is written as the EXIF orientation.
void SaveImage(const std::string& path, int w, int h, int bands,
               uint8_t (*pixel)(int x, int y, int band), int orientation = 0);
// A 4 x 4 16-bit grey PNG, every sample 0x8000.
void SaveDeepGrey(const std::string& path);
// 640 x 480: red rises to the right, green downwards, blue fixed.
uint8_t Gradient(int x, int y, int b);
// A valid PNG signature and IHDR claiming 20000 x 20000 RGB, then a tiny IDAT and IEND.
std::string ForgedHugePng();
// Writes a full set of EXIF, IPTC and XMP fields into a JPEG: Canon EOS 5D, taken
// 2021-07-04 13:45:10, keywords "tower" and "night", subjects "Paris" and "tower", rating 4,
// label "Red", and more.
void WriteRichMetadata(const std::string& path);

}  // namespace vxhost_test
