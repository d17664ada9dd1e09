// Arbitrary bytes as a result-set stream, and the reference queries and removals on what reads.
#include <cstdlib>
#include <vector>

#include "VXResultSet.h"
#include "record_roundtrip.h"

namespace {

void Inspect(const CVXResultSet& rs) {
  CVXResultSet::ERefType ref;
  std::vector<unsigned long> originals;
  rs.GetOriginals(originals);
  for (const SVXResultSetEntry& e : rs.Properties().Entries) {
    rs.HasReference(e.OID, ref);
    rs.HasReference(e.URI, ref);
    rs.HasFolderReference(e.Folder, ref);
    if (rs.GetEntry(e.Number) == rs.Properties().Entries.end()) std::abort();
  }
  CVXResultSet copy = rs;
  uint32_t oid = originals.empty() ? 0 : static_cast<uint32_t>(originals.front());
  copy.RemoveFileReferences(oid, false);
  copy.RemoveFileReferences(oid);
  copy.RemoveFolderReferences(0);
  if (copy.HasReference(oid, ref) && oid != 0) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  return vxfuzz::RoundTrip<CVXResultSet>(data, size, Inspect);
}
