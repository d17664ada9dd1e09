#pragma once

// Builds little-endian byte arrays by hand, for tests of stored record formats.

#include <cstdint>
#include <string>
#include <vector>

namespace vxtest {

struct Bytes {
  std::vector<uint8_t> b;

  template <typename T>
  Bytes& le(T v) {
    for (size_t i = 0; i < sizeof v; ++i) b.push_back(static_cast<uint8_t>(uint64_t(v) >> 8 * i));
    return *this;
  }
  Bytes& u16(uint16_t v) { return le(v); }
  Bytes& u32(uint32_t v) { return le(v); }
  // A string as records store it: a 32-bit byte count, then the bytes.
  Bytes& str(const std::string& s) {
    le(uint32_t(s.size()));
    b.insert(b.end(), s.begin(), s.end());
    return *this;
  }
  Bytes& raw(const void* p, size_t n) {
    auto* c = static_cast<const uint8_t*>(p);
    b.insert(b.end(), c, c + n);
    return *this;
  }
};

}  // namespace vxtest
