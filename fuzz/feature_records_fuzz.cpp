// Arbitrary bytes as a selection feature record. The first byte picks the record and whether
// the core block comes first; the rest is the stream. A record that loads must store bytes that
// load again to exactly those bytes.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "VXException.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "VXSelFeatures.h"
#include "VXSelImageFeatures.h"
#include "VXSelPropFeatures.h"

namespace {

template <typename T>
std::vector<uint8_t> Stored(T& record, bool withCore) {
  CVXMemFile out;
  record.Store(&out, withCore);
  return {out.GetBuffer(), out.GetBuffer() + out.GetFileSize()};
}

// False when the bytes do not load; any exception but the short-stream one is a fault.
template <typename T>
bool Load(T& record, const uint8_t* data, size_t size, bool withCore) {
  CVXMemFile in(data, size);
  record.Reset();
  try {
    record.Load(&in, withCore);
  } catch (CVXException* e) {
    if (e->GetCode() != VX_NOT_FOUND) std::abort();
    delete e;
    return false;
  }
  return true;
}

template <typename T>
void RoundTrip(const uint8_t* data, size_t size, bool withCore) {
  T record;
  if (!Load(record, data, size, withCore)) return;
  std::vector<uint8_t> written = Stored(record, withCore);
  T again;
  if (!Load(again, written.data(), written.size(), withCore)) std::abort();
  if (Stored(again, withCore) != written) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  bool withCore = (data[0] & 0x80) == 0;
  const uint8_t* stream = data + 1;
  size_t n = size - 1;
  switch (data[0] & 0x0F) {
    case 0:
      RoundTrip<SSelCoreData>(stream, n, withCore);
      break;
    case 1:
      RoundTrip<SSelFileFormat>(stream, n, withCore);
      break;
    case 2:
      RoundTrip<SSelFolders>(stream, n, withCore);
      break;
    case 3:
      RoundTrip<SSelCategories>(stream, n, withCore);
      break;
    case 4:
      RoundTrip<SSelFileName>(stream, n, withCore);
      break;
    case 5:
      RoundTrip<SSelFileSize>(stream, n, withCore);
      break;
    case 6:
      RoundTrip<SSelFileDateTime>(stream, n, withCore);
      break;
    case 7:
      RoundTrip<SSelLimits>(stream, n, withCore);
      break;
    case 8:
      RoundTrip<SSelDimensions>(stream, n, withCore);
      break;
    case 9:
      RoundTrip<SSelColor>(stream, n, withCore);
      break;
    case 10:
      RoundTrip<SSelMask>(stream, n, withCore);
      break;
    case 11:
      RoundTrip<SSelMatch>(stream, n, withCore);
      break;
    case 12:
      RoundTrip<SSelProps>(stream, n, withCore);
      break;
    default:
      RoundTrip<SSelXMP>(stream, n, withCore);
      break;
  }
  return 0;
}
