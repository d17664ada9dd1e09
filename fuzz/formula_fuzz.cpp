// Arbitrary text as a category formula, through Parse and then ConvertToStack on one parser:
// a code, never a crash, a hang or a read past the buffer. A formula that converts has lost its
// parentheses and kept every operand and operator.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "VXGroupParser.h"
#include "VXResult.h"

namespace {

size_t Count(const std::vector<SToken>& tokens, uint32_t mask) {
  size_t n = 0;
  for (const SToken& t : tokens) n += (t.type & mask) != 0;
  return n;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  CVXGroupParser parser;
  std::vector<SToken> tokens;
  SError e = parser.Parse(text, tokens);
  if (e.code != VX_OK) return 0;
  if (e.position != static_cast<int32_t>(std::strlen(text.c_str()))) std::abort();
  std::vector<SToken> postfix = tokens;
  e = parser.ConvertToStack(postfix);
  if (e.code != VX_OK) {
    if (postfix != tokens) std::abort();
    return 0;
  }
  if (Count(postfix, ttOpen | ttClose) != 0) std::abort();
  const uint32_t kept = kTokenOperandMask | kTokenOperatorMask | ttSpace;
  if (Count(postfix, kept) != Count(tokens, kept)) std::abort();
  return 0;
}
