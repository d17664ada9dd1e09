#include "xstring.h"

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <climits>
#include <cstring>

namespace {

constexpr const char* kBlanks = " \t\n\v\f\r";
// Key of a stray byte: above every code point, ordered like the byte.
constexpr int32_t kStrayBase = 0x110000;

bool IsBlank(char c) { return c != '\0' && std::strchr(kBlanks, c) != nullptr; }

// Decodes the character at p, of which `avail` > 0 bytes may be read. Returns its length in
// bytes; cp is its code point, or -1 for a stray byte.
size_t Decode(const char* p, size_t avail, UChar32& cp) {
  auto* s = reinterpret_cast<const uint8_t*>(p);
  if (s[0] < 0x80) {
    cp = s[0];
    return 1;
  }
  int32_t i = 0;
  UChar32 c = 0;
  U8_NEXT(s, i, static_cast<int32_t>(std::min<size_t>(avail, 4)), c);
  if (c < 0) {
    cp = -1;
    return 1;
  }
  cp = c;
  return static_cast<size_t>(i);
}

// Case-folded key of the character at p; advances p. ASCII is folded without ICU.
int32_t NextFoldedKey(const char*& p, const char* end) {
  auto b = static_cast<unsigned char>(*p);
  if (b < 0x80) {
    ++p;
    return b >= 'A' && b <= 'Z' ? b + ('a' - 'A') : b;
  }
  UChar32 cp = 0;
  p += Decode(p, static_cast<size_t>(end - p), cp);
  return cp < 0 ? kStrayBase + b : u_foldCase(cp, U_FOLD_CASE_DEFAULT);
}

int CompareFolded(const char* a, size_t alen, const char* b, size_t blen, size_t maxChars) {
  const char* aend = a + alen;
  const char* bend = b + blen;
  for (size_t n = 0; n < maxChars; ++n) {
    if (a == aend || b == bend) return (a != aend) - (b != bend);
    int32_t ka = NextFoldedKey(a, aend);
    int32_t kb = NextFoldedKey(b, bend);
    if (ka != kb) return ka < kb ? -1 : 1;
  }
  return 0;
}

const char* OrEmpty(const char* s) { return s ? s : ""; }

// Length of the character at p in a NUL-terminated text (p[0] != 0).
size_t CharLength(const char* p) {
  UChar32 cp = 0;
  return Decode(p, strnlen(p, 4), cp);
}

// Whether the character [p, p + len) is one of the characters of delims.
bool IsDelimiter(const char* p, size_t len, const char* delims) {
  for (const char* d = delims; *d;) {
    size_t dlen = CharLength(d);
    if (dlen == len && std::memcmp(p, d, len) == 0) return true;
    d += dlen;
  }
  return false;
}

}  // namespace

namespace KTUnicode {

int32_t StringToLong(const std::string& text) {
  size_t i = 0;
  while (i < text.size() && IsBlank(text[i])) ++i;
  bool negative = false;
  if (i < text.size() && (text[i] == '+' || text[i] == '-')) negative = text[i++] == '-';
  // Accumulate towards the sign so that INT32_MIN itself is reachable.
  int64_t value = 0;
  for (; i < text.size() && text[i] >= '0' && text[i] <= '9'; ++i) {
    value = value * 10 + (text[i] - '0');
    if (value > int64_t{INT32_MAX} + 1) break;
  }
  if (negative) return static_cast<int32_t>(std::max<int64_t>(-value, INT32_MIN));
  return static_cast<int32_t>(std::min<int64_t>(value, INT32_MAX));
}

}  // namespace KTUnicode

void Trim(std::string& text, XStringTrim where) {
  if (where & xstRight) {
    size_t end = text.find_last_not_of(kBlanks);
    text.erase(end == std::string::npos ? 0 : end + 1);
  }
  if (where & xstLeft) text.erase(0, text.find_first_not_of(kBlanks));
}

int xstring_comparenocase(const std::string& a, const std::string& b) {
  return CompareFolded(a.data(), a.size(), b.data(), b.size(), SIZE_MAX);
}

std::string xstring_foldkey(const std::string& text) {
  std::string key;
  key.reserve(text.size() * 4);
  const char* p = text.data();
  const char* end = p + text.size();
  while (p != end) {
    int32_t k = NextFoldedKey(p, end);
    key.append(reinterpret_cast<const char*>(&k), sizeof k);
  }
  return key;
}

int _mbsicmp(const char* a, const char* b) {
  a = OrEmpty(a);
  b = OrEmpty(b);
  return CompareFolded(a, std::strlen(a), b, std::strlen(b), SIZE_MAX);
}

int _mbsnicmp(const char* a, const char* b, size_t n) {
  a = OrEmpty(a);
  b = OrEmpty(b);
  return CompareFolded(a, std::strlen(a), b, std::strlen(b), n);
}

char* _mbstok(char* text, const char* delims) {
  thread_local char* next = nullptr;
  delims = OrEmpty(delims);
  if (text) next = text;
  if (!next) return nullptr;
  char* p = next;
  while (*p && IsDelimiter(p, CharLength(p), delims)) p += CharLength(p);
  if (!*p) {
    next = nullptr;
    return nullptr;
  }
  char* token = p;
  size_t len = 0;
  while (*p && !IsDelimiter(p, len = CharLength(p), delims)) p += len;
  if (*p) {
    *p = '\0';
    next = p + len;
  } else {
    next = nullptr;
  }
  return token;
}

bool _ismbcalnum(unsigned int cp) {
  return cp <= UCHAR_MAX_VALUE && u_isalnum(static_cast<UChar32>(cp));
}

bool _ismbcdigit(unsigned int cp) {
  return cp <= UCHAR_MAX_VALUE && u_isdigit(static_cast<UChar32>(cp));
}

std::string _mbsupr(const std::string& text) {
  std::string out;
  out.reserve(text.size());
  for (size_t i = 0; i < text.size();) {
    UChar32 cp = 0;
    size_t len = Decode(text.data() + i, text.size() - i, cp);
    if (cp < 0) {
      out += text[i];
    } else {
      char buf[U8_MAX_LENGTH];
      int32_t n = 0;
      // u_toupper gives a valid code point, which takes at most U8_MAX_LENGTH bytes.
      U8_APPEND_UNSAFE(reinterpret_cast<uint8_t*>(buf), n, u_toupper(cp));
      out.append(buf, static_cast<size_t>(n));
    }
    i += len;
  }
  return out;
}
