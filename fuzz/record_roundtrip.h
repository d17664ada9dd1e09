#pragma once

// The shared body of the record fuzz targets: arbitrary bytes read as a record give a code or a
// record, never a crash, a huge allocation or a read past the buffer; a record that reads must
// write back to bytes that read again to exactly those bytes.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "VXException.h"
#include "VXMemFile.h"

namespace vxfuzz {

template <typename T>
std::vector<uint8_t> Written(const T& record) {
  CVXMemFile out;
  out << record;
  return {out.GetBuffer(), out.GetBuffer() + out.GetFileSize()};
}

// `inspect` runs on a record that read, for what a host would ask of it.
template <typename T, typename Inspect>
int RoundTrip(const uint8_t* data, size_t size, Inspect inspect) {
  CVXMemFile in(data, size);
  T record;
  try {
    in >> record;
  } catch (CVXException* e) {
    delete e;
    return 0;
  }
  inspect(record);
  std::vector<uint8_t> written = Written(record);
  CVXMemFile again(written.data(), written.size());
  T reread;
  again >> reread;
  if (again.Remaining() != 0 || Written(reread) != written) std::abort();
  return 0;
}

}  // namespace vxfuzz
