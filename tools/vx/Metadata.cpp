#include "Metadata.h"

#include <vxcore3/vxcore3.h>
#include <exiv2/exiv2.hpp>

#include <algorithm>
#include <climits>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <mutex>

namespace vxhost {
namespace {

std::mutex g_xmpMutex;

void LockXmp(void*, bool lock) {
  if (lock) {
    g_xmpMutex.lock();
  } else {
    g_xmpMutex.unlock();
  }
}

// The XMP toolkit must be started once, with a lock, before threads parse packets.
void InitExiv2() {
  static std::once_flag once;
  std::call_once(once, [] {
    Exiv2::LogMsg::setLevel(Exiv2::LogMsg::mute);
    Exiv2::XmpParser::initialize(LockXmp, nullptr);
  });
}

std::string Trim(std::string s) {
  size_t end = s.find_last_not_of(std::string(" \t\r\n\0", 5));
  s.erase(end == std::string::npos ? 0 : end + 1);
  size_t begin = s.find_first_not_of(" \t\r\n");
  return begin == std::string::npos ? std::string() : s.substr(begin);
}

// Lookup by key name; a key exiv2 does not know counts as absent.
template <typename Key, typename Data>
auto Find(const Data& data, const char* key) -> decltype(&*data.begin()) {
  try {
    auto it = data.findKey(Key(key));
    return it == data.end() ? nullptr : &*it;
  } catch (...) {
    return nullptr;
  }
}

// One file's three metadata blocks with typed accessors that never throw.
class Blocks {
 public:
  Blocks(const Exiv2::ExifData& exif, const Exiv2::IptcData& iptc, const Exiv2::XmpData& xmp)
      : exif_(exif), iptc_(iptc), xmp_(xmp) {}

  const Exiv2::Exifdatum* Exif(const char* key) const { return Find<Exiv2::ExifKey>(exif_, key); }

  std::string ExifText(const char* key) const {
    const auto* d = Exif(key);
    return d ? Trim(d->toString()) : std::string();
  }

  // A non-zero rational of EXIF as a double; 0 when absent or undefined.
  double ExifNumber(const char* key, long n = 0) const {
    const auto* d = Exif(key);
    if (!d || d->count() <= n) return 0;
    Exiv2::Rational r = d->toRational(n);
    return r.second == 0 ? 0 : static_cast<double>(r.first) / r.second;
  }

  long ExifLong(const char* key) const {
    const auto* d = Exif(key);
    return d && d->count() > 0 ? d->toLong(0) : 0;
  }

  std::string IptcText(const char* key) const {
    const auto* d = Find<Exiv2::IptcKey>(iptc_, key);
    return d ? Trim(d->toString()) : std::string();
  }

  // Every value of a repeatable IPTC dataset.
  std::vector<std::string> IptcAll(const char* key) const {
    std::vector<std::string> out;
    for (const auto& d : iptc_) {
      if (d.key() == key) out.push_back(Trim(d.toString()));
    }
    return out;
  }

  // Text of an XMP property: a language alternative gives its "x-default" entry (else its
  // first), an array its items joined by "; ".
  std::string XmpText(const char* key) const {
    const auto* d = Find<Exiv2::XmpKey>(xmp_, key);
    if (!d) return std::string();
    const Exiv2::Value& v = d->value();
    if (v.typeId() == Exiv2::langAlt) {
      const auto& alt = static_cast<const Exiv2::LangAltValue&>(v);
      auto it = alt.value_.find("x-default");
      if (it == alt.value_.end()) it = alt.value_.begin();
      return it == alt.value_.end() ? std::string() : Trim(it->second);
    }
    std::string out;
    for (const auto& item : XmpItems(key)) out += (out.empty() ? "" : "; ") + item;
    return out;
  }

  // The items of an XMP array, or the one value of a simple property.
  std::vector<std::string> XmpItems(const char* key) const {
    const auto* d = Find<Exiv2::XmpKey>(xmp_, key);
    if (!d) return {};
    Exiv2::TypeId type = d->value().typeId();
    if (type != Exiv2::xmpBag && type != Exiv2::xmpSeq && type != Exiv2::xmpAlt) {
      return {Trim(d->toString())};
    }
    std::vector<std::string> out;
    for (long i = 0; i < d->count(); ++i) out.push_back(Trim(d->toString(i)));
    return out;
  }

 private:
  const Exiv2::ExifData& exif_;
  const Exiv2::IptcData& iptc_;
  const Exiv2::XmpData& xmp_;
};

std::string FirstOf(std::initializer_list<std::string> candidates) {
  for (const auto& c : candidates) {
    if (!c.empty()) return c;
  }
  return std::string();
}

// "YYYY:MM:DD HH:MM:SS" (EXIF) or "YYYY-MM-DDTHH:MM:SS[zone]" (XMP); the time may be absent,
// a zone is ignored. A date with a zero year, month or day is no date.
bool ParseDate(const std::string& text, std::tm* tm) {
  int v[6] = {0, 0, 0, 0, 0, 0};
  int n = std::sscanf(text.c_str(), "%4d%*1[-:]%2d%*1[-:]%2d%*1[ T]%2d:%2d:%2d", &v[0], &v[1],
                      &v[2], &v[3], &v[4], &v[5]);
  if (n < 3 || v[0] <= 0 || v[1] < 1 || v[1] > 12 || v[2] < 1 || v[2] > 31) return false;
  if (v[3] > 23 || v[4] > 59 || v[5] > 60) return false;
  *tm = std::tm();
  tm->tm_year = v[0] - 1900;
  tm->tm_mon = v[1] - 1;
  tm->tm_mday = v[2];
  tm->tm_hour = v[3];
  tm->tm_min = v[4];
  tm->tm_sec = v[5];
  tm->tm_isdst = -1;
  return true;
}

// The first date that parses: cameras write "0000:00:00 00:00:00" for a clock never set.
void ReadDate(const Blocks& b, ImageMetadata* m) {
  std::tm tm;
  bool found = false;
  for (const std::string& text :
       {b.ExifText("Exif.Photo.DateTimeOriginal"), b.ExifText("Exif.Photo.DateTimeDigitized"),
        b.ExifText("Exif.Image.DateTime"), b.XmpText("Xmp.exif.DateTimeOriginal"),
        b.XmpText("Xmp.photoshop.DateCreated"), b.XmpText("Xmp.xmp.CreateDate")}) {
    if ((found = ParseDate(text, &tm))) break;
  }
  if (!found) return;
  char iso[80];
  std::snprintf(iso, sizeof iso, "%04d-%02d-%02dT%02d:%02d:%02d", tm.tm_year + 1900, tm.tm_mon + 1,
                tm.tm_mday, tm.tm_hour, tm.tm_min, tm.tm_sec);
  std::time_t t = std::mktime(&tm);
  if (t == static_cast<std::time_t>(-1)) return;
  m->hasDateTaken = true;
  m->dateTaken = t;
  m->dateTakenText = iso;
}

// Degrees, minutes, seconds with a hemisphere letter; false when incomplete.
bool ReadCoordinate(const Blocks& b, const char* key, const char* refKey, char negative,
                    double* out) {
  const auto* d = b.Exif(key);
  if (!d || d->count() < 3) return false;
  double v = 0;
  for (long i = 0; i < 3; ++i) {
    Exiv2::Rational r = d->toRational(i);
    if (r.second == 0) return false;
    v += static_cast<double>(r.first) / r.second / std::pow(60.0, static_cast<double>(i));
  }
  std::string ref = b.ExifText(refKey);
  *out = !ref.empty() && ref[0] == negative ? -v : v;
  return true;
}

void ReadCamera(const Blocks& b, ImageMetadata* m) {
  m->make = FirstOf({b.ExifText("Exif.Image.Make"), b.XmpText("Xmp.tiff.Make")});
  m->model = FirstOf({b.ExifText("Exif.Image.Model"), b.XmpText("Xmp.tiff.Model")});
  m->lens = FirstOf({b.ExifText("Exif.Photo.LensModel"), b.XmpText("Xmp.aux.Lens"),
                     b.XmpText("Xmp.exifEX.LensModel")});
  m->software = FirstOf({b.ExifText("Exif.Image.Software"), b.XmpText("Xmp.xmp.CreatorTool")});
  m->exposureTime = b.ExifNumber("Exif.Photo.ExposureTime");
  if (m->exposureTime <= 0 && b.Exif("Exif.Photo.ShutterSpeedValue")) {
    m->exposureTime = std::pow(2.0, -b.ExifNumber("Exif.Photo.ShutterSpeedValue"));  // APEX
  }
  m->exposureText = MetadataReader::ExposureText(m->exposureTime);
  m->fNumber = b.ExifNumber("Exif.Photo.FNumber");
  if (m->fNumber <= 0 && b.Exif("Exif.Photo.ApertureValue")) {
    m->fNumber = std::pow(2.0, b.ExifNumber("Exif.Photo.ApertureValue") / 2);  // APEX
  }
  m->iso = static_cast<uint32_t>(std::max(0L, b.ExifLong("Exif.Photo.ISOSpeedRatings")));
  m->focalLength = b.ExifNumber("Exif.Photo.FocalLength");
  long orientation = b.ExifLong("Exif.Image.Orientation");
  m->orientation = orientation >= 1 && orientation <= 8 ? static_cast<int>(orientation) : 0;
  m->width = static_cast<uint32_t>(std::max(0L, b.Exif("Exif.Photo.PixelXDimension")
                                                    ? b.ExifLong("Exif.Photo.PixelXDimension")
                                                    : b.ExifLong("Exif.Image.ImageWidth")));
  m->height = static_cast<uint32_t>(std::max(0L, b.Exif("Exif.Photo.PixelYDimension")
                                                     ? b.ExifLong("Exif.Photo.PixelYDimension")
                                                     : b.ExifLong("Exif.Image.ImageLength")));
  m->hasGps = ReadCoordinate(b, "Exif.GPSInfo.GPSLatitude", "Exif.GPSInfo.GPSLatitudeRef", 'S',
                             &m->latitude) &&
              ReadCoordinate(b, "Exif.GPSInfo.GPSLongitude", "Exif.GPSInfo.GPSLongitudeRef", 'W',
                             &m->longitude);
  if (!m->hasGps) m->latitude = m->longitude = 0;
}

void ReadRating(const Blocks& b, ImageMetadata* m) {
  std::string xmpRating = b.XmpText("Xmp.xmp.Rating");
  if (!xmpRating.empty()) {
    m->rating = static_cast<int>(std::lround(std::strtod(xmpRating.c_str(), nullptr)));
  } else if (b.Exif("Exif.Image.Rating")) {
    m->rating = static_cast<int>(b.ExifLong("Exif.Image.Rating"));
  } else if (b.Exif("Exif.Image.RatingPercent")) {
    m->rating =
        MetadataReader::StarsFromPercent(static_cast<int>(b.ExifLong("Exif.Image.RatingPercent")));
  }
  m->rating = std::clamp(m->rating, -1, 5);
  m->label = b.XmpText("Xmp.xmp.Label");
}

void ReadDescriptive(const Blocks& b, ImageMetadata* m) {
  m->artist = FirstOf({b.ExifText("Exif.Image.Artist"), b.XmpText("Xmp.dc.creator"),
                       b.IptcText("Iptc.Application2.Byline")});
  m->copyright = FirstOf({b.ExifText("Exif.Image.Copyright"), b.XmpText("Xmp.dc.rights"),
                          b.IptcText("Iptc.Application2.Copyright")});
  m->title = FirstOf({b.XmpText("Xmp.dc.title"), b.IptcText("Iptc.Application2.ObjectName")});
  m->description =
      FirstOf({b.XmpText("Xmp.dc.description"), b.IptcText("Iptc.Application2.Caption"),
               b.ExifText("Exif.Image.ImageDescription")});
  m->city = FirstOf({b.XmpText("Xmp.photoshop.City"), b.IptcText("Iptc.Application2.City")});
  m->state =
      FirstOf({b.XmpText("Xmp.photoshop.State"), b.IptcText("Iptc.Application2.ProvinceState")});
  m->country =
      FirstOf({b.XmpText("Xmp.photoshop.Country"), b.IptcText("Iptc.Application2.CountryName")});
  std::vector<std::string> words = b.XmpItems("Xmp.dc.subject");
  for (auto& w : b.IptcAll("Iptc.Application2.Keywords")) words.push_back(std::move(w));
  for (auto& w : words) {
    if (!w.empty() && std::find(m->keywords.begin(), m->keywords.end(), w) == m->keywords.end()) {
      m->keywords.push_back(std::move(w));
    }
  }
}

HostStatus ReadImage(Exiv2::Image& image, ImageMetadata* out) {
  image.readMetadata();
  Blocks blocks(image.exifData(), image.iptcData(), image.xmpData());
  ReadCamera(blocks, out);
  ReadDate(blocks, out);
  ReadRating(blocks, out);
  ReadDescriptive(blocks, out);
  out->xmpPacket = image.xmpPacket();
  return HostStatus::Ok();
}

HostStatus FromExiv2Error(const Exiv2::AnyError& e) {
  switch (e.code()) {
    case Exiv2::kerDataSourceOpenFailed:
    case Exiv2::kerFileOpenFailed:
      return HostStatus(HostStatus::kIoError, e.what());
    case Exiv2::kerFileContainsUnknownImageType:
    case Exiv2::kerMemoryContainsUnknownImageType:
      return HostStatus(HostStatus::kUnsupported, e.what());
    default:
      return HostStatus(HostStatus::kCorrupt, e.what());
  }
}

// Runs `open` and reads what it returns, turning every exception into a status.
template <typename Open>
HostStatus Guarded(Open open, ImageMetadata* out) {
  *out = ImageMetadata();
  InitExiv2();
  try {
    auto image = open();
    if (!image.get()) return HostStatus(HostStatus::kUnsupported, "no image");
    return ReadImage(*image, out);
  } catch (const Exiv2::AnyError& e) {
    *out = ImageMetadata();
    return FromExiv2Error(e);
  } catch (const std::exception& e) {
    *out = ImageMetadata();
    return HostStatus(HostStatus::kCorrupt, e.what());
  } catch (...) {
    *out = ImageMetadata();
    return HostStatus(HostStatus::kCorrupt, "metadata reader failed");
  }
}

std::string Number(double v) {
  char text[32];
  std::snprintf(text, sizeof text, "%g", v);
  return text;
}

}  // namespace

HostStatus MetadataReader::Read(const std::string& path, ImageMetadata* out) {
  if (HostStatus st = HostStatus::CheckReadable(path); !st.ok()) {
    *out = ImageMetadata();
    return st;
  }
  return Guarded([&] { return Exiv2::ImageFactory::open(path, false); }, out);
}

HostStatus MetadataReader::ReadBuffer(const uint8_t* data, size_t size, ImageMetadata* out) {
  if (!data || size == 0 || size > static_cast<size_t>(LONG_MAX)) {
    *out = ImageMetadata();
    return HostStatus(HostStatus::kInvalidInput, "empty buffer");
  }
  return Guarded([&] { return Exiv2::ImageFactory::open(data, static_cast<long>(size)); }, out);
}

std::string MetadataReader::ExposureText(double seconds) {
  if (!(seconds > 0) || !std::isfinite(seconds)) return std::string();
  if (seconds < 1) {
    double denominator = 1 / seconds;
    double rounded = std::round(denominator);
    // Shutter speeds are "1/n"; a time that is no such fraction reads as a decimal.
    if (std::fabs(denominator - rounded) <= 0.05 * denominator) return "1/" + Number(rounded);
  }
  return Number(std::round(seconds * 10) / 10);
}

int MetadataReader::StarsFromPercent(int percent) {
  if (percent <= 0) return percent < 0 ? -1 : 0;
  if (percent < 13) return 1;
  if (percent < 38) return 2;
  if (percent < 63) return 3;
  if (percent < 88) return 4;
  return 5;
}

std::vector<SFTIRecord> ImageMetadata::FullTextRecords() const {
  std::vector<SFTIRecord> records;
  auto add = [&](const char* tag, const std::string& value) {
    if (!value.empty()) records.push_back(SFTIRecord{tag, value});
  };
  for (const auto& k : keywords) add("dc:subject", k);
  add("dc:title", title);
  add("dc:description", description);
  add("dc:creator", artist);
  add("dc:rights", copyright);
  add("photoshop:City", city);
  add("photoshop:State", state);
  add("photoshop:Country", country);
  add("tiff:Make", make);
  add("tiff:Model", model);
  add("aux:Lens", lens);
  add("xmp:CreatorTool", software);
  add("exif:DateTimeOriginal", dateTakenText);
  add("exif:ExposureTime", exposureText);
  if (fNumber > 0) add("exif:FNumber", Number(std::round(fNumber * 10) / 10));
  if (iso > 0) add("exif:ISOSpeedRatings", std::to_string(iso));
  if (focalLength > 0) add("exif:FocalLength", Number(std::round(focalLength * 10) / 10));
  if (rating != 0) add("xmp:Rating", std::to_string(rating));
  add("xmp:Label", label);
  return records;
}

}  // namespace vxhost
