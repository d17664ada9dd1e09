#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "HostStatus.h"

struct SFTIRecord;

namespace vxhost {

// What the host takes from an image's EXIF, IPTC and XMP data. Empty strings and zeros mean
// "not present".
struct ImageMetadata {
  std::string make;
  std::string model;
  std::string lens;
  std::string software;
  std::string artist;
  std::string copyright;
  std::string title;
  std::string description;

  // Date taken: DateTimeOriginal, else DateTimeDigitized, else DateTime. EXIF dates carry no
  // zone; they are read as the local time of this machine (mktime), the way a file's own date
  // is shown to the user, so the two compare.
  bool hasDateTaken = false;
  int64_t dateTaken = 0;      // seconds since 1970
  std::string dateTakenText;  // "YYYY-MM-DDTHH:MM:SS"

  double exposureTime = 0;   // seconds
  std::string exposureText;  // "1/250", "2", "0.6"
  double fNumber = 0;
  uint32_t iso = 0;
  double focalLength = 0;  // mm
  int orientation = 0;     // 1 to 8; 0 when absent

  bool hasGps = false;
  double latitude = 0;   // degrees, north positive
  double longitude = 0;  // degrees, east positive

  uint32_t width = 0;  // from EXIF, when present
  uint32_t height = 0;

  std::string xmpPacket;              // the file's own packet, empty when it has none
  int rating = 0;                     // -1 rejected, 0 none, 1 to 5
  std::string label;                  // xmp:Label
  std::vector<std::string> keywords;  // dc:subject and IPTC Keywords, first occurrence kept
  std::string city;
  std::string state;
  std::string country;

  // The full-text records of the file: one (tag, value) pair per value, tags in XMP's
  // "prefix:Name" form ("dc:subject" once per keyword). Empty fields give no record.
  std::vector<SFTIRecord> FullTextRecords() const;
};

// Reads metadata with exiv2. Thread-safe; never throws: exiv2's exceptions become statuses.
// A file that exiv2 opens but that holds no metadata gives an empty record and success.
class MetadataReader {
 public:
  static HostStatus Read(const std::string& path, ImageMetadata* out);
  static HostStatus ReadBuffer(const uint8_t* data, size_t size, ImageMetadata* out);

  // "1/250" for 0.004 s, "2" for 2 s, "0.6" for 0.6 s.
  static std::string ExposureText(double seconds);
  // RatingPercent (0..100) as the star rating that writers map to it.
  static int StarsFromPercent(int percent);
};

}  // namespace vxhost
