// Arbitrary bytes as a persistent-selection stream. Reading sets each location of the result
// anew, which may normalise its text once, so the written bytes are compared from the second
// reading on.
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
  CVXMemFile in(data, size);
  CVXPersistantSelection sel;
  try {
    in >> sel;
  } catch (CVXException* e) {
    delete e;
    return 0;
  }
  Inspect(sel);
  std::vector<uint8_t> once = vxfuzz::Written(sel);
  return vxfuzz::RoundTrip<CVXPersistantSelection>(once.data(), once.size(), Inspect);
}
