#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

// Text helpers on UTF-8, the library's multi-byte text. A "character" is one valid UTF-8
// sequence, or one byte that does not start one; such stray bytes compare and split as bytes,
// so no input is rejected. Null pointers are read as empty text.

namespace KTUnicode {
// Decimal text to a signed 32-bit value: leading blanks, an optional sign, then digits up to the
// first non-digit. 0 when there are no digits; values beyond the range saturate.
int32_t StringToLong(const std::string& text);
}  // namespace KTUnicode

enum XStringTrim { xstLeft = 1, xstRight = 2, xstBoth = 3 };
// Removes ASCII white space from the chosen ends, in place.
void Trim(std::string& text, XStringTrim where = xstBoth);

// Case-insensitive comparisons by Unicode simple case folding: 0 when equal, otherwise the sign
// orders a before or after b (by folded code point; a stray byte orders after every character).
int xstring_comparenocase(const std::string& a, const std::string& b);
// A key for hashing and equality under the same folding: two texts give equal keys exactly when
// xstring_comparenocase finds them equal. Not an order, and not text.
std::string xstring_foldkey(const std::string& text);
int _mbsicmp(const char* a, const char* b);
// Compares at most n characters.
int _mbsnicmp(const char* a, const char* b, size_t n);

// strtok over characters: splits `text` in place at any character of `delims`. Pass the text on
// the first call and null to continue; the state is per thread.
char* _mbstok(char* text, const char* delims);

// Unicode classes of a code point.
bool _ismbcalnum(unsigned int cp);
bool _ismbcdigit(unsigned int cp);

// Unicode simple upper case of every character; stray bytes are kept. The result may differ in
// byte length from the input, which is why there is no in-place form.
std::string _mbsupr(const std::string& text);
