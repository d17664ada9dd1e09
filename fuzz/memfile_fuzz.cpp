// Arbitrary bytes as the content of a memory file, read back by a sequence of typed reads that
// the input also chooses. Every failure must be a CVXException*, never a crash or a read
// outside the buffer.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include "VXException.h"
#include "VXMemFile.h"
#include "bitvector.h"

namespace {

struct Ops {
  const uint8_t* p;
  size_t n;
  bool Next(uint8_t& op) {
    if (n == 0) return false;
    op = *p++;
    --n;
    return true;
  }
};

void Check(bool ok) {
  if (!ok) std::abort();
}

// A bit set read from `count` bytes must write back as the same bytes when the count is a
// whole number of 32-bit words.
void CheckBitVector(const CVXMemFile& file, uint64_t start, const CBitVector& bits) {
  uint32_t count = 0;
  std::memcpy(&count, file.GetBuffer() + start, 4);
  Check(bits.Size() == std::min<uint64_t>(uint64_t{count} * 8, CBitVector::npos - 1));
  if (count % 4 != 0) return;
  CVXMemFile out;
  out << bits;
  Check(out.GetFileSize() == 4 + uint64_t{count});
  Check(std::memcmp(out.GetBuffer(), file.GetBuffer() + start, out.GetFileSize()) == 0);
}

void ReadSome(CVXMemFile& file, Ops& ops, int depth);

void ReadOne(CVXMemFile& file, uint8_t op, Ops& ops, int depth) {
  uint64_t start = file.GetPosition();
  switch (op % 10) {
    case 0: {
      uint8_t v;
      file >> v;
      break;
    }
    case 1: {
      uint16_t v;
      file >> v;
      break;
    }
    case 2: {
      uint32_t v;
      file >> v;
      break;
    }
    case 3: {
      uint64_t v;
      file >> v;
      break;
    }
    case 4: {
      double v;
      file >> v;
      break;
    }
    case 5: {
      std::string s;
      file >> s;
      Check(file.GetPosition() == start + 4 + s.size());
      break;
    }
    case 6: {
      CBitVector bits;
      file >> bits;
      CheckBitVector(file, start, bits);
      break;
    }
    case 7: {
      CVXMemFile inner;
      file >> inner;
      Check(file.GetPosition() == start + 4 + inner.GetFileSize());
      if (depth < 4) ReadSome(inner, ops, depth + 1);
      break;
    }
    case 8:
      file.Seek(op / 10 * file.GetFileSize() / 25);
      break;
    default:
      if (op & 0x80) {
        file.BeginCheckSum();
      } else {
        file.EndCheckSum();
      }
      break;
  }
  Check(file.GetPosition() <= file.GetFileSize());
}

void ReadSome(CVXMemFile& file, Ops& ops, int depth) {
  uint8_t op = 0;
  // An op of 0xFF ends a nested file and returns to its parent.
  while (ops.Next(op) && op != 0xFF) {
    uint64_t before = file.GetPosition();
    try {
      ReadOne(file, op, ops, depth);
    } catch (CVXException* e) {
      delete e;
      Check(file.GetPosition() >= before || op % 10 == 8);
    }
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  // The first byte says how many of the following bytes drive the reads; the rest is content.
  size_t nops = std::min<size_t>(data[0], size - 1);
  Ops ops{data + 1, nops};
  CVXMemFile file(data + 1 + nops, size - 1 - nops);
  ReadSome(file, ops, 0);
  return 0;
}
