#include "VXMemFile.h"

#include <algorithm>

#include "VXException.h"
#include "VXResult.h"

CVXMemFile::CVXMemFile(bool /*flag*/, size_t initialSize, size_t growBy)
    : growBy_(growBy ? growBy : 4096) {
  buffer_.reserve(initialSize);
}

CVXMemFile::CVXMemFile(const void* data, size_t size) {
  const auto* p = static_cast<const uint8_t*>(data);
  buffer_.assign(p, p + size);
  size_ = size;
}

void CVXMemFile::Reserve_(size_t size) {
  if (size <= buffer_.size()) return;
  // Grow in steps of growBy_, but at least geometrically so that a long series of small writes
  // stays linear.
  size_t target = std::max(size, buffer_.size() + buffer_.size() / 2);
  target = (target + growBy_ - 1) / growBy_ * growBy_;
  buffer_.resize(target);
}

uint8_t* CVXMemFile::GetBuffer(size_t size) {
  if (size > buffer_.size()) buffer_.resize(size);
  size_ = size;
  position_ = std::min(position_, size_);
  return buffer_.data();
}

void CVXMemFile::Seek(uint64_t position) {
  if (position > size_) VX_THROW(VX_NOT_FOUND);
  position_ = static_cast<size_t>(position);
}

void CVXMemFile::WriteRaw(const void* buffer, size_t size) {
  Reserve_(position_ + size);
  std::memcpy(buffer_.data() + position_, buffer, size);
  position_ += size;
  size_ = std::max(size_, position_);
}

void CVXMemFile::ReadRaw(void* buffer, size_t size) {
  if (size > size_ - position_) VX_THROW(VX_NOT_FOUND);
  std::memcpy(buffer, buffer_.data() + position_, size);
  position_ += size;
}

CVXFile& operator<<(CVXFile& file, const CVXMemFile& mem) {
  if (mem.GetFileSize() > UINT32_MAX) VX_THROW(VX_RANGE);
  file << static_cast<uint32_t>(mem.GetFileSize());
  file.Write(mem.GetBuffer(), static_cast<size_t>(mem.GetFileSize()));
  return file;
}

CVXFile& operator>>(CVXFile& file, CVXMemFile& mem) {
  uint32_t size = 0;
  file >> size;
  // Read fully before touching `mem`, so that a corrupt length leaves it as it was.
  std::vector<uint8_t> bytes = file.ReadBytes(size);
  mem = CVXMemFile(bytes.data(), bytes.size());
  return file;
}
