#include "FTIText.h"

namespace FTIText {
namespace {

bool IsTail(std::string_view s, size_t i, unsigned char lo = 0x80, unsigned char hi = 0xBF) {
  if (i >= s.size()) return false;
  auto c = static_cast<unsigned char>(s[i]);
  return c >= lo && c <= hi;
}

// Bytes of the character at i (i < s.size()): a whole valid sequence, else 1.
size_t CharBytes(std::string_view s, size_t i) {
  auto c = static_cast<unsigned char>(s[i]);
  if (c < 0xC2 || c > 0xF4) return 1;  // ASCII, a stray tail byte, or never a lead byte
  if (c < 0xE0) return IsTail(s, i + 1) ? 2 : 1;
  // The second byte's range excludes overlong forms and surrogates.
  unsigned char lo = c == 0xE0 ? 0xA0 : c == 0xF0 ? 0x90 : 0x80;
  unsigned char hi = c == 0xED ? 0x9F : c == 0xF4 ? 0x8F : 0xBF;
  size_t n = c < 0xF0 ? 3 : 4;
  if (!IsTail(s, i + 1, lo, hi)) return 1;
  for (size_t k = 2; k < n; ++k) {
    if (!IsTail(s, i + k)) return 1;
  }
  return n;
}

// Byte offset after skipping `count` characters from `from`, stopping at the end.
size_t Skip(std::string_view s, size_t from, int64_t count) {
  while (count-- > 0 && from < s.size()) from += CharBytes(s, from);
  return from;
}

bool IsSpace(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\f' || c == '\v';
}

}  // namespace

bool IsBlank(std::string_view text) {
  for (char c : text) {
    if (!IsSpace(c)) return false;
  }
  return true;
}

size_t CharCount(std::string_view text) {
  size_t n = 0;
  for (size_t i = 0; i < text.size(); i += CharBytes(text, i)) ++n;
  return n;
}

std::string SubString(std::string_view text, int32_t start, int32_t len) {
  size_t begin = Skip(text, 0, start < 0 ? 0 : start);
  size_t end = len <= 0 ? text.size() : Skip(text, begin, len);
  return std::string(text.substr(begin, end - begin));
}

std::string Quote(std::string_view text) {
  std::string quoted = "\"";
  for (char c : text) {
    if (c == '"') quoted += '"';
    quoted += c;
  }
  return quoted + '"';
}

std::optional<std::string> Unquote(std::string_view text) {
  if (text.size() < 2 || text.front() != '"' || text.back() != '"') return std::nullopt;
  std::string plain;
  for (size_t i = 1; i + 1 < text.size(); ++i) {
    if (text[i] == '"') {
      // Inside, quotes come in pairs; the closing quote cannot complete one.
      if (i + 2 >= text.size() || text[i + 1] != '"') return std::nullopt;
      ++i;
    }
    plain += text[i];
  }
  return plain;
}

std::string PrefixQuery(std::string_view text) {
  std::string query;
  size_t i = 0;
  while (i < text.size()) {
    if (IsSpace(text[i])) {
      ++i;
      continue;
    }
    size_t end = i;
    while (end < text.size() && !IsSpace(text[end])) ++end;
    query += (query.empty() ? "" : " ") + Quote(text.substr(i, end - i)) + "*";
    i = end;
  }
  return query;
}

std::optional<std::string> PrefixEnd(std::string_view prefix) {
  std::string end(prefix);
  while (!end.empty() && static_cast<unsigned char>(end.back()) == 0xFF) end.pop_back();
  if (end.empty()) return std::nullopt;
  end.back() = static_cast<char>(static_cast<unsigned char>(end.back()) + 1);
  return end;
}

}  // namespace FTIText
