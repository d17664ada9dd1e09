#include "VXFile.h"

#include <sys/stat.h>

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
  if (size > Remaining()) VX_THROW(VX_NOT_FOUND);
  std::string value(size, '\0');
  Read(value.data(), size);
  text = std::move(value);
  return *this;
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
