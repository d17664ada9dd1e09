#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
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
  ASSERT_EQ(all.size(), 13u);
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

TEST(PropertyTest, SetStringParsesEachTypeAndRejectsWhatDoesNotFit) {
  EXPECT_EQ(Parsed(" -2147483648 ", vptInt32).Int64(), INT32_MIN);
  EXPECT_EQ(Parsed("+4294967295", vptUInt32).UInt64(), UINT32_MAX);
  EXPECT_EQ(Parsed("-9223372036854775808", vptInt64).Int64(), INT64_MIN);
  EXPECT_EQ(Parsed("18446744073709551615", vptUInt64).UInt64(), UINT64_MAX);
  EXPECT_EQ(Parsed("1e3", vptDouble).Double(), 1000.0);
  EXPECT_EQ(Parsed("0.1", vptFloat).Double(), static_cast<double>(0.1f));
  EXPECT_EQ(Parsed("YES", vptBool).Int64(), 1);
  EXPECT_EQ(Parsed("false", vptBool).Int64(), 0);
  EXPECT_EQ(Parsed("42", vptReference).Type(), vptReference);
  EXPECT_EQ(Parsed("  spaced  ", vptString).Text(), "  spaced  ");
  EXPECT_EQ(Parsed("", vptLongText).Type(), vptLongText);

  const std::vector<std::pair<std::string, unsigned>> bad = {
      {"2147483648", vptInt32},
      {"-1", vptUInt32},
      {"12abc", vptInt64},
      {"1.5", vptInt32},
      {"", vptInt32},
      {"+-1", vptInt64},
      {"1e39", vptFloat},
      {"inf", vptDouble},
      {"nan", vptDouble},
      {"0x10", vptDouble},
      {"maybe", vptBool},
      {"4294967296", vptReference},
      {"-0", vptUInt64},
      {"1", vptEmpty},
      {"1", 13},
      {"1900-02-29", vptDate},
      {"2024-13-01", vptDate},
      {"2024-04-31", vptDate},
      {"0000:00:00 00:00:00", vptDate},
      {"2024:05:01", vptDate},
      {"2024-05-01 24:00", vptDate},
      {"2024-05-01 12:60", vptDate},
      {"2024-05-01T12:00:00Z", vptDate},
      {"2024-5-1", vptDate},
      {"12", vptTime},
      {"12:5", vptTime},
      {"25:00", vptTime},
  };
  for (const auto& [text, type] : bad) {
    CVXProperty p("old");
    EXPECT_FALSE(p.SetString(text, type)) << text << " as " << type;
    EXPECT_TRUE(p.IsEmpty()) << text;
  }
}

TEST(PropertyTest, DatesCountDaysFrom1899December30) {
  EXPECT_EQ(Parsed("1899-12-30", vptDate).Double(), 0.0);
  EXPECT_EQ(Parsed("1899-12-29", vptDate).Double(), -1.0);
  EXPECT_EQ(Parsed("1900-03-01", vptDate).Double(), 61.0);
  EXPECT_EQ(Parsed("2000-02-29", vptDate).Double(), 36585.0);
  EXPECT_EQ(Parsed("0001-01-01", vptDate).Double(), -693593.0);
  EXPECT_EQ(Parsed("2024-05-01 18:00", vptDate).Double(), 45413.75);
  EXPECT_EQ(Parsed("2024-05-01T18:00:00", vptDate).Double(), 45413.75);
  EXPECT_EQ(Parsed("6:00", vptTime).Double(), 0.25);

  // EXIF text, and the text of a date read back as the same date.
  CVXProperty exif = Parsed("2024:05:01 13:45:30", vptDate);
  EXPECT_EQ(exif.String(), "2024-05-01 13:45:30");
  EXPECT_EQ(Parsed(exif.String(), vptDate), exif);
  EXPECT_EQ(Parsed("9999-12-31", vptDate).String(), "9999-12-31");
  EXPECT_EQ(Parsed("1600-02-29", vptDate).String(), "1600-02-29");
  EXPECT_EQ(CVXProperty::MakeDate(-0.25).String(), "1899-12-29 18:00:00");
  EXPECT_EQ(CVXProperty::MakeTime(0.5).String(), "12:00:00");
  // Whole seconds: 23:59:59.7 is the next midnight.
  EXPECT_EQ(CVXProperty::MakeDate(1 - 0.3 / 86400).String(), "1899-12-31");
  // Outside the calendar the number is shown.
  EXPECT_EQ(CVXProperty::MakeDate(1e9).String(), "1e+09");
}

TEST(PropertyTest, StringAppliesFormatsAndIgnoresUnsafeOnes) {
  CVXProperty date = Parsed("2024-05-01 07:05:09", vptDate);
  EXPECT_EQ(date.String("%d.%m.%Y %H:%M"), "01.05.2024 07:05");
  EXPECT_EQ(date.String("%a %A %b %B %j %y %e %I%p"), "Wed Wednesday May May 122 24  1 07AM");
  EXPECT_EQ(date.String("%F|%T|%Q|%%|%"), "2024-05-01|07:05:09|%Q|%|%");

  CVXProperty number(int32_t{42});
  EXPECT_EQ(number.String("%05d"), "00042");
  EXPECT_EQ(number.String("%lx items"), "2a items");
  EXPECT_EQ(number.String("%.2f"), "42.00");
  EXPECT_EQ(number.String("n=%s"), "n=42");
  EXPECT_EQ(number.String("100%%"), "100%");
  EXPECT_EQ(CVXProperty(2.5).String("%d"), "2");
  EXPECT_EQ(CVXProperty("x").String("[%-3s]"), "[x  ]");
  EXPECT_EQ(CVXProperty(0.1).String(), "0.1");
  EXPECT_EQ(CVXProperty(0.1f).String(), "0.1");
  EXPECT_EQ(CVXProperty(uint64_t{UINT64_MAX}).String(), "18446744073709551615");
  EXPECT_EQ(CVXProperty().String("%d"), "");
  // Formats that could read a missing argument, or produce unbounded output, are ignored.
  for (const char* unsafe : {"%d %d", "%n", "%*d", "%c", "%p", "%1000d", "%.1000f", "%"}) {
    EXPECT_EQ(number.String(unsafe), "42") << unsafe;
  }
  EXPECT_EQ(number.String(std::string(300, 'a').c_str()), "42");
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
    EXPECT_TRUE(a == a);
    for (const auto& b : values) {
      EXPECT_EQ(a == b, !(a < b) && !(b < a));
      EXPECT_FALSE(a < b && b < a);
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
