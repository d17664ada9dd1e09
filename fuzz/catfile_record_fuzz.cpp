// Arbitrary bytes as a file record: a code or a file, never a crash or a read past the buffer.
// A record that reads must write back to bytes that read to the same record.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "VXCatFile.h"
#include "VXException.h"
#include "VXMemFile.h"

namespace {

std::vector<uint8_t> Bytes(const CVXCatFile& f) {
  CVXMemFile out;
  out << f;
  return {out.GetBuffer(), out.GetBuffer() + out.GetFileSize()};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  CVXMemFile in(data, size);
  CVXCatFile file;
  try {
    in >> file;
  } catch (CVXException* e) {
    delete e;
    return 0;
  }
  std::vector<uint8_t> written = Bytes(file);
  CVXMemFile again(written.data(), written.size());
  CVXCatFile reread;
  again >> reread;
  if (again.Remaining() != 0 || reread.Oid() != file.Oid() || reread.Name() != file.Name() ||
      Bytes(reread) != written) {
    std::abort();
  }
  return 0;
}
