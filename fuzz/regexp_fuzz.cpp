// Pattern and text from the input: the first byte chooses case folding, the rest is the
// pattern, then a zero byte, then the text. Every answer must be one the interface allows.
#include <cstddef>
#include <cstdint>
#include <string>

#include "VXRegExp.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0 || size > 8192) return 0;
  const bool caseless = data[0] & 1;
  std::string rest(reinterpret_cast<const char*>(data + 1), size - 1);
  size_t split = rest.find('\0');
  std::string pattern = rest.substr(0, split);
  std::string text = split == std::string::npos ? pattern : rest.substr(split + 1);

  CVXRegExp re;
  std::string error;
  CVXRegExp::EResult set = re.SetPattern(pattern, &error, caseless);
  if (set == CVXRegExp::reError) {
    if (error.empty() || re.Match(text) != CVXRegExp::reNoPattern) __builtin_trap();
    return 0;
  }
  if (set != CVXRegExp::rePatternOK || re.GetPattern() != pattern) __builtin_trap();
  CVXRegExp::EResult found = re.Match(text);
  if (found != CVXRegExp::reMatch && found != CVXRegExp::reNoMatch) __builtin_trap();
  CVXRegExp copy(re);
  if (copy.Match(text) != found) __builtin_trap();
  return 0;
}
