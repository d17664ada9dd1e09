// Arbitrary bytes as a folder record: a code or a folder, never a crash, a huge allocation or a
// read past the buffer. A record that reads must write back to bytes that read to the same
// record.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "VXException.h"
#include "VXFolder.h"
#include "VXMemFile.h"

namespace {

std::vector<uint8_t> Bytes(const CVXFolder& f) {
  CVXMemFile out;
  out << f;
  return {out.GetBuffer(), out.GetBuffer() + out.GetFileSize()};
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  CVXMemFile in(data, size);
  CVXFolder folder;
  try {
    in >> folder;
  } catch (CVXException* e) {
    delete e;
    return 0;
  }
  // What the host sees of a read record must not fail either.
  folder.FriendlyName();
  folder.MediaSerialWindows();
  std::vector<uint8_t> written = Bytes(folder);
  CVXMemFile again(written.data(), written.size());
  CVXFolder reread;
  again >> reread;
  if (again.Remaining() != 0 || reread.Oid() != folder.Oid() ||
      reread.Children() != folder.Children() || reread.Files() != folder.Files() ||
      reread.URI().AsString() != folder.URI().AsString() || Bytes(reread) != written) {
    std::abort();
  }
  return 0;
}
