#pragma once

#include <cstdint>
#include <string>
#include <string_view>

// Text conversions behind CVXProperty: number parsing, checked printf formats, and the calendar
// of date and time values. Internal to vxprop; not installed.
//
// A date value is a double counting days since 1899-12-30 00:00, its fraction the time of day;
// a time value is the fraction of a day alone. Both are read at whole-second resolution
// (rounded to the nearest second), the same way for splitting, comparing and formatting, so
// 23:59:59.7 is midnight of the next day everywhere.
namespace vxprop {

// Day number and second of day of a date or time value. The calendar covers the years 1 to
// 9999; SplitDayTime is false outside it or for a value that is not finite.
struct SDayTime {
  int64_t Day = 0;
  int32_t Second = 0;
};
bool SplitDayTime(double value, SDayTime& out);

// Day number (relative to 1899-12-30) of a proleptic Gregorian date; no range check.
int64_t DayFromCivil(int year, unsigned month, unsigned day);

// Date text: "YYYY-MM-DD", optionally followed by " " or "T" and "HH:MM[:SS]"; and
// "YYYY:MM:DD HH:MM:SS" as EXIF writes it. Every field is range checked (year 1 to 9999).
bool ParseDate(std::string_view text, double& value);
// Time text "H[H]:MM[:SS]" as a fraction of a day.
bool ParseTime(std::string_view text, double& value);

// Formats a date or time value with a strftime-like format (null: "%Y-%m-%d %H:%M:%S" for a
// date, "%Y-%m-%d" when it lies at midnight, "%H:%M:%S" for a time). Known conversions:
// %Y %y %m %d %e %j %H %I %M %S %p %a %A %b %h %B %F %T %D %R %n %t %%, with English names and
// no dependence on the locale; any other conversion is copied as it stands. A value outside the
// calendar gives its number.
std::string FormatDateTime(double value, const char* format, bool isDate);

// Whole-text decimal parsers (ASCII blanks around the number are ignored, a leading "+" is
// allowed). Integers take no fraction or exponent; unsigned ones take no "-". ParseDouble is
// locale independent and refuses infinity and NaN.
bool ParseSigned(std::string_view text, int64_t min, int64_t max, int64_t& value);
bool ParseUnsigned(std::string_view text, uint64_t max, uint64_t& value);
bool ParseDouble(std::string_view text, double& value);
std::string_view TrimBlanks(std::string_view text);

// The shortest text that reads back as the same value.
std::string ShortestText(double value);
std::string ShortestText(float value);

// What a printf format, as a host may pass it, wants as its argument. Accepted: literal text,
// "%%", and at most one conversion of flags "-+ #0", a width and a precision of up to three
// digits each, any length modifier (replaced by the right one), and one of d i u o x X f F e E
// g G a A s. Anything else ("*", "%n", "%c", a second conversion, over 256 bytes) is kInvalid,
// so a host's format can never read an argument that is not there.
enum class EFormatArg { kNone, kSigned, kUnsigned, kFloating, kText, kInvalid };
struct SPrintfFormat {
  EFormatArg Arg = EFormatArg::kInvalid;
  std::string Format;  // the format rewritten for int64/uint64/double/char* arguments
};
SPrintfFormat CheckPrintfFormat(const char* format);

// Applies a checked format to one argument of the kind it wants.
std::string FormatSigned(const SPrintfFormat& format, int64_t value);
std::string FormatUnsigned(const SPrintfFormat& format, uint64_t value);
std::string FormatFloating(const SPrintfFormat& format, double value);
std::string FormatText(const SPrintfFormat& format, const std::string& value);

}  // namespace vxprop
