#pragma once

#include <cstdint>
#include <string>

#include "VXBase.h"

class CVXFile;

// Type codes of a property value; they are also the column types of a CVXTable and are stored.
//
// Dates and times are doubles. A date counts days since 1899-12-30 00:00, its fraction being the
// time of day, so two dates compare directly as numbers. A time is the fraction of a day alone
// (0.5 is 12:00:00). Both are read at whole-second resolution, rounded to the nearest second.
enum EVXPropertyType : unsigned {
  vptEmpty = 0,   // no value
  vptString = 1,  // UTF-8 text
  vptInt32 = 2,
  vptUInt32 = 3,
  vptInt64 = 4,
  vptFloat = 5,
  vptDouble = 6,
  vptDate = 7,  // days since 1899-12-30, fraction = time of day
  vptTime = 8,  // fraction of a day
  vptBool = 9,  // 0 false, 1 true; a stored bool keeps any other 32-bit value as it came
  vptUInt64 = 10,
  vptLongText = 11,   // UTF-8 text, like vptString, for values that are long by nature
  vptReference = 12,  // the OID (unsigned 32) of a record in another table
};

// One value of a column: a type code and a value of that type; type 0 is the empty value.
//
// Order (operator<, Compare): the empty value first, then by type code, then by value. Texts
// compare case-insensitively (xstring_comparenocase); numbers by value, with NaN after every
// number. operator== is the equivalence of that order, so "abc" == "ABC" and 0.0 == -0.0; it is
// what a sort needs, not a byte identity.
class CVXProperty : public CVXBase {
 public:
  CVXProperty() = default;
  CVXProperty(const std::string& text);  // vptString
  CVXProperty(const char* text);         // vptString; null gives ""
  CVXProperty(int32_t value);
  CVXProperty(uint32_t value);
  CVXProperty(int64_t value);
  CVXProperty(uint64_t value);
  CVXProperty(float value);
  CVXProperty(double value);
  CVXProperty(bool value);
  CVXProperty(const CVXProperty&) = default;
  CVXProperty(CVXProperty&&) noexcept = default;
  CVXProperty& operator=(const CVXProperty&) = default;
  CVXProperty& operator=(CVXProperty&&) noexcept = default;
  ~CVXProperty() override = default;

  // The types that share a C++ type with another.
  static CVXProperty MakeDate(double days);
  static CVXProperty MakeTime(double dayFraction);
  static CVXProperty MakeLongText(const std::string& text);
  static CVXProperty MakeReference(uint32_t oid);

  static bool IsValidType(unsigned type) { return type >= vptString && type <= vptReference; }

  unsigned Type() const { return type_; }
  bool IsEmpty() const { return type_ == vptEmpty; }
  bool IsText() const { return type_ == vptString || type_ == vptLongText; }

  // Text of the value; "" for the empty value. `format` may be null.
  // For a date or time it is strftime-like: %Y %y %m %d %e %j %H %I %M %S %p %a %A %b %h %B %F
  // %T %D %R %n %t %%, English names, independent of the locale; other conversions are copied
  // as they stand. Defaults "2024-05-01 13:45:00", "2024-05-01" at midnight, "13:45:00" for a
  // time; a date outside the years 1 to 9999 shows its number.
  // For the other types it is a printf format with at most one conversion (flags, width and
  // precision up to 3 digits), which receives the value converted to what it asks for (%d %u %x
  // the integer, %f %g the double, %s the default text); a format that could misread its
  // argument is ignored. Defaults: texts as they are, integers and bools in decimal, floating
  // point in the shortest form that reads back exactly.
  std::string String(const char* format = nullptr) const;
  // Numeric value: integers and bools as they are, dates and times their double, a text parsed
  // as a decimal number (0 if it is not one), the empty value 0.
  double Double() const;
  // Integer value: floating point truncated toward zero and clamped, a text through Double().
  int64_t Int64() const;
  uint64_t UInt64() const;  // negative values give 0
  // The text of vptString and vptLongText; empty for every other type.
  const std::string& Text() const { return text_; }

  // Compare the whole day (CompareDate) or the time of day (CompareTime) of this value's
  // Double() with `value`, read as a date: <0, 0, >0 as this lies before, on, or after it.
  int CompareDate(double value) const;
  int CompareTime(double value) const;

  // Parses `text` into a value of `type`: integers in decimal, float and double as decimal
  // numbers, bool as 1/0/true/false/yes/no (any case), a date as "YYYY-MM-DD[ HH:MM[:SS]]" or
  // EXIF's "YYYY:MM:DD HH:MM:SS", a time as "HH:MM[:SS]", a reference as an unsigned 32-bit
  // number, texts as they are. Blanks around a number, date or time are ignored. On failure,
  // or for a type code outside 1 to 12, the property becomes empty and the result is false.
  bool SetString(const std::string& text, unsigned type);

  // <0, 0, >0 in the order described above.
  int Compare(const CVXProperty& other) const;
  bool operator==(const CVXProperty& other) const { return Compare(other) == 0; }
  bool operator<(const CVXProperty& other) const { return Compare(other) < 0; }

 protected:
  void Clear();

 private:
  friend CVXFile& operator<<(CVXFile& file, const CVXProperty& property);
  friend CVXFile& operator>>(CVXFile& file, CVXProperty& property);

  // `p` with another type code of the same storage (double, text or 32-bit integer).
  static CVXProperty Retyped_(CVXProperty p, unsigned type);
  bool IsFloating_() const;
  bool ParseNumber_(const std::string& text, unsigned type);

  unsigned type_ = vptEmpty;
  std::string text_;
  // vptInt32, vptUInt32, vptInt64, vptBool, vptReference: Int; vptUInt64: UInt;
  // vptFloat, vptDouble, vptDate, vptTime: Real.
  union {
    int64_t Int;
    uint64_t UInt;
    double Real;
  } value_{};
};

// Stream form: u32 type code, then the value: a text as u32 byte count and bytes; int32,
// uint32, bool and reference 4 bytes; float 4 bytes; int64, uint64, double, date and time
// 8 bytes; the empty value nothing. Little-endian.
CVXFile& operator<<(CVXFile& file, const CVXProperty& property);
// Throws CVXException* (10020) on an unknown type code or a short input; `property` is then
// unchanged.
CVXFile& operator>>(CVXFile& file, CVXProperty& property);
