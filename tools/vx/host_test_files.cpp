#include "host_test_files.h"

#include <gtest/gtest.h>
#include <vips/vips.h>
#include <zlib.h>

#include <exiv2/exiv2.hpp>
#include <vector>

#include "ImageDecoder.h"
#include "vxbytes.h"

namespace vxhost_test {

namespace {

void AppendPngChunk(vxtest::Bytes& png, const char* type, const std::vector<uint8_t>& data) {
  auto be32 = [&](uint32_t v) {
    for (int s = 24; s >= 0; s -= 8) png.b.push_back(uint8_t(v >> s));
  };
  be32(uint32_t(data.size()));
  size_t start = png.b.size();
  png.raw(type, 4).raw(data.data(), data.size());
  be32(uint32_t(crc32(0, png.b.data() + start, uInt(png.b.size() - start))));
}

}  // namespace

// Saves w x h pixels of `bands` bytes each, the format chosen by the file's extension.
void SaveImage(const std::string& path, int w, int h, int bands,
               uint8_t (*pixel)(int x, int y, int band), int orientation) {
  std::vector<uint8_t> buf(size_t(w) * h * bands);
  for (int y = 0; y < h; ++y) {
    for (int x = 0; x < w; ++x) {
      for (int b = 0; b < bands; ++b) buf[(size_t(y) * w + x) * bands + b] = pixel(x, y, b);
    }
  }
  vxhost::ImageDecoder::InitLibrary();
  VipsImage* img =
      vips_image_new_from_memory_copy(buf.data(), buf.size(), w, h, bands, VIPS_FORMAT_UCHAR);
  ASSERT_NE(img, nullptr);
  if (orientation) vips_image_set_int(img, "orientation", orientation);
  ASSERT_EQ(vips_image_write_to_file(img, path.c_str(), nullptr), 0) << vips_error_buffer();
  g_object_unref(img);
}

// A 16-bit grey PNG, every sample 0x8000.
void SaveDeepGrey(const std::string& path) {
  VipsImage *black, *grey, *deep, *tagged;
  ASSERT_EQ(vips_black(&black, 4, 4, nullptr), 0);
  ASSERT_EQ(vips_linear1(black, &grey, 1, 32768, nullptr), 0);
  ASSERT_EQ(vips_cast_ushort(grey, &deep, nullptr), 0);
  ASSERT_EQ(vips_copy(deep, &tagged, "interpretation", VIPS_INTERPRETATION_GREY16, nullptr), 0);
  ASSERT_EQ(vips_image_write_to_file(tagged, path.c_str(), nullptr), 0);
  for (VipsImage* i : {black, grey, deep, tagged}) g_object_unref(i);
}

// Red rises to the right, green downwards, blue fixed.
uint8_t Gradient(int x, int y, int b) {
  return b == 0 ? uint8_t(x * 255 / 639) : b == 1 ? uint8_t(y * 255 / 479) : 128;
}

// A valid PNG signature and IHDR claiming 20000 x 20000 RGB, then a tiny IDAT and IEND.
std::string ForgedHugePng() {
  vxtest::Bytes png;
  png.raw("\x89PNG\r\n\x1a\n", 8);
  AppendPngChunk(png, "IHDR", {0, 0, 0x4E, 0x20, 0, 0, 0x4E, 0x20, 8, 2, 0, 0, 0});
  AppendPngChunk(png, "IDAT", {0x78, 0x9C, 0x63, 0x00, 0x00, 0x00, 0x01, 0x00, 0x01});
  AppendPngChunk(png, "IEND", {});
  return std::string(png.b.begin(), png.b.end());
}

// Writes a full set of EXIF, IPTC and XMP fields into a copy of the test JPEG.
void WriteRichMetadata(const std::string& path) {
  auto image = Exiv2::ImageFactory::open(path);
  Exiv2::ExifData exif;
  exif["Exif.Image.Make"] = "Canon";
  exif["Exif.Image.Model"] = "EOS 5D";
  exif["Exif.Photo.LensModel"] = "EF50mm f/1.8";
  exif["Exif.Photo.DateTimeOriginal"] = "2021:07:04 13:45:10";
  exif["Exif.Image.DateTime"] = "2022:01:01 00:00:00";
  exif["Exif.Photo.ExposureTime"] = Exiv2::URational(1, 250);
  exif["Exif.Photo.FNumber"] = Exiv2::URational(28, 10);
  exif["Exif.Photo.ISOSpeedRatings"] = uint16_t(400);
  exif["Exif.Photo.FocalLength"] = Exiv2::URational(50, 1);
  exif["Exif.Image.Orientation"] = uint16_t(6);
  exif["Exif.Photo.PixelXDimension"] = uint32_t(640);
  exif["Exif.Photo.PixelYDimension"] = uint32_t(480);
  exif["Exif.GPSInfo.GPSLatitudeRef"] = "S";
  exif["Exif.GPSInfo.GPSLatitude"] = "48/1 51/1 30/1";
  exif["Exif.GPSInfo.GPSLongitudeRef"] = "E";
  exif["Exif.GPSInfo.GPSLongitude"] = "2/1 17/1 40/1";
  exif["Exif.Image.Software"] = "vxtest";
  exif["Exif.Image.Artist"] = "A. Painter";
  exif["Exif.Image.Copyright"] = "(c) 2021";
  Exiv2::IptcData iptc;
  for (const char* word : {"tower", "night"}) {
    iptc.add(Exiv2::IptcKey("Iptc.Application2.Keywords"), Exiv2::StringValue(word).clone().get());
  }
  iptc["Iptc.Application2.CountryName"] = "France";
  Exiv2::XmpData xmp;
  auto bag = Exiv2::Value::create(Exiv2::xmpBag);
  bag->read("Paris");
  bag->read("tower");
  xmp.add(Exiv2::XmpKey("Xmp.dc.subject"), bag.get());
  xmp["Xmp.dc.title"] = "lang=x-default Eiffel";
  xmp["Xmp.photoshop.City"] = "Paris";
  xmp["Xmp.xmp.Rating"] = "4";
  xmp["Xmp.xmp.Label"] = "Red";
  image->setExifData(exif);
  image->setIptcData(iptc);
  image->setXmpData(xmp);
  image->writeMetadata();
}

}  // namespace vxhost_test
