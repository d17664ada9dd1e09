// Arbitrary bytes as a persistent-selection stream: a code or a selection that writes back to
// bytes that read again to exactly those bytes.
#include <vector>

#include "VXPersistantSelection.h"
#include "bitvector.h"
#include "record_roundtrip.h"

namespace {

// A hit OID sizes the bit set, up to 512 MB for the highest; such runs only slow the search.
bool SmallOids(const CVXPersistantSelection& sel) {
  for (const SVXResultSetEntry& e : sel.Properties().Result.Properties().Entries) {
    for (const SVXRSEntry& h : e.Hits) {
      if (h.OID >= (1u << 24)) return false;
    }
  }
  return true;
}

void Inspect(const CVXPersistantSelection& sel) {
  CBitVector bits;
  if (SmallOids(sel)) sel.GetAllResultImages(bits);
  sel.HasImage(bits.Low());
  CVXPersistantSelection copy = sel;
  copy.RemoveImage(bits.Low());
  sel.Properties().Selector.IsInterActive();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  return vxfuzz::RoundTrip<CVXPersistantSelection>(data, size, Inspect);
}
