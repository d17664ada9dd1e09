// Arbitrary bytes as a selector stream, and every flag query on what reads.
#include "VXSelector.h"
#include "record_roundtrip.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  return vxfuzz::RoundTrip<CVXSelector>(data, size, [](const CVXSelector& sel) {
    sel.IsInterActive();
    sel.HasActiveMask();
    sel.HasPropertySelector();
    sel.NeedsVXShapeData();
    sel.WorksWithActiveFolder();
    sel.WorksWithActiveCategory();
    CVXSelector copy = sel;
    if (!(copy == sel)) std::abort();
  });
}
