// Arbitrary bytes as a folder record.
#include "VXFolder.h"
#include "record_roundtrip.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  return vxfuzz::RoundTrip<CVXFolder>(data, size, [](const CVXFolder& folder) {
    folder.FriendlyName();
    folder.MediaSerialWindows();
  });
}
