#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <tuple>
#include <vector>

#include "VXException.h"
#include "VXMemFile.h"
#include "VXProperty.h"
#include "VXResult.h"

namespace {

std::vector<uint8_t> Bytes(const CVXProperty& p) {
  CVXMemFile mem;
  mem << p;
  return std::vector<uint8_t>(mem.GetBuffer(), mem.GetBuffer() + mem.GetFileSize());
}

// Reads one property; the code of the exception, or 10001.
unsigned Read(const std::vector<uint8_t>& bytes, CVXProperty& p) {
  CVXMemFile mem(bytes.data(), bytes.size());
  try {
    mem >> p;
  } catch (CVXException* e) {
    unsigned code = e->GetCode();
    delete e;
    return code;
  }
  return mem.Remaining() == 0 ? VX_OK : VX_NEUTRAL_FAILURE;
}

CVXProperty Parsed(const std::string& text, unsigned type) {
  CVXProperty p;
  EXPECT_TRUE(p.SetString(text, type)) << text;
  return p;
}

std::vector<CVXProperty> OneOfEachType() {
  return {CVXProperty(),
          CVXProperty("Grüße"),
          CVXProperty(int32_t{-7}),
          CVXProperty(uint32_t{4000000000u}),
          CVXProperty(int64_t{-5000000000}),
          CVXProperty(1.25f),
          CVXProperty(-0.1),
          CVXProperty::MakeDate(45413.5),
          CVXProperty::MakeTime(0.75),
          CVXProperty(true),
          CVXProperty(uint64_t{18446744073709551615u}),
          CVXProperty::MakeLongText(std::string(70000, 'x')),
          CVXProperty::MakeReference(15)};
}

TEST(PropertyTest, EveryTypeRoundTripsThroughAStream) {
  std::vector<CVXProperty> all = OneOfEachType();
  for (unsigned type = 0; type < all.size(); ++type) {
    const CVXProperty& p = all[type];
    EXPECT_EQ(p.Type(), type);
    CVXProperty back;
    ASSERT_EQ(Read(Bytes(p), back), VX_OK) << type;
    EXPECT_EQ(back.Type(), type);
    EXPECT_EQ(back.String(), p.String()) << type;
    EXPECT_EQ(back.Double(), p.Double()) << type;
  }
}

TEST(PropertyTest, GoldenBytes) {
  using B = std::vector<uint8_t>;
  const std::vector<std::pair<CVXProperty, B>> golden = {
      {CVXProperty(), B{0, 0, 0, 0}},
      {CVXProperty("ab"), B{1, 0, 0, 0, 2, 0, 0, 0, 'a', 'b'}},
      {CVXProperty(int32_t{-2}), B{2, 0, 0, 0, 0xFE, 0xFF, 0xFF, 0xFF}},
      {CVXProperty(1.5f), B{5, 0, 0, 0, 0x00, 0x00, 0xC0, 0x3F}},
      {CVXProperty::MakeDate(2.5), B{7, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0x04, 0x40}},
      {CVXProperty(true), B{9, 0, 0, 0, 1, 0, 0, 0}},
      {CVXProperty(uint64_t{0x0102030405060708}), B{10, 0, 0, 0, 8, 7, 6, 5, 4, 3, 2, 1}},
      {CVXProperty::MakeReference(0x01020304), B{12, 0, 0, 0, 4, 3, 2, 1}},
  };
  for (const auto& [p, bytes] : golden) {
    EXPECT_EQ(Bytes(p), bytes) << p.Type();
    CVXProperty back;
    ASSERT_EQ(Read(bytes, back), VX_OK);
    EXPECT_EQ(back.Type(), p.Type());
    EXPECT_EQ(back.String(), p.String());
  }
  // A stored bool keeps a value other than 0 and 1 as it came.
  CVXProperty odd;
  ASSERT_EQ(Read(B{9, 0, 0, 0, 2, 0, 0, 0}, odd), VX_OK);
  EXPECT_EQ(odd.Int64(), 2);
  EXPECT_EQ(Bytes(odd), (B{9, 0, 0, 0, 2, 0, 0, 0}));
}

TEST(PropertyTest, CorruptStreamsThrowAndLeaveTheTargetAlone) {
  const CVXProperty sentinel("keep");
  // Unknown type codes.
  for (uint8_t type : {13, 200, 255}) {
    CVXProperty p = sentinel;
    EXPECT_EQ(Read({type, 0, 0, 0, 1, 0, 0, 0}, p), VX_NOT_FOUND);
    EXPECT_EQ(p.String(), "keep");
  }
  // Every truncation of every type.
  for (const CVXProperty& full : OneOfEachType()) {
    std::vector<uint8_t> bytes = Bytes(full);
    bytes.resize(std::min<size_t>(bytes.size(), 64));
    for (size_t n = 0; n < bytes.size(); ++n) {
      CVXProperty p = sentinel;
      EXPECT_EQ(Read(std::vector<uint8_t>(bytes.begin(), bytes.begin() + n), p), VX_NOT_FOUND)
          << full.Type() << " cut at " << n;
      EXPECT_EQ(p.String(), "keep");
    }
  }
  // A text length far beyond the input.
  CVXProperty p;
  EXPECT_EQ(Read({11, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 'a'}, p), VX_NOT_FOUND);
}

// Dates count days from 1899-12-30, the time of day being the fraction.
TEST(PropertyTest, SetStringParsesEachTypeAndRejectsWhatDoesNotFit) {
  const std::vector<std::tuple<std::string, unsigned, CVXProperty>> good = {
      {" -2147483648 ", vptInt32, CVXProperty(int32_t{INT32_MIN})},
      {"+4294967295", vptUInt32, CVXProperty(uint32_t{UINT32_MAX})},
      {"-9223372036854775808", vptInt64, CVXProperty(int64_t{INT64_MIN})},
      {"18446744073709551615", vptUInt64, CVXProperty(uint64_t{UINT64_MAX})},
      {"1e3", vptDouble, CVXProperty(1000.0)},
      {"0.1", vptFloat, CVXProperty(0.1f)},
      {"YES", vptBool, CVXProperty(true)},
      {"false", vptBool, CVXProperty(false)},
      {"42", vptReference, CVXProperty::MakeReference(42)},
      {"  spaced  ", vptString, CVXProperty("  spaced  ")},
      {"", vptLongText, CVXProperty::MakeLongText("")},
      {"1899-12-30", vptDate, CVXProperty::MakeDate(0)},
      {"1899-12-29", vptDate, CVXProperty::MakeDate(-1)},
      {"1900-03-01", vptDate, CVXProperty::MakeDate(61)},
      {"2000-02-29", vptDate, CVXProperty::MakeDate(36585)},
      {"0001-01-01", vptDate, CVXProperty::MakeDate(-693593)},
      {"2024-05-01 18:00", vptDate, CVXProperty::MakeDate(45413.75)},
      {"2024-05-01T18:00:00", vptDate, CVXProperty::MakeDate(45413.75)},
      {"6:00", vptTime, CVXProperty::MakeTime(0.25)},
  };
  for (const auto& [text, type, want] : good) EXPECT_EQ(Bytes(Parsed(text, type)), Bytes(want));

  const std::vector<std::pair<unsigned, std::vector<std::string>>> bad = {
      {vptInt32, {"2147483648", "1.5", ""}},
      {vptUInt32, {"-1"}},
      {vptInt64, {"12abc", "+-1"}},
      {vptUInt64, {"-0"}},
      {vptFloat, {"1e39"}},
      {vptDouble, {"inf", "nan", "0x10"}},
      {vptBool, {"maybe"}},
      {vptReference, {"4294967296"}},
      {vptEmpty, {"1"}},
      {13, {"1"}},
      {vptDate,
       {"1900-02-29", "2024-13-01", "2024-04-31", "0000:00:00 00:00:00", "2024:05:01",
        "2024-05-01 24:00", "2024-05-01 12:60", "2024-05-01T12:00:00Z", "2024-5-1"}},
      {vptTime, {"12", "12:5", "25:00"}},
  };
  for (const auto& [type, texts] : bad) {
    for (const std::string& text : texts) {
      CVXProperty p("old");
      EXPECT_FALSE(p.SetString(text, type)) << text << " as " << type;
      EXPECT_TRUE(p.IsEmpty()) << text;
    }
  }
}

TEST(PropertyTest, StringShowsValuesAndAppliesOnlySafeFormats) {
  CVXProperty date = Parsed("2024-05-01 07:05:09", vptDate), number(int32_t{42});
  CVXProperty exif = Parsed("2024:05:01 13:45:30", vptDate);
  EXPECT_EQ(Parsed(exif.String(), vptDate), exif);  // the text of a date reads back as it
  const std::vector<std::tuple<CVXProperty, const char*, std::string>> cases = {
      {exif, nullptr, "2024-05-01 13:45:30"},
      {Parsed("9999-12-31", vptDate), nullptr, "9999-12-31"},
      {Parsed("1600-02-29", vptDate), nullptr, "1600-02-29"},
      {CVXProperty::MakeDate(-0.25), nullptr, "1899-12-29 18:00:00"},
      {CVXProperty::MakeTime(0.5), nullptr, "12:00:00"},
      {CVXProperty::MakeDate(1 - 0.3 / 86400), nullptr, "1899-12-31"},  // whole seconds
      {CVXProperty::MakeDate(1e9), nullptr, "1e+09"},  // outside the calendar: the number
      {date, "%d.%m.%Y %H:%M", "01.05.2024 07:05"},
      {date, "%a %A %b %B %j %y %e %I%p", "Wed Wednesday May May 122 24  1 07AM"},
      {date, "%F|%T|%Q|%%|%", "2024-05-01|07:05:09|%Q|%|%"},
      {number, "%05d", "00042"},
      {number, "%lx items", "2a items"},
      {number, "%.2f", "42.00"},
      {number, "n=%s", "n=42"},
      {number, "100%%", "100%"},
      {CVXProperty(2.5), "%d", "2"},
      {CVXProperty("x"), "[%-3s]", "[x  ]"},
      {CVXProperty(0.1), nullptr, "0.1"},
      {CVXProperty(0.1f), nullptr, "0.1"},
      {CVXProperty(uint64_t{UINT64_MAX}), nullptr, "18446744073709551615"},
      {CVXProperty(), "%d", ""},
  };
  for (const auto& [value, format, want] : cases) {
    EXPECT_EQ(value.String(format), want) << (format ? format : "no format");
  }
  // Formats that could read a missing argument, or produce unbounded output, are ignored.
  std::string longFormat(300, 'a');
  for (const char* unsafe :
       {"%d %d", "%n", "%*d", "%c", "%p", "%1000d", "%.1000f", "%", longFormat.c_str()}) {
    EXPECT_EQ(number.String(unsafe), "42") << unsafe;
  }
}

TEST(PropertyTest, NumericViews) {
  EXPECT_EQ(CVXProperty("12.5").Double(), 12.5);
  EXPECT_EQ(CVXProperty(" -3 ").Int64(), -3);
  EXPECT_EQ(CVXProperty("12 apples").Double(), 0.0);
  EXPECT_EQ(CVXProperty().Double(), 0.0);
  EXPECT_EQ(CVXProperty(true).Double(), 1.0);
  EXPECT_EQ(CVXProperty(-2.9).Int64(), -2);
  EXPECT_EQ(CVXProperty(-2.9).UInt64(), 0u);
  EXPECT_EQ(CVXProperty(1e30).Int64(), INT64_MAX);
  EXPECT_EQ(CVXProperty(std::nan("")).Int64(), 0);
  EXPECT_EQ(CVXProperty(uint64_t{UINT64_MAX}).Int64(), INT64_MAX);
  EXPECT_EQ(CVXProperty(int32_t{-1}).UInt64(), 0u);
}

TEST(PropertyTest, OrderIsAStrictWeakOrderOverAllValues) {
  std::vector<CVXProperty> values = OneOfEachType();
  for (double d : {std::nan(""), -0.0, 0.0, -std::numeric_limits<double>::infinity(), 3.0}) {
    values.emplace_back(d);
  }
  for (const char* s : {"abc", "ABC", "Abd", "", "müller", "MÜLLER"}) values.emplace_back(s);
  values.emplace_back(int32_t{5});
  values.emplace_back(int64_t{5});
  values.emplace_back(CVXProperty::MakeReference(0));

  for (const auto& a : values) {
    EXPECT_FALSE(a < a);
    for (const auto& b : values) {
      EXPECT_EQ(a == b, !(a < b) && !(b < a));
      for (const auto& c : values) {
        EXPECT_TRUE(!(a < b && b < c) || a < c);
        EXPECT_TRUE(!(a == b && b == c) || a == c);
      }
    }
  }
  // Empty first, then by type code, then by value; texts without regard to case.
  EXPECT_TRUE(CVXProperty() < CVXProperty(""));
  EXPECT_TRUE(CVXProperty("zzz") < CVXProperty(int32_t{-100}));
  EXPECT_TRUE(CVXProperty(int32_t{5}) < CVXProperty(int64_t{1}));
  EXPECT_TRUE(CVXProperty("abc") == CVXProperty("ABC"));
  EXPECT_TRUE(CVXProperty("MÜLLER") == CVXProperty("müller"));
  EXPECT_TRUE(CVXProperty("abc") < CVXProperty("ABD"));
  EXPECT_TRUE(CVXProperty(uint64_t{1}) < CVXProperty(uint64_t{UINT64_MAX}));
  EXPECT_TRUE(CVXProperty(-1.0) < CVXProperty(std::nan("")));
  EXPECT_TRUE(CVXProperty(-0.0) == CVXProperty(0.0));
}

TEST(PropertyTest, CompareDateAndCompareTimeLookAtTheirOwnPart) {
  CVXProperty afternoon = Parsed("2024-05-01 13:00", vptDate);
  double morning = Parsed("2024-05-01 08:00", vptDate).Double();
  double dayBeforeLate = Parsed("2024-04-30 23:00", vptDate).Double();
  EXPECT_EQ(afternoon.CompareDate(morning), 0);
  EXPECT_GT(afternoon.CompareTime(morning), 0);
  EXPECT_GT(afternoon.CompareDate(dayBeforeLate), 0);
  EXPECT_LT(afternoon.CompareTime(dayBeforeLate), 0);
  EXPECT_LT(CVXProperty::MakeDate(morning).CompareDate(afternoon.Double() + 1), 0);
  // A time is a fraction of a day and compares with the time of day of a date.
  EXPECT_EQ(Parsed("13:00", vptTime).CompareTime(afternoon.Double()), 0);
  EXPECT_LT(Parsed("12:59:59", vptTime).CompareTime(afternoon.Double()), 0);
  // Before 1899-12-30 the fraction still counts forward from midnight.
  EXPECT_EQ(CVXProperty::MakeDate(-0.25).CompareDate(-0.75), 0);
  EXPECT_GT(CVXProperty::MakeDate(-0.25).CompareTime(-0.75), 0);
  // Outside the calendar the raw numbers decide.
  EXPECT_GT(CVXProperty::MakeDate(1e9 + 0.5).CompareDate(1e9 - 1), 0);
  EXPECT_EQ(CVXProperty::MakeDate(1e9 + 0.5).CompareTime(0.5), 0);
}

}  // namespace
