#include "ImageDecoder.h"

#include <vips/vips.h>
#include <vxcore3/vxcore3.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>
#include <mutex>
#include <utility>

namespace vxhost {
namespace {

struct VipsUnref {
  void operator()(VipsImage* image) const { g_object_unref(image); }
};
using VipsPtr = std::unique_ptr<VipsImage, VipsUnref>;

// libvips keeps one error buffer per process; taking a copy clears it. With failures on several
// threads at once a message may carry another thread's text as well, which we accept.
std::string TakeVipsError() {
  char* text = vips_error_buffer_copy();
  std::string message = text ? text : "";
  g_free(text);
  while (!message.empty() && (message.back() == '\n' || message.back() == ' ')) {
    message.pop_back();
  }
  std::replace(message.begin(), message.end(), '\n', ' ');
  return message.empty() ? "decoder failed" : message;
}

HostStatus VipsFailure(HostStatus::Code code) { return HostStatus(code, TakeVipsError()); }

void DropVipsWarning(const gchar*, GLogLevelFlags, const gchar*, gpointer) {}

// libvips reads BMP through its ImageMagick loader, which serves many formats; the "BM"
// signature tells BMP apart.
bool HasBmpSignature(const std::string& path) {
  char sig[2] = {};
  std::FILE* f = std::fopen(path.c_str(), "rb");
  if (!f) return false;
  size_t n = std::fread(sig, 1, 2, f);
  std::fclose(f);
  return n == 2 && sig[0] == 'B' && sig[1] == 'M';
}

bool IsGreyInterpretation(VipsInterpretation i) {
  return i == VIPS_INTERPRETATION_B_W || i == VIPS_INTERPRETATION_GREY16;
}

// Replaces `image` by what `op(image, &out)` makes of it; false, with libvips' error set, when
// the operation fails.
template <typename Op>
bool Apply(VipsPtr& image, Op op) {
  VipsImage* out = nullptr;
  if (op(image.get(), &out) != 0) return false;
  image.reset(out);
  return true;
}

// Steps of the pixel pipelines, in the form Apply takes.
int ToSrgb(VipsImage* in, VipsImage** out) {
  return vips_colourspace(in, out, VIPS_INTERPRETATION_sRGB, nullptr);
}
int MarkSrgb(VipsImage* in, VipsImage** out) {
  return vips_copy(in, out, "interpretation", VIPS_INTERPRETATION_sRGB, nullptr);
}
int ToUchar(VipsImage* in, VipsImage** out) { return vips_cast_uchar(in, out, nullptr); }
int ShiftToUchar(VipsImage* in, VipsImage** out) {
  return vips_cast(in, out, VIPS_FORMAT_UCHAR, "shift", TRUE, nullptr);
}
int FirstBand(VipsImage* in, VipsImage** out) { return vips_extract_band(in, out, 0, nullptr); }
int FirstFourBands(VipsImage* in, VipsImage** out) {
  return vips_extract_band(in, out, 0, "n", 4, nullptr);
}
int TripleBand(VipsImage* in, VipsImage** out) {
  VipsImage* bands[3] = {in, in, in};
  return vips_bandjoin(bands, out, 3, nullptr);
}
int AddOpaqueAlpha(VipsImage* in, VipsImage** out) {
  return vips_bandjoin_const1(in, out, 255.0, nullptr);
}
int CopyToMemory(VipsImage* in, VipsImage** out) {
  *out = vips_image_copy_memory(in);
  return *out ? 0 : -1;
}
int TurnUpright(VipsImage* in, VipsImage** out) { return vips_autorot(in, out, nullptr); }
int FlattenOnWhite(VipsImage* in, VipsImage** out) {
  VipsArrayDouble* white = vips_array_double_newv(3, 255.0, 255.0, 255.0);
  int rc = vips_flatten(in, out, "background", white, nullptr);
  vips_area_unref(VIPS_AREA(white));
  return rc;
}

// Any decoded image to 8-bit sRGB with alpha.
VipsPtr ToRgba8(VipsImage* in) {
  g_object_ref(in);
  VipsPtr image(in);
  if (!Apply(image, ToSrgb)) {
    // Interpretations without a route to sRGB (multiband, histograms): the bands as they are,
    // scaled to 8 bits, a single band repeated three times.
    vips_error_clear();
    if (!Apply(image, ShiftToUchar)) return nullptr;
    if (image->Bands < 3 && !(Apply(image, FirstBand) && Apply(image, TripleBand))) return nullptr;
  }
  if (image->Bands > 4 && !Apply(image, FirstFourBands)) return nullptr;
  if (image->Bands == 3 && !Apply(image, AddOpaqueAlpha)) return nullptr;
  if (image->BandFmt != VIPS_FORMAT_UCHAR && !Apply(image, ToUchar)) return nullptr;
  return image;
}

bool AllPixelsGrey(const std::vector<uint8_t>& rgba) {
  for (size_t i = 0; i + 3 < rgba.size(); i += 4) {
    if (rgba[i] != rgba[i + 1] || rgba[i] != rgba[i + 2]) return false;
  }
  return true;
}

HostStatus CopyPixels(VipsImage* image, std::vector<uint8_t>* pixels) {
  size_t size = 0;
  void* data = vips_image_write_to_memory(image, &size);
  if (!data) return VipsFailure(HostStatus::kCorrupt);
  const auto* bytes = static_cast<const uint8_t*>(data);
  pixels->assign(bytes, bytes + size);
  g_free(data);
  return HostStatus::Ok();
}

VipsFailOn FailOn(const DecodeOptions& options) {
  return options.strict ? VIPS_FAIL_ON_ERROR : VIPS_FAIL_ON_TRUNCATED;
}

std::string SizeText(uint32_t width, uint32_t height) {
  return std::to_string(width) + "x" + std::to_string(height);
}

// Opens the file (libvips reads the header now, the pixels only when asked) and describes it.
// Refuses an image with more pixels than allowed.
HostStatus OpenImage(const std::string& path, const DecodeOptions& options, ImageInfo* info,
                     VipsPtr* image) {
  *info = ImageInfo();
  if (HostStatus st = HostStatus::CheckReadable(path); !st.ok()) return st;
  if (!vips_foreign_find_load(path.c_str())) return VipsFailure(HostStatus::kUnsupported);
  image->reset(vips_image_new_from_file(path.c_str(), "access", VIPS_ACCESS_SEQUENTIAL, "fail_on",
                                        FailOn(options), nullptr));
  VipsImage* header = image->get();
  if (!header) return VipsFailure(HostStatus::kCorrupt);
  const char* loader = nullptr;
  if (vips_image_get_string(header, "vips-loader", &loader) == 0 && loader) info->loader = loader;
  info->format = FormatFromLoader(info->loader);
  if (info->format == kFormatOther && HasBmpSignature(path)) info->format = kFormatBmp;
  info->orientation = std::clamp(vips_image_get_orientation(header), 1, 8);
  info->width = static_cast<uint32_t>(vips_image_get_width(header));
  info->height = static_cast<uint32_t>(vips_image_get_height(header));
  if (options.autoRotate && vips_image_get_orientation_swap(header)) {
    std::swap(info->width, info->height);
  }
  info->grayScale = header->Bands <= 2 || IsGreyInterpretation(header->Type);
  if (uint64_t{info->width} * info->height > options.maxPixels) {
    return HostStatus(HostStatus::kTooLarge, path + ": " + SizeText(info->width, info->height) +
                                                 " is above the pixel limit");
  }
  return HostStatus::Ok();
}

// Loaders that decode at a reduced size when vips_thumbnail asks them to.
bool ShrinksOnLoad(const std::string& loader) {
  for (const char* name : {"jpegload", "webpload", "heifload", "jp2kload", "svgload", "pdfload"}) {
    if (loader.starts_with(name)) return true;
  }
  return false;
}

bool ThumbnailFromFile(const std::string& path, const DecodeOptions& options, VipsPtr* image) {
  const int side = static_cast<int>(std::min<uint32_t>(options.maxSide, 1 << 20));
  VipsImage* out = nullptr;
  if (vips_thumbnail(path.c_str(), &out, side, "height", side, "size", VIPS_SIZE_DOWN, "no_rotate",
                     options.autoRotate ? FALSE : TRUE, "fail_on", FailOn(options), nullptr) != 0) {
    return false;
  }
  image->reset(out);
  return true;
}

// Scales down to fit maxWidth x maxHeight, never up. The wide gap matters: with its default gap
// libvips 8.14 box-shrinks first and then runs several times slower at ratios of 3 and more.
int ResizeToFit(VipsImage* in, VipsImage** out, uint32_t maxWidth, uint32_t maxHeight) {
  double scale = std::min({1.0, double(maxWidth) / in->Xsize, double(maxHeight) / in->Ysize});
  if (scale >= 1) return vips_copy(in, out, nullptr);
  double width = std::max(1.0, std::round(in->Xsize * scale));
  double height = std::max(1.0, std::round(in->Ysize * scale));
  return vips_resize(in, out, width / in->Xsize, "vscale", height / in->Ysize, "gap", 4.0, nullptr);
}

// Other loaders read rows in order and the resize runs as they stream by, so a large image
// never sits in memory whole. Turning upright needs random access: it runs on the small result.
bool ShrinkStreamed(const DecodeOptions& options, VipsPtr& image) {
  int orientation = vips_image_get_orientation(image.get());
  auto fit = [&](VipsImage* in, VipsImage** out) {
    return ResizeToFit(in, out, options.maxSide, options.maxSide);
  };
  if (!Apply(image, fit)) return false;
  if (!options.autoRotate || orientation <= 1 || orientation > 8) return true;
  return Apply(image, CopyToMemory) && Apply(image, TurnUpright);
}

}  // namespace

ImageDecoder::ImageDecoder(const DecodeOptions& options) : options_(options) {
  options_.maxSide = std::max<uint32_t>(options_.maxSide, 1);
  InitLibrary();
}

void ImageDecoder::InitLibrary() {
  static std::once_flag once;
  std::call_once(once, [] {
    if (VIPS_INIT("vx") != 0) return;  // every later call then fails with libvips' message
    vips_cache_set_max(0);
    vips_cache_set_max_mem(0);
    vips_cache_set_max_files(0);
    g_log_set_handler("VIPS",
                      static_cast<GLogLevelFlags>(G_LOG_LEVEL_WARNING | G_LOG_LEVEL_MESSAGE),
                      DropVipsWarning, nullptr);
  });
}

HostStatus ImageDecoder::ReadInfo(const std::string& path, ImageInfo* info) const {
  VipsPtr header;
  return OpenImage(path, options_, info, &header);
}

HostStatus ImageDecoder::Decode(const std::string& path, DecodedImage* image) const {
  *image = DecodedImage();
  VipsPtr decoded;
  if (HostStatus st = OpenImage(path, options_, &image->info, &decoded); !st.ok()) return st;
  bool ok = ShrinksOnLoad(image->info.loader) ? ThumbnailFromFile(path, options_, &decoded)
                                              : ShrinkStreamed(options_, decoded);
  VipsPtr rgba = ok ? ToRgba8(decoded.get()) : nullptr;
  if (!rgba) return VipsFailure(HostStatus::kCorrupt);
  // Decoding happens here, lazily; a damaged file fails now.
  if (HostStatus st = CopyPixels(rgba.get(), &image->pixels); !st.ok()) return st;
  image->width = static_cast<uint32_t>(rgba->Xsize);
  image->height = static_cast<uint32_t>(rgba->Ysize);
  image->grayScale = image->info.grayScale || AllPixelsGrey(image->pixels);
  return HostStatus::Ok();
}

HostStatus EncodeJpegThumbnail(const uint8_t* rgba, uint32_t width, uint32_t height,
                               uint32_t maxWidth, uint32_t maxHeight, int quality,
                               EncodedJpeg* out) {
  *out = EncodedJpeg();
  if (!rgba || width == 0 || height == 0 || maxWidth == 0 || maxHeight == 0 ||
      uint64_t{width} * height > (uint64_t{1} << 31) / 4 || maxWidth > (1u << 20) ||
      maxHeight > (1u << 20)) {
    return HostStatus(HostStatus::kInvalidInput, "bad thumbnail size");
  }
  ImageDecoder::InitLibrary();
  VipsPtr image(vips_image_new_from_memory(rgba, size_t{width} * height * 4,
                                           static_cast<int>(width), static_cast<int>(height), 4,
                                           VIPS_FORMAT_UCHAR));
  auto fit = [&](VipsImage* in, VipsImage** out) {
    return ResizeToFit(in, out, maxWidth, maxHeight);
  };
  bool ok = image && Apply(image, MarkSrgb) && Apply(image, FlattenOnWhite) && Apply(image, fit) &&
            Apply(image, ToUchar);
  if (!ok) return VipsFailure(HostStatus::kInvalidInput);
  void* buffer = nullptr;
  size_t length = 0;
  if (vips_jpegsave_buffer(image.get(), &buffer, &length, "Q", std::clamp(quality, 1, 100), "strip",
                           TRUE, nullptr) != 0) {
    return VipsFailure(HostStatus::kInvalidInput);
  }
  const auto* data = static_cast<const uint8_t*>(buffer);
  out->bytes.assign(data, data + length);
  g_free(buffer);
  out->width = static_cast<uint32_t>(image->Xsize);
  out->height = static_cast<uint32_t>(image->Ysize);
  return HostStatus::Ok();
}

unsigned FillBitmap(const DecodedImage& image, CVXBitmap* bitmap) {
  if (image.pixels.empty() || image.pixels.size() != size_t{image.width} * image.height * 4) {
    bitmap->Free();
    return VX_NEUTRAL_FAILURE;
  }
  return bitmap->Create(image.width, image.height, image.grayScale, image.pixels.data());
}

}  // namespace vxhost
