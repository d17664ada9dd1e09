#pragma once

#include <cstdint>
#include <vector>

#include "VXDBObject.h"

class CVXFile;

// A thumbnail of one file: the host's encoded image bytes with their size and format number.
// The engine stores it as record 3/OID of the thumbnail store, keyed by the file's OID.
class CVXThumb : public CVXDBObject {
 public:
  CVXThumb() = default;
  CVXThumb(const CVXThumb&) = default;
  CVXThumb& operator=(const CVXThumb&) = default;
  ~CVXThumb() override = default;

  int32_t Format() const { return format_; }
  uint32_t Width() const { return width_; }
  uint32_t Height() const { return height_; }
  uint32_t DataSize() const { return static_cast<uint32_t>(data_.size()); }
  // Null when there is no data.
  const uint8_t* Data() const { return data_.empty() ? nullptr : data_.data(); }

  // Copies `size` bytes from `data`; a null `data` gives `size` zero bytes.
  void Create(uint32_t width, uint32_t height, int32_t format, uint32_t size, const void* data);

  // Record 3/OID: u16 object version 1, u32 OID, u16 thumbnail version 2, i32 Format,
  // u32 Width, u32 Height, u32 DataSize, the data. The versions are not tested on reading.
  // Read throws CVXException* (10020) on a short record and then leaves this object unchanged.
  void Write(CVXFile& file) const;
  void Read(CVXFile& file);

 private:
  int32_t format_ = 0;
  uint32_t width_ = 0;
  uint32_t height_ = 0;
  std::vector<uint8_t> data_;
};
