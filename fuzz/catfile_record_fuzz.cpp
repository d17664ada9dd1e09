// Arbitrary bytes as a file record.
#include "VXCatFile.h"
#include "record_roundtrip.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  return vxfuzz::RoundTrip<CVXCatFile>(data, size, [](const CVXCatFile& file) { file.SortTime(); });
}
