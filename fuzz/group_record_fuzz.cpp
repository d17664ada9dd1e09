// Arbitrary bytes as a category record.
#include "VXGroup.h"
#include "record_roundtrip.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  return vxfuzz::RoundTrip<CVXGroup>(data, size, [](const CVXGroup& group) { group.IsFTIChild(); });
}
