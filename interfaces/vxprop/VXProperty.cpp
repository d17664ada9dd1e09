#include "VXProperty.h"

#include <cmath>
#include <limits>

#include "PropText.h"
#include "VXException.h"
#include "VXFile.h"
#include "VXResult.h"
#include "xstring.h"

using namespace vxprop;

namespace {

template <typename T>
int Sign(T a, T b) {
  return a < b ? -1 : (b < a ? 1 : 0);
}

// A total order on doubles: NaN after every number and equal to itself; -0 equals 0.
int CompareReal(double a, double b) {
  bool na = std::isnan(a), nb = std::isnan(b);
  if (na || nb) return na == nb ? 0 : (na ? 1 : -1);
  return Sign(a, b);
}

int64_t ClampToInt64(double v) {
  if (std::isnan(v)) return 0;
  if (v <= -9223372036854775808.0) return std::numeric_limits<int64_t>::min();
  if (v >= 9223372036854775808.0) return std::numeric_limits<int64_t>::max();
  return static_cast<int64_t>(v);
}

uint64_t ClampToUInt64(double v) {
  if (std::isnan(v) || v <= 0) return 0;
  if (v >= 18446744073709551616.0) return std::numeric_limits<uint64_t>::max();
  return static_cast<uint64_t>(v);
}

bool ParseBool(std::string_view text, int64_t& value) {
  text = TrimBlanks(text);
  std::string lower(text);
  for (char& c : lower) {
    if (c >= 'A' && c <= 'Z') c = static_cast<char>(c - 'A' + 'a');
  }
  if (lower == "1" || lower == "true" || lower == "yes") {
    value = 1;
  } else if (lower == "0" || lower == "false" || lower == "no") {
    value = 0;
  } else {
    return false;
  }
  return true;
}

// The date part (Day) or the time-of-day part (Second) of two date values.
int CompareDayTime(double a, double b, bool day) {
  SDayTime sa, sb;
  if (SplitDayTime(a, sa) && SplitDayTime(b, sb)) {
    return day ? Sign(sa.Day, sb.Day) : Sign(sa.Second, sb.Second);
  }
  // Outside the calendar: the same split on the raw numbers, without rounding to seconds.
  return day ? CompareReal(std::floor(a), std::floor(b))
             : CompareReal(a - std::floor(a), b - std::floor(b));
}

}  // namespace

CVXProperty::CVXProperty(const std::string& text) : type_(vptString), text_(text) {}
CVXProperty::CVXProperty(const char* text) : type_(vptString), text_(text ? text : "") {}
CVXProperty::CVXProperty(int32_t value) : type_(vptInt32) { value_.Int = value; }
CVXProperty::CVXProperty(uint32_t value) : type_(vptUInt32) { value_.Int = value; }
CVXProperty::CVXProperty(int64_t value) : type_(vptInt64) { value_.Int = value; }
CVXProperty::CVXProperty(uint64_t value) : type_(vptUInt64) { value_.UInt = value; }
CVXProperty::CVXProperty(float value) : type_(vptFloat) { value_.Real = value; }
CVXProperty::CVXProperty(double value) : type_(vptDouble) { value_.Real = value; }
CVXProperty::CVXProperty(bool value) : type_(vptBool) { value_.Int = value ? 1 : 0; }

CVXProperty CVXProperty::Retyped_(CVXProperty p, unsigned type) {
  p.type_ = type;
  return p;
}

CVXProperty CVXProperty::MakeDate(double days) { return Retyped_(CVXProperty(days), vptDate); }

CVXProperty CVXProperty::MakeTime(double dayFraction) {
  return Retyped_(CVXProperty(dayFraction), vptTime);
}

CVXProperty CVXProperty::MakeLongText(const std::string& text) {
  return Retyped_(CVXProperty(text), vptLongText);
}

CVXProperty CVXProperty::MakeReference(uint32_t oid) {
  return Retyped_(CVXProperty(oid), vptReference);
}

void CVXProperty::Clear() {
  type_ = vptEmpty;
  text_.clear();
  value_.Int = 0;
}

bool CVXProperty::IsFloating_() const {
  return type_ == vptFloat || type_ == vptDouble || type_ == vptDate || type_ == vptTime;
}

std::string CVXProperty::String(const char* format) const {
  if (type_ == vptEmpty) return std::string();
  if (type_ == vptDate || type_ == vptTime) {
    return FormatDateTime(value_.Real, format, type_ == vptDate);
  }
  std::string text;
  if (IsText()) {
    text = text_;
  } else if (type_ == vptFloat) {
    text = ShortestText(static_cast<float>(value_.Real));
  } else if (type_ == vptDouble) {
    text = ShortestText(value_.Real);
  } else if (type_ == vptUInt64) {
    text = std::to_string(value_.UInt);
  } else {
    text = std::to_string(value_.Int);
  }
  SPrintfFormat checked = CheckPrintfFormat(format);
  switch (checked.Arg) {
    case EFormatArg::kSigned:
      return FormatSigned(checked, Int64());
    case EFormatArg::kUnsigned:
      return FormatUnsigned(checked, UInt64());
    case EFormatArg::kFloating:
      return FormatFloating(checked, Double());
    case EFormatArg::kNone:
    case EFormatArg::kText:
      return FormatText(checked, text);
    default:
      return text;
  }
}

double CVXProperty::Double() const {
  if (IsFloating_()) return value_.Real;
  if (type_ == vptUInt64) return static_cast<double>(value_.UInt);
  if (IsText()) {
    double v = 0;
    return ParseDouble(text_, v) ? v : 0;
  }
  return static_cast<double>(value_.Int);  // 0 when empty
}

int64_t CVXProperty::Int64() const {
  if (IsFloating_() || IsText()) return ClampToInt64(Double());
  if (type_ == vptUInt64) {
    return value_.UInt > static_cast<uint64_t>(std::numeric_limits<int64_t>::max())
               ? std::numeric_limits<int64_t>::max()
               : static_cast<int64_t>(value_.UInt);
  }
  return value_.Int;
}

uint64_t CVXProperty::UInt64() const {
  if (IsFloating_() || IsText()) return ClampToUInt64(Double());
  if (type_ == vptUInt64) return value_.UInt;
  return value_.Int < 0 ? 0 : static_cast<uint64_t>(value_.Int);
}

int CVXProperty::CompareDate(double value) const { return CompareDayTime(Double(), value, true); }

int CVXProperty::CompareTime(double value) const { return CompareDayTime(Double(), value, false); }

bool CVXProperty::ParseNumber_(const std::string& text, unsigned type) {
  int64_t i = 0;
  uint64_t u = 0;
  double d = 0;
  switch (type) {
    case vptInt32:
      return ParseSigned(text, INT32_MIN, INT32_MAX, i) && (value_.Int = i, true);
    case vptInt64:
      return ParseSigned(text, INT64_MIN, INT64_MAX, i) && (value_.Int = i, true);
    case vptUInt32:
    case vptReference:
      return ParseUnsigned(text, UINT32_MAX, u) && (value_.Int = static_cast<int64_t>(u), true);
    case vptUInt64:
      return ParseUnsigned(text, UINT64_MAX, u) && (value_.UInt = u, true);
    case vptBool:
      return ParseBool(text, value_.Int);
    case vptDouble:
      return ParseDouble(text, value_.Real);
    case vptFloat:
      if (!ParseDouble(text, d) || std::fabs(d) > std::numeric_limits<float>::max()) return false;
      value_.Real = static_cast<float>(d);
      return true;
    case vptDate:
      return ParseDate(text, value_.Real);
    case vptTime:
      return ParseTime(text, value_.Real);
    default:
      return false;
  }
}

bool CVXProperty::SetString(const std::string& text, unsigned type) {
  Clear();
  if (type == vptString || type == vptLongText) {
    text_ = text;
  } else if (!ParseNumber_(text, type)) {
    Clear();
    return false;
  }
  type_ = type;
  return true;
}

int CVXProperty::Compare(const CVXProperty& other) const {
  if (type_ != other.type_) return Sign(type_, other.type_);
  if (IsText()) {
    int c = xstring_comparenocase(text_, other.text_);
    return c < 0 ? -1 : (c > 0 ? 1 : 0);
  }
  if (IsFloating_()) return CompareReal(value_.Real, other.value_.Real);
  if (type_ == vptUInt64) return Sign(value_.UInt, other.value_.UInt);
  return Sign(value_.Int, other.value_.Int);  // 0 for two empty values
}

CVXFile& operator<<(CVXFile& file, const CVXProperty& p) {
  file << static_cast<uint32_t>(p.type_);
  switch (p.type_) {
    case vptString:
    case vptLongText:
      return file << p.text_;
    case vptInt32:
      return file << static_cast<int32_t>(p.value_.Int);
    case vptUInt32:
    case vptBool:
    case vptReference:
      return file << static_cast<uint32_t>(p.value_.Int);
    case vptInt64:
      return file << p.value_.Int;
    case vptUInt64:
      return file << p.value_.UInt;
    case vptFloat:
      return file << static_cast<float>(p.value_.Real);
    case vptDouble:
    case vptDate:
    case vptTime:
      return file << p.value_.Real;
    default:
      return file;
  }
}

CVXFile& operator>>(CVXFile& file, CVXProperty& property) {
  uint32_t type = 0;
  file >> type;
  if (type != vptEmpty && !CVXProperty::IsValidType(type)) VX_THROW(VX_NOT_FOUND);
  CVXProperty p;
  p.type_ = type;
  int32_t i32 = 0;
  uint32_t u32 = 0;
  float f = 0;
  switch (type) {
    case vptString:
    case vptLongText:
      file >> p.text_;
      break;
    case vptInt32:
      file >> i32, p.value_.Int = i32;
      break;
    case vptUInt32:
    case vptBool:
    case vptReference:
      file >> u32, p.value_.Int = u32;
      break;
    case vptInt64:
      file >> p.value_.Int;
      break;
    case vptUInt64:
      file >> p.value_.UInt;
      break;
    case vptFloat:
      file >> f, p.value_.Real = f;
      break;
    case vptDouble:
    case vptDate:
    case vptTime:
      file >> p.value_.Real;
      break;
    default:
      break;
  }
  property = std::move(p);
  return file;
}
