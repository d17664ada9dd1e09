#include "xstring.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

namespace {

int Sign(int v) { return (v > 0) - (v < 0); }

// "a|b" as {"a", "b"}.
std::pair<std::string, std::string> Sides(const std::string& pair) {
  const size_t bar = pair.find('|');
  return {pair.substr(0, bar), pair.substr(bar + 1)};
}

TEST(XString, StringToLong) {
  using KTUnicode::StringToLong;
  const std::pair<const char*, int> cases[] = {
      {"42", 42}, {" \t-17abc", -17}, {"+8", 8}, {"12 34", 12}, {"", 0}, {"-", 0}, {"- 5", 0},
  };
  for (auto [text, value] : cases) EXPECT_EQ(StringToLong(text), value) << text;
  for (const char* high : {"2147483647", "2147483648", "99999999999999999999999999"}) {
    EXPECT_EQ(StringToLong(high), INT32_MAX) << high;
  }
  for (const char* low : {"-2147483648", "-2147483649"}) EXPECT_EQ(StringToLong(low), INT32_MIN);
  EXPECT_EQ(StringToLong("0000000000000000000000000012"), 12);
}

// The last case: a no-break space is not ASCII white space.
TEST(XString, TrimChosenEnds) {
  const struct {
    std::string text;
    XStringTrim where;
    const char* trimmed;
  } cases[] = {
      {" \t a b \r\n", xstBoth, "a b"}, {"  x  ", xstLeft, "x  "},           {"x  ", xstRight, "x"},
      {" \n\t ", xstBoth, ""},          {"\xC2\xA0x", xstBoth, "\xC2\xA0x"},
  };
  for (auto c : cases) {
    Trim(c.text, c.where);
    EXPECT_EQ(c.text, c.trimmed);
  }
}

TEST(XString, CaseInsensitiveComparisonFoldsUnicodeAndOrdersByFoldedCodePoint) {
  // "a|b" pairs that compare equal. KELVIN SIGN folds to k. Stray bytes compare as bytes: a
  // truncated sequence then ASCII, an encoded surrogate.
  for (const char* pair : {"Müller.JPG|MÜLLER.jpg", "é|É", "ΣΊΣΥΦΟΣ|σίσυφοσ", "\xE2\x84\xAA|k",
                           "\xE9|\xE9", "A\xC3(|a\xC3(", "\xED\xA0\x80|\xED\xA0\x80"}) {
    auto [a, b] = Sides(pair);
    EXPECT_EQ(_mbsicmp(a.c_str(), b.c_str()), 0) << pair;
  }
  // "a|b" pairs with a before b, by folded code point. '_' lies between the cases: letters fold
  // to lower case. Simple folding keeps ß. A stray byte orders after every character; Latin-1 É
  // and é are neither folded nor taken for their UTF-8 form.
  for (const char* pair :
       {"apple|Banana", "abc|ABCD", "Z|é", "é|Ω", "_|A", "STRASSE|Straße", "\xC9|\xE9",
        "\xC3\xA9|\xE9", "\xC3|\xC4", "\xED\xA0\x80|\xED\xA0\x81"}) {
    auto [a, b] = Sides(pair);
    EXPECT_LT(_mbsicmp(a.c_str(), b.c_str()), 0) << pair;
    EXPECT_GT(_mbsicmp(b.c_str(), a.c_str()), 0) << pair;
  }
  // Null reads as empty text.
  EXPECT_EQ(_mbsicmp(nullptr, ""), 0);
  EXPECT_EQ(_mbsicmp(nullptr, nullptr), 0);
  EXPECT_LT(_mbsicmp(nullptr, "a"), 0);
  EXPECT_EQ(xstring_comparenocase(std::string("a\0B", 3), std::string("A\0b", 3)), 0);
  EXPECT_NE(xstring_comparenocase(std::string("a\0B", 3), "a"), 0);
  EXPECT_EQ(xstring_comparenocase("ab\xE2\x82", "AB\xE2\x82"), 0);
  EXPECT_GT(xstring_comparenocase("ab\xE2\x82", "AB\xE2\x82\xAC"), 0);
  // Antisymmetric over a mixed set, stray bytes included.
  const char* samples[] = {"", "a", "A", "ab", "é", "É", "\xFF", "\xC3", "a\xFF", "z", "Ω", "_"};
  for (const char* a : samples) {
    for (const char* b : samples) {
      EXPECT_EQ(Sign(_mbsicmp(a, b)), -Sign(_mbsicmp(b, a))) << a << " / " << b;
    }
  }
}

TEST(XString, FoldKeysAreEqualExactlyWhenTextsCompareEqual) {
  const std::string texts[] = {"Müller.JPG", "MÜLLER.jpg", "muller.jpg", "é", "É",  "e",
                               "a\xFF",      "A\xFF",      "a\xFE",      "",  "ab", "a"};
  for (const std::string& a : texts) {
    for (const std::string& b : texts) {
      EXPECT_EQ(xstring_foldkey(a) == xstring_foldkey(b), xstring_comparenocase(a, b) == 0)
          << a << " / " << b;
    }
  }
}

TEST(XString, BoundedComparisonCountsCharacters) {
  const struct {
    const char *a, *b;
    size_t n;
    int sign;
  } cases[] = {
      {"Übel", "üBERALL", 3, 0}, {"Übel", "üBERALL", 4, -1}, {"ab", "AB", 10, 0},
      {"ab", "ABC", 10, -1},     {"x", "y", 0, 0},           {nullptr, "abc", 0, 0},
      {nullptr, "abc", 1, -1},
  };
  for (const auto& c : cases) EXPECT_EQ(Sign(_mbsnicmp(c.a, c.b, c.n)), c.sign) << c.a << c.n;
}

std::vector<std::string> Tokens(std::string text, const char* delims) {
  std::vector<std::string> out;
  for (char* t = _mbstok(text.data(), delims); t; t = _mbstok(nullptr, delims)) out.push_back(t);
  return out;
}

TEST(XString, TokenizerSplitsOnWholeCharacters) {
  using V = std::vector<std::string>;
  EXPECT_EQ(Tokens(";;a;bc;;d;", ";"), (V{"a", "bc", "d"}));
  EXPECT_EQ(Tokens("a·b c·", "· "), (V{"a", "b", "c"}));
  // "é" (C3 A9) as a delimiter must not split "é"'s neighbour "É" (C3 89).
  EXPECT_EQ(Tokens("xÉyéz", "é"), (V{"xÉy", "z"}));
  EXPECT_EQ(Tokens("abc", ""), (V{"abc"}));
  EXPECT_EQ(Tokens("abc", nullptr), (V{"abc"}));
  EXPECT_EQ(Tokens(",,,", ","), V{});
  EXPECT_EQ(Tokens("a\377b", "\377"), (V{"a", "b"}));
  EXPECT_EQ(_mbstok(nullptr, ","), nullptr);  // no text left
}

TEST(XString, TokenizerStateIsPerThread) {
  std::string mine = "1,2,3";
  ASSERT_STREQ(_mbstok(mine.data(), ","), "1");
  std::vector<std::string> other;
  std::thread([&other] { other = Tokens("x y", " "); }).join();
  EXPECT_EQ(other, (std::vector<std::string>{"x", "y"}));
  EXPECT_STREQ(_mbstok(nullptr, ","), "2");
  EXPECT_STREQ(_mbstok(nullptr, ","), "3");
  EXPECT_EQ(_mbstok(nullptr, ","), nullptr);
}

TEST(XString, CharacterClassesAndUpperCase) {
  // '7', ARABIC-INDIC DIGIT THREE, 'a', 'é', '-', beyond Unicode, and far beyond.
  const unsigned points[] = {'7', 0x0663, 'a', 0x00E9, '-', 0x110000, 0xFFFFFFFF};
  const bool digit[] = {true, true, false, false, false, false, false};
  const bool alnum[] = {true, true, true, true, false, false, false};
  for (int i = 0; i < 7; ++i) {
    EXPECT_EQ(_ismbcdigit(points[i]), digit[i]) << points[i];
    EXPECT_EQ(_ismbcalnum(points[i]), alnum[i]) << points[i];
  }
  EXPECT_EQ(_mbsupr("müller.jpg"), "MÜLLER.JPG");
  EXPECT_EQ(_mbsupr("ıx"), "IX");                  // dotless i: two bytes become one
  EXPECT_EQ(_mbsupr("\xC9\x90"), "\xE2\xB1\xAF");  // ɐ: two bytes become three
  EXPECT_EQ(_mbsupr("a\377b\303"), "A\377B\303");  // stray bytes kept
  EXPECT_EQ(_mbsupr(""), "");
}

}  // namespace
