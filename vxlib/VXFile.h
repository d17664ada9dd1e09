#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <type_traits>
#include <vector>

#include "VXBase.h"

class CBitVector;

// Abstract serialising file. Integers go out little-endian without gaps; a string is a 32-bit
// byte count followed by the bytes. Derived classes supply the raw byte transfer; Read throws a
// CVXException (10020) rather than return fewer bytes than asked for, so a record reader can
// never run past its input.
//
// Between BeginCheckSum and EndCheckSum every byte written or read is added into an unsigned
// 32-bit sum.
class CVXFile : public CVXBase {
 public:
  CVXFile() = default;
  CVXFile(const CVXFile&) = default;
  CVXFile& operator=(const CVXFile&) = default;
  ~CVXFile() override = default;

  virtual void Write(const void* buffer, size_t size);
  virtual void Read(void* buffer, size_t size);

  template <typename T>
    requires std::is_arithmetic_v<T>
  CVXFile& operator<<(T value) {
    static_assert(std::endian::native == std::endian::little);
    Write(&value, sizeof value);
    return *this;
  }
  template <typename T>
    requires std::is_arithmetic_v<T>
  CVXFile& operator>>(T& value) {
    Read(&value, sizeof value);
    return *this;
  }
  CVXFile& operator<<(const std::string& text);
  CVXFile& operator>>(std::string& text);
  CVXFile& operator<<(const char* text) { return *this << std::string(text ? text : ""); }
  // Bit sets: a 32-bit byte count (the bit size rounded up to 32 bits, over 8), then the bits.
  CVXFile& operator<<(const CBitVector& bits);
  CVXFile& operator>>(CBitVector& bits);

  // Exactly `size` bytes, or throws 10020. A count beyond Remaining() fails before anything is
  // read, and an unknown remainder is read in chunks, so a corrupt count cannot make the reader
  // allocate far more than the input holds.
  std::vector<uint8_t> ReadBytes(uint32_t size);

  void BeginCheckSum();
  uint32_t EndCheckSum();

  static bool FileExists(const std::string& path);

  // Bytes still readable, or UINT64_MAX when unknown; lets readers reject a count or length
  // field that claims more than the input holds before they allocate for it.
  virtual uint64_t Remaining() const { return UINT64_MAX; }

 protected:
  // Raw transfer. ReadRaw must deliver exactly `size` bytes or throw.
  virtual void WriteRaw(const void* buffer, size_t size) = 0;
  virtual void ReadRaw(void* buffer, size_t size) = 0;

 private:
  void Sum_(const void* buffer, size_t size);

  bool summing_ = false;
  uint32_t sum_ = 0;
};
