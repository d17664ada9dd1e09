#pragma once

#include <cstdint>
#include <string>

#include "VXDBObject.h"

class CVXFile;

// Bits of CVXCatFile::SData::Flags the library reads; all other bits are the host's and are
// carried unchanged.
enum : uint16_t {
  cfGreyscale = 0x0001,
  cfEmbeddedTimeValid = 0x0040,
};

// A file of the catalog: its name within its folder and what the host told about it. The
// catalog holds one per file and hands out copies; a change reaches the store only when the copy
// is handed back.
class CVXCatFile : public CVXDBObject {
 public:
  // The fields behind Name are stored as one 66-byte block in exactly this order, without gaps.
  struct SData {
    std::string Name;       // within the folder, no path
    uint32_t Folder = 0;    // OID of the owning folder
    uint32_t Width = 0;     // pixels
    uint32_t Height = 0;    // pixels
    uint32_t Size = 0;      // bytes
    uint32_t Format = 0;    // the host's format number
    uint32_t CRC = 0;       // content checksum from the caller of AddFile
    int32_t Processed = 0;  // seconds since 1970: last feature extraction
    int32_t FileTime = 0;   // seconds since 1970: the file's date
    uint16_t Flags = 0;     // cfGreyscale, cfEmbeddedTimeValid, host bits
    uint32_t Reserved1 = 0;
    int32_t EmbeddedTime = 0;   // seconds since 1970: from the image's metadata
    uint32_t OriginalFile = 0;  // OID of the file this one is a version of
    uint8_t VersionTag = 0;     // Id of the version tag
    uint8_t Reserved4[19] = {};
  };
  static constexpr uint32_t kBlockBytes = 66;

  // The constructors that make a new file (all but the copy and the reading one) stamp
  // Processed and FileTime with the current time.
  CVXCatFile();
  CVXCatFile(uint32_t oid, const std::string& name, uint32_t folderOid);
  CVXCatFile(uint32_t oid, const char* name, uint32_t folderOid);
  // Reads a file record (as Read does) straight from the bytes at `at`, up to `end`, and moves
  // `at` behind it: bulk loads build their map entries with it.
  CVXCatFile(const uint8_t*& at, const uint8_t* end);
  CVXCatFile(const CVXCatFile&) = default;
  CVXCatFile& operator=(const CVXCatFile&) = default;
  ~CVXCatFile() override = default;

  SData& Properties() { return data_; }
  const SData& Properties() const { return data_; }
  const std::string& Name() const { return data_.Name; }

  bool IsGreyscale() const { return (data_.Flags & cfGreyscale) != 0; }
  // A square image is both landscape and portrait.
  bool IsLandscape() const { return data_.Width >= data_.Height; }
  bool IsPortrait() const { return data_.Height >= data_.Width; }
  // The date that date sorting uses: the embedded one when flagged valid and not 0.
  int32_t SortTime() const;

  // Names compare case-insensitively; the folder plays no part in the order, so two files of
  // one name in different folders are neither equal nor less than each other.
  bool operator<(const CVXCatFile& other) const;
  bool operator==(const CVXCatFile& other) const;
  bool operator==(const std::string& name) const;
  static int CompareNames(const std::string& a, const std::string& b);

  // The file record (blob type 3). Read throws CVXException* (10020) on a truncated record and
  // then leaves this object unchanged.
  void Write(CVXFile& file) const;
  void Read(CVXFile& file);

 private:
  SData data_;
};

// For the catalog's store only.
CVXFile& operator<<(CVXFile& file, const CVXCatFile& catFile);
CVXFile& operator>>(CVXFile& file, CVXCatFile& catFile);
