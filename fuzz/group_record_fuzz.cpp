// Arbitrary bytes as a category record: a code or a category, never a crash, a hang or a read
// past the buffer. A record that reads must write back to bytes that read the same.
#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "VXException.h"
#include "VXGroup.h"
#include "VXMemFile.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  CVXMemFile in(data, size);
  CVXGroup group;
  try {
    in >> group;
  } catch (CVXException* e) {
    delete e;
    return 0;
  }
  CVXMemFile out;
  out << group;
  out.Rewind();
  CVXGroup again;
  out >> again;
  if (again.Name() != group.Name() || again.Children() != group.Children() ||
      again.Postfix() != group.Postfix() || !(again.Images() == group.Images())) {
    std::abort();
  }
  return 0;
}
