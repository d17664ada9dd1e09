#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

// Text helpers of the full-text index. Internal; not installed.
//
// A character is one valid UTF-8 sequence, or one byte that does not start one (as in
// xstring.h), so every byte string has a defined length and cut.
namespace FTIText {

// True when text holds nothing but ASCII white space.
bool IsBlank(std::string_view text);
// Number of characters.
size_t CharCount(std::string_view text);
// Characters [start, start + len) of text; start < 0 counts as 0, len <= 0 means to the end,
// a start beyond the end gives "".
std::string SubString(std::string_view text, int32_t start, int32_t len);
// text between double quotes, its double quotes doubled: the literal form of a query pattern.
std::string Quote(std::string_view text);
// The inverse of Quote; none when text is not in that form.
std::optional<std::string> Unquote(std::string_view text);
// An FTS5 query requiring every blank-separated word of text as a word prefix: `"w1"* "w2"*`,
// double quotes doubled inside. "" when text holds no word.
std::string PrefixQuery(std::string_view text);
// The least string above every string that begins with prefix (byte-wise), for an index range;
// none when prefix is empty or all 0xFF bytes.
std::optional<std::string> PrefixEnd(std::string_view prefix);

}  // namespace FTIText
