#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "HostStatus.h"
#include "ImageFormat.h"

class CVXBitmap;

namespace vxhost {

struct DecodeOptions {
  uint32_t maxSide = 1024;           // longest side of the decoded pixels; never enlarged
  uint64_t maxPixels = 100'000'000;  // header width * height above this is refused unread
  bool autoRotate = true;            // apply the EXIF orientation
  bool strict = false;               // fail on any decoder error, not only on truncation
};

// What the file's header says, before any pixel is decoded.
struct ImageInfo {
  uint32_t width = 0;  // as displayed: swapped for orientations 5 to 8 when auto-rotating
  uint32_t height = 0;
  uint32_t format = kFormatUnknown;
  std::string loader;      // libvips loader, e.g. "jpegload"
  int orientation = 1;     // EXIF orientation 1 to 8
  bool grayScale = false;  // one band (plus alpha), or a grey interpretation
};

struct DecodedImage {
  ImageInfo info;
  uint32_t width = 0;  // of the pixels below
  uint32_t height = 0;
  std::vector<uint8_t> pixels;  // 8-bit sRGB RGBA, rows from the top, no padding
  bool grayScale = false;       // info.grayScale, or every pixel has r == g == b
};

struct EncodedJpeg {
  std::vector<uint8_t> bytes;
  uint32_t width = 0;
  uint32_t height = 0;
};

// Decodes image files with libvips to at most maxSide pixels a side: JPEG, WebP and HEIF decode
// at a reduced size (shrink on load); other formats stream their rows through the resize, so
// memory stays bounded by the output. Thread-safe: one decoder may serve any number of threads
// at once. Never throws; every failure is a status with libvips' message. An image above
// maxPixels is refused from its header, so a forged or huge header costs nothing: a loader that
// cannot shrink would otherwise read every row of it.
class ImageDecoder {
 public:
  explicit ImageDecoder(const DecodeOptions& options = DecodeOptions());

  const DecodeOptions& options() const { return options_; }

  HostStatus ReadInfo(const std::string& path, ImageInfo* info) const;
  HostStatus Decode(const std::string& path, DecodedImage* image) const;

  // Starts libvips once per process, from any thread: operation cache off (the host reads
  // thousands of files once each), libvips' own warnings silenced (failures come back as
  // statuses). Called by every entry point here.
  static void InitLibrary();

 private:
  DecodeOptions options_;
};

// Encodes RGBA pixels (rows from the top, 4 bytes a pixel) as a JPEG that fits into
// maxWidth x maxHeight, keeping the aspect ratio and never enlarging. Alpha is flattened onto
// white. quality is clamped to 1..100.
HostStatus EncodeJpegThumbnail(const uint8_t* rgba, uint32_t width, uint32_t height,
                               uint32_t maxWidth, uint32_t maxHeight, int quality,
                               EncodedJpeg* out);

// Copies decoded pixels into a library bitmap, with its grey-scale flag. The library's result
// code: 10001, or 10000 when there are no pixels.
unsigned FillBitmap(const DecodedImage& image, CVXBitmap* bitmap);

}  // namespace vxhost
