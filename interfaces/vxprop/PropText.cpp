#include "PropText.h"

#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstring>

namespace vxprop {
namespace {

constexpr int64_t kSecondsPerDay = 86400;
// Days between 1899-12-30 and 1970-01-01, and between 0000-03-01 and 1970-01-01.
constexpr int64_t kUnixEpochDay = 25569;
constexpr int64_t kEraShift = 719468;
// Day numbers of 0001-01-01 and of 9999-12-31 + 1.
const int64_t kFirstDay = DayFromCivil(1, 1, 1);
const int64_t kEndDay = DayFromCivil(10000, 1, 1);

struct SCivil {
  int Year;
  unsigned Month, Day;
};

// Inverse of DayFromCivil: the era-based algorithm on 400-year cycles of 146097 days.
SCivil CivilFromDay(int64_t day) {
  int64_t z = day - kUnixEpochDay + kEraShift;
  int64_t era = (z >= 0 ? z : z - 146096) / 146097;
  unsigned doe = static_cast<unsigned>(z - era * 146097);
  unsigned yoe = (doe - doe / 1460 + doe / 36524 - doe / 146096) / 365;
  int64_t y = static_cast<int64_t>(yoe) + era * 400;
  unsigned doy = doe - (365 * yoe + yoe / 4 - yoe / 100);
  unsigned mp = (5 * doy + 2) / 153;
  unsigned d = doy - (153 * mp + 2) / 5 + 1;
  unsigned m = mp < 10 ? mp + 3 : mp - 9;
  return {static_cast<int>(y + (m <= 2)), m, d};
}

bool IsLeap(int year) { return (year % 4 == 0 && year % 100 != 0) || year % 400 == 0; }

unsigned DaysInMonth(int year, unsigned month) {
  static const unsigned kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  return month == 2 && IsLeap(year) ? 29 : kDays[month - 1];
}

// Reads exactly `count` digits at `pos`.
bool Digits(std::string_view text, size_t& pos, size_t count, unsigned& value) {
  if (pos + count > text.size()) return false;
  value = 0;
  for (size_t i = 0; i < count; ++i) {
    char c = text[pos + i];
    if (c < '0' || c > '9') return false;
    value = value * 10 + static_cast<unsigned>(c - '0');
  }
  pos += count;
  return true;
}

bool Expect(std::string_view text, size_t& pos, char c) {
  if (pos >= text.size() || text[pos] != c) return false;
  ++pos;
  return true;
}

// "H[H]:MM[:SS]" from `pos` to the end of `text`, as seconds of the day.
bool ParseClock(std::string_view text, size_t pos, int64_t& seconds) {
  unsigned h = 0, m = 0, s = 0;
  size_t hourDigits = (pos + 1 < text.size() && text[pos + 1] != ':') ? 2 : 1;
  if (!Digits(text, pos, hourDigits, h) || !Expect(text, pos, ':') || !Digits(text, pos, 2, m)) {
    return false;
  }
  if (pos < text.size() && (!Expect(text, pos, ':') || !Digits(text, pos, 2, s))) return false;
  if (pos != text.size() || h > 23 || m > 59 || s > 59) return false;
  seconds = h * 3600 + m * 60 + s;
  return true;
}

const char* const kMonths[] = {"January",   "February", "March",    "April",
                               "May",       "June",     "July",     "August",
                               "September", "October",  "November", "December"};
const char* const kWeekdays[] = {"Sunday",   "Monday", "Tuesday", "Wednesday",
                                 "Thursday", "Friday", "Saturday"};

void Append2(std::string& out, unsigned v, char pad = '0') {
  out += v < 10 ? pad : static_cast<char>('0' + v / 10);
  out += static_cast<char>('0' + v % 10);
}

void AppendNumber(std::string& out, long long v, int width) {
  char buf[32];
  std::snprintf(buf, sizeof buf, "%0*lld", width, v);
  out += buf;
}

struct SBroken {
  SCivil Date;
  int64_t Day;
  unsigned Hour, Minute, Second;
};

// One conversion character; false if it is not one we know.
bool AppendConversion(std::string& out, char c, const SBroken& t) {
  switch (c) {
    case 'Y':
      AppendNumber(out, t.Date.Year, 4);
      return true;
    case 'y':
      Append2(out, static_cast<unsigned>(t.Date.Year % 100));
      return true;
    case 'm':
      Append2(out, t.Date.Month);
      return true;
    case 'd':
      Append2(out, t.Date.Day);
      return true;
    case 'e':
      Append2(out, t.Date.Day, ' ');
      return true;
    case 'j':
      AppendNumber(out, t.Day - DayFromCivil(t.Date.Year, 1, 1) + 1, 3);
      return true;
    case 'H':
      Append2(out, t.Hour);
      return true;
    case 'I':
      Append2(out, t.Hour % 12 == 0 ? 12 : t.Hour % 12);
      return true;
    case 'M':
      Append2(out, t.Minute);
      return true;
    case 'S':
      Append2(out, t.Second);
      return true;
    case 'p':
      out += t.Hour < 12 ? "AM" : "PM";
      return true;
    case 'A':
    case 'a': {
      // 1899-12-30, day 0, was a Saturday.
      const char* name = kWeekdays[((t.Day % 7) + 7 + 6) % 7];
      out.append(name, c == 'A' ? std::strlen(name) : 3);
      return true;
    }
    case 'B':
    case 'b':
    case 'h': {
      const char* name = kMonths[t.Date.Month - 1];
      out.append(name, c == 'B' ? std::strlen(name) : 3);
      return true;
    }
    case 'n':
      out += '\n';
      return true;
    case 't':
      out += '\t';
      return true;
    case '%':
      out += '%';
      return true;
    default:
      return false;
  }
}

bool AppendComposite(std::string& out, char c, const SBroken& t) {
  const char* parts = nullptr;
  switch (c) {
    case 'F':
      parts = "Y-m-d";
      break;
    case 'T':
      parts = "H:M:S";
      break;
    case 'D':
      parts = "m/d/y";
      break;
    case 'R':
      parts = "H:M";
      break;
    default:
      return false;
  }
  for (const char* p = parts; *p; ++p) {
    if (!AppendConversion(out, *p, t)) out += *p;
  }
  return true;
}

std::string Render(const char* format, const SBroken& t) {
  std::string out;
  for (const char* p = format; *p; ++p) {
    if (*p != '%' || p[1] == '\0') {
      out += *p;
      continue;
    }
    ++p;
    if (!AppendConversion(out, *p, t) && !AppendComposite(out, *p, t)) {
      out += '%';
      out += *p;
    }
  }
  return out;
}

bool IsBlank(char c) {
  return c == ' ' || c == '\t' || c == '\r' || c == '\n' || c == '\v' || c == '\f' || c == '\0';
}

// Removes blanks and one leading "+" (not followed by a sign).
bool StripPlus(std::string_view& text) {
  text = TrimBlanks(text);
  if (!text.empty() && text[0] == '+') {
    text.remove_prefix(1);
    if (text.empty() || text[0] == '-' || text[0] == '+') return false;
  }
  return !text.empty();
}

template <typename T>
bool FromChars(std::string_view text, T& value) {
  auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
  return ec == std::errc() && end == text.data() + text.size();
}

template <typename... Args>
std::string Printf(const std::string& format, Args... args) {
  char buf[256];
  int n = std::snprintf(buf, sizeof buf, format.c_str(), args...);
  if (n < 0) return std::string();
  if (static_cast<size_t>(n) < sizeof buf) return std::string(buf, static_cast<size_t>(n));
  std::string out(static_cast<size_t>(n) + 1, '\0');
  std::snprintf(out.data(), out.size(), format.c_str(), args...);
  out.resize(static_cast<size_t>(n));
  return out;
}

// Reads up to three digits; false if there are more.
bool SkipDigits(const char*& p) {
  int n = 0;
  while (*p >= '0' && *p <= '9') {
    if (++n > 3) return false;
    ++p;
  }
  return true;
}

EFormatArg ArgOf(char c) {
  switch (c) {
    case 'd':
    case 'i':
      return EFormatArg::kSigned;
    case 'u':
    case 'o':
    case 'x':
    case 'X':
      return EFormatArg::kUnsigned;
    case 'f':
    case 'F':
    case 'e':
    case 'E':
    case 'g':
    case 'G':
    case 'a':
    case 'A':
      return EFormatArg::kFloating;
    case 's':
      return EFormatArg::kText;
    default:
      return EFormatArg::kInvalid;
  }
}

}  // namespace

int64_t DayFromCivil(int year, unsigned month, unsigned day) {
  int64_t y = static_cast<int64_t>(year) - (month <= 2);
  int64_t era = (y >= 0 ? y : y - 399) / 400;
  unsigned yoe = static_cast<unsigned>(y - era * 400);
  unsigned doy = (153 * (month > 2 ? month - 3 : month + 9) + 2) / 5 + day - 1;
  unsigned doe = yoe * 365 + yoe / 4 - yoe / 100 + doy;
  return era * 146097 + static_cast<int64_t>(doe) - kEraShift + kUnixEpochDay;
}

bool SplitDayTime(double value, SDayTime& out) {
  if (!std::isfinite(value) || value < static_cast<double>(kFirstDay) ||
      value >= static_cast<double>(kEndDay)) {
    return false;
  }
  int64_t total = std::llround(value * kSecondsPerDay);
  int64_t day = total / kSecondsPerDay;
  int64_t second = total % kSecondsPerDay;
  if (second < 0) {
    second += kSecondsPerDay;
    --day;
  }
  if (day >= kEndDay) return false;
  out.Day = day;
  out.Second = static_cast<int32_t>(second);
  return true;
}

bool ParseDate(std::string_view text, double& value) {
  text = TrimBlanks(text);
  size_t pos = 0;
  unsigned y = 0, m = 0, d = 0;
  if (!Digits(text, pos, 4, y) || pos >= text.size()) return false;
  char sep = text[pos];
  if (sep != '-' && sep != ':') return false;
  ++pos;
  if (!Digits(text, pos, 2, m) || !Expect(text, pos, sep) || !Digits(text, pos, 2, d)) return false;
  if (y < 1 || m < 1 || m > 12 || d < 1 || d > DaysInMonth(static_cast<int>(y), m)) return false;
  int64_t seconds = 0;
  if (sep == ':' && pos == text.size()) return false;  // EXIF dates always carry the time
  if (pos < text.size()) {
    // ISO dates may use "T" as the separator.
    if (text[pos] != ' ' && !(sep == '-' && text[pos] == 'T')) return false;
    if (!ParseClock(text, pos + 1, seconds)) return false;
  }
  value = static_cast<double>(DayFromCivil(static_cast<int>(y), m, d)) +
          static_cast<double>(seconds) / kSecondsPerDay;
  return true;
}

bool ParseTime(std::string_view text, double& value) {
  int64_t seconds = 0;
  if (!ParseClock(TrimBlanks(text), 0, seconds)) return false;
  value = static_cast<double>(seconds) / kSecondsPerDay;
  return true;
}

std::string FormatDateTime(double value, const char* format, bool isDate) {
  SDayTime split;
  if (!SplitDayTime(value, split)) return ShortestText(value);
  SBroken t{CivilFromDay(split.Day), split.Day, static_cast<unsigned>(split.Second / 3600),
            static_cast<unsigned>(split.Second / 60 % 60),
            static_cast<unsigned>(split.Second % 60)};
  if (!format) {
    format = !isDate ? "%H:%M:%S" : split.Second ? "%Y-%m-%d %H:%M:%S" : "%Y-%m-%d";
  }
  return Render(format, t);
}

std::string_view TrimBlanks(std::string_view text) {
  while (!text.empty() && IsBlank(text.front())) text.remove_prefix(1);
  while (!text.empty() && IsBlank(text.back())) text.remove_suffix(1);
  return text;
}

bool ParseSigned(std::string_view text, int64_t min, int64_t max, int64_t& value) {
  int64_t v = 0;
  if (!StripPlus(text) || !FromChars(text, v) || v < min || v > max) return false;
  value = v;
  return true;
}

bool ParseUnsigned(std::string_view text, uint64_t max, uint64_t& value) {
  uint64_t v = 0;
  if (!StripPlus(text) || text[0] == '-' || !FromChars(text, v) || v > max) return false;
  value = v;
  return true;
}

bool ParseDouble(std::string_view text, double& value) {
  double v = 0;
  if (!StripPlus(text) || !FromChars(text, v) || !std::isfinite(v)) return false;
  value = v;
  return true;
}

std::string ShortestText(double value) {
  char buf[64];
  auto [end, ec] = std::to_chars(buf, buf + sizeof buf, value);
  return ec == std::errc() ? std::string(buf, end) : std::string();
}

std::string ShortestText(float value) {
  char buf[64];
  auto [end, ec] = std::to_chars(buf, buf + sizeof buf, value);
  return ec == std::errc() ? std::string(buf, end) : std::string();
}

SPrintfFormat CheckPrintfFormat(const char* format) {
  SPrintfFormat result;
  if (!format || std::strlen(format) > 256) return result;
  std::string out;
  EFormatArg arg = EFormatArg::kNone;
  for (const char* p = format; *p; ++p) {
    out += *p;
    if (*p != '%') continue;
    if (p[1] == '%') {
      out += *++p;
      continue;
    }
    if (arg != EFormatArg::kNone) return result;
    const char* conversion = ++p;
    while (*p && std::strchr("-+ #0", *p)) ++p;
    if (!SkipDigits(p)) return result;
    if (*p == '.' && (++p, !SkipDigits(p))) return result;
    out.append(conversion, p);
    while (*p && std::strchr("hlLqjzt", *p)) ++p;
    arg = ArgOf(*p);
    if (arg == EFormatArg::kInvalid) return result;
    if (arg == EFormatArg::kSigned || arg == EFormatArg::kUnsigned) out += "ll";
    out += *p;
  }
  result.Arg = arg;
  result.Format = std::move(out);
  return result;
}

std::string FormatSigned(const SPrintfFormat& format, int64_t value) {
  return Printf(format.Format, static_cast<long long>(value));
}

std::string FormatUnsigned(const SPrintfFormat& format, uint64_t value) {
  return Printf(format.Format, static_cast<unsigned long long>(value));
}

std::string FormatFloating(const SPrintfFormat& format, double value) {
  return Printf(format.Format, value);
}

std::string FormatText(const SPrintfFormat& format, const std::string& value) {
  return Printf(format.Format, value.c_str());
}

}  // namespace vxprop
