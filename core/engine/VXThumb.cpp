#include "VXThumb.h"

#include <utility>

#include "VXFile.h"

namespace {

constexpr uint16_t kObjectVersion = 1;
constexpr uint16_t kThumbVersion = 2;

}  // namespace

void CVXThumb::Create(uint32_t width, uint32_t height, int32_t format, uint32_t size,
                      const void* data) {
  width_ = width;
  height_ = height;
  format_ = format;
  // assign() keeps the capacity, so refilling one object allocates only when it grows.
  if (data) {
    auto* bytes = static_cast<const uint8_t*>(data);
    data_.assign(bytes, bytes + size);
  } else {
    data_.assign(size, 0);
  }
}

void CVXThumb::Write(CVXFile& file) const {
  file << kObjectVersion << Oid() << kThumbVersion << format_ << width_ << height_ << DataSize();
  if (!data_.empty()) file.Write(data_.data(), data_.size());
}

void CVXThumb::Read(CVXFile& file) {
  uint16_t objectVersion = 0;
  uint16_t thumbVersion = 0;
  uint32_t oid = 0;
  int32_t format = 0;
  uint32_t width = 0;
  uint32_t height = 0;
  uint32_t size = 0;
  file >> objectVersion >> oid >> thumbVersion >> format >> width >> height >> size;
  // ReadBytes refuses a size beyond what the record holds before it allocates anything.
  std::vector<uint8_t> data = file.ReadBytes(size);
  Oid() = oid;
  format_ = format;
  width_ = width;
  height_ = height;
  data_ = std::move(data);
}
