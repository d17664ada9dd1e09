#include "VXNameMatch.h"

#include <unicode/uchar.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstring>

#include "xstring.h"

namespace VXNameMatch {
namespace {

bool IsDigitByte(unsigned char c) { return c >= '0' && c <= '9'; }

unsigned char UpperByte(unsigned char c) { return c >= 'a' && c <= 'z' ? c - 'a' + 'A' : c; }

// Cost of a differing position, by the digit state of both sides; the first position costs
// more than the rest.
double MismatchCost(bool first, bool digitA, bool digitB, double w) {
  if (digitA && digitB) return first ? w : 0.25 * w;
  if (digitA != digitB) return first ? 1.5 * w : 1.25 * w;
  return first ? 2 * w : w;
}

// Cost of the characters of `rest` from `p` on, which the other name lacks.
double TailCost(const std::string& rest, size_t p, double w, double letterFactor) {
  double r = 0;
  for (; p < rest.size(); ++p) {
    r += (IsDigitByte(rest[p]) ? w * 1.5 : letterFactor * w) * 0.01;
  }
  return r;
}

// The letters of `name` before its first ".", upper-cased.
std::string LettersBeforeDot(const char* name) {
  std::string letters;
  int32_t length = static_cast<int32_t>(std::strlen(name));
  for (int32_t i = 0; i < length;) {
    int32_t start = i;
    UChar32 c = 0;
    U8_NEXT(name, i, length, c);
    if (c == '.') break;
    if (c >= 0 && u_isalpha(c)) letters.append(name + start, name + i);
  }
  return _mbsupr(letters);
}

bool IsBlankOrComma(char c) {
  return c == '\t' || c == '\n' || c == '\r' || c == ' ' || c == ',' || c == ';';
}

}  // namespace

std::string CutExtension(const std::string& name) {
  size_t dot = name.rfind('.');
  return dot == std::string::npos ? name : name.substr(0, dot);
}

double SmartMatchFileName(const char* a, const char* b) {
  const std::string sa = CutExtension(a ? a : ""), sb = CutExtension(b ? b : "");
  const size_t length = std::max(sa.size(), sb.size());
  double w = 100.0, r = 0;
  for (size_t p = 0; p < length; ++p) {
    if (p >= sa.size()) return r + TailCost(sb, p, w, 2.0);
    if (p >= sb.size()) return r + TailCost(sa, p, w, 1.0);
    const auto ca = static_cast<unsigned char>(sa[p]), cb = static_cast<unsigned char>(sb[p]);
    if (UpperByte(ca) != UpperByte(cb)) {
      r += MismatchCost(p == 0, IsDigitByte(ca), IsDigitByte(cb), w) * 0.01;
    }
    w -= 0.1;
  }
  return r;
}

double LooseMatchFileName(const char* a, const char* b) {
  const std::string la = LettersBeforeDot(a ? a : ""), lb = LettersBeforeDot(b ? b : "");
  if (!la.empty() && !lb.empty() && lb.find(la) != std::string::npos) return 0;
  return SmartMatchFileName(a, b);
}

std::vector<std::string> SplitWords(const std::string& text) {
  std::vector<std::string> words;
  std::string word;
  bool quoted = false;
  for (size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == '"') {
      if (i + 1 < text.size() && text[i + 1] == '"') {
        word += '"';
        ++i;
      } else {
        quoted = !quoted;
      }
    } else if ((IsBlankOrComma(c) || c == '.') && !quoted) {
      // Runs of blanks end one word; a "." is a separator step of its own.
      while (i + 1 < text.size() && IsBlankOrComma(text[i + 1])) ++i;
      if (!word.empty()) words.push_back(std::move(word));
      word.clear();
    } else {
      word += c;
    }
  }
  if (!word.empty()) words.push_back(std::move(word));
  return words;
}

bool PatternMatchFileName(const char* pattern, const char* name, double& score) {
  score = 0;
  const std::vector<std::string> words = SplitWords(_mbsupr(pattern ? pattern : ""));
  const std::string subject = _mbsupr(CutExtension(name ? name : ""));
  const auto required =
      std::count_if(words.begin(), words.end(), [](const std::string& w) { return w[0] == '+'; });
  bool result = false;
  long hits = 0;
  for (const std::string& word : words) {
    const bool plus = word[0] == '+', minus = word[0] == '-';
    const std::string w = plus || minus ? word.substr(1) : word;
    if (subject.find(w) != std::string::npos) {
      if (minus) return false;
      result = true;
      if (plus) ++hits;
    } else if (minus) {
      result = true;
    }
  }
  if (!result || required > hits) return false;
  score = 100;
  return true;
}

}  // namespace VXNameMatch
