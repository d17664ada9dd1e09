#include "VXFile.h"

#include <sys/stat.h>

#include <algorithm>

#include "VXException.h"
#include "VXResult.h"

void CVXFile::Write(const void* buffer, size_t size) {
  if (size == 0) return;
  WriteRaw(buffer, size);
  if (summing_) Sum_(buffer, size);
}

void CVXFile::Read(void* buffer, size_t size) {
  if (size == 0) return;
  ReadRaw(buffer, size);
  if (summing_) Sum_(buffer, size);
}

void CVXFile::Sum_(const void* buffer, size_t size) {
  const auto* p = static_cast<const uint8_t*>(buffer);
  uint32_t sum = sum_;
  for (size_t i = 0; i < size; ++i) sum += p[i];
  sum_ = sum;
}

CVXFile& CVXFile::operator<<(const std::string& text) {
  if (text.size() > UINT32_MAX) VX_THROW(VX_RANGE);
  *this << static_cast<uint32_t>(text.size());
  Write(text.data(), text.size());
  return *this;
}

CVXFile& CVXFile::operator>>(std::string& text) {
  uint32_t size = 0;
  *this >> size;
  std::vector<uint8_t> bytes = ReadBytes(size);
  text.assign(bytes.begin(), bytes.end());
  return *this;
}

std::vector<uint8_t> CVXFile::ReadBytes(uint32_t size) {
  if (size > Remaining()) VX_THROW(VX_NOT_FOUND);
  std::vector<uint8_t> bytes;
  constexpr size_t kChunk = 1 << 20;
  for (uint32_t left = size; left > 0;) {
    size_t n = std::min<size_t>(left, kChunk);
    size_t at = bytes.size();
    bytes.resize(at + n);
    Read(bytes.data() + at, n);
    left -= static_cast<uint32_t>(n);
  }
  return bytes;
}

void CVXFile::BeginCheckSum() {
  summing_ = true;
  sum_ = 0;
}

uint32_t CVXFile::EndCheckSum() {
  summing_ = false;
  return sum_;
}

bool CVXFile::FileExists(const std::string& path) {
  struct stat st {};
  return !path.empty() && ::stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}
