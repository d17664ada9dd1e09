#include "xstring.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

namespace {

int Sign(int v) { return (v > 0) - (v < 0); }

TEST(XString, StringToLong) {
  using KTUnicode::StringToLong;
  EXPECT_EQ(StringToLong("42"), 42);
  EXPECT_EQ(StringToLong(" \t-17abc"), -17);
  EXPECT_EQ(StringToLong("+8"), 8);
  EXPECT_EQ(StringToLong("12 34"), 12);
  EXPECT_EQ(StringToLong(""), 0);
  EXPECT_EQ(StringToLong("-"), 0);
  EXPECT_EQ(StringToLong("- 5"), 0);
  EXPECT_EQ(StringToLong("2147483647"), INT32_MAX);
  EXPECT_EQ(StringToLong("2147483648"), INT32_MAX);
  EXPECT_EQ(StringToLong("-2147483648"), INT32_MIN);
  EXPECT_EQ(StringToLong("-2147483649"), INT32_MIN);
  EXPECT_EQ(StringToLong("99999999999999999999999999"), INT32_MAX);
  EXPECT_EQ(StringToLong("0000000000000000000000000012"), 12);
}

TEST(XString, TrimChosenEnds) {
  std::string s = " \t a b \r\n";
  Trim(s);
  EXPECT_EQ(s, "a b");
  s = "  x  ";
  Trim(s, xstLeft);
  EXPECT_EQ(s, "x  ");
  Trim(s, xstRight);
  EXPECT_EQ(s, "x");
  s = " \n\t ";
  Trim(s);
  EXPECT_EQ(s, "");
  s = "\xC2\xA0x";  // no-break space is not ASCII white space
  Trim(s);
  EXPECT_EQ(s, "\xC2\xA0x");
}

TEST(XString, CaseInsensitiveEqualityFoldsUnicode) {
  EXPECT_EQ(xstring_comparenocase("Müller.JPG", "MÜLLER.jpg"), 0);
  EXPECT_EQ(_mbsicmp("é", "É"), 0);
  EXPECT_EQ(_mbsicmp("ΣΊΣΥΦΟΣ", "σίσυφοσ"), 0);
  EXPECT_EQ(_mbsicmp("\xE2\x84\xAA", "k"), 0);          // KELVIN SIGN folds to k
  EXPECT_EQ(_mbsicmp("Straße", "STRASSE") != 0, true);  // simple folding keeps ß
  EXPECT_EQ(_mbsicmp(nullptr, ""), 0);
  EXPECT_EQ(_mbsicmp(nullptr, nullptr), 0);
  EXPECT_LT(_mbsicmp(nullptr, "a"), 0);
  EXPECT_EQ(xstring_comparenocase(std::string("a\0B", 3), std::string("A\0b", 3)), 0);
  EXPECT_NE(xstring_comparenocase(std::string("a\0B", 3), "a"), 0);
}

TEST(XString, CaseInsensitiveOrdering) {
  EXPECT_LT(_mbsicmp("apple", "Banana"), 0);
  EXPECT_GT(_mbsicmp("Banana", "apple"), 0);
  EXPECT_LT(_mbsicmp("abc", "ABCD"), 0);
  EXPECT_GT(_mbsicmp("abcd", "ABC"), 0);
  EXPECT_LT(_mbsicmp("Z", "é"), 0);  // by folded code point
  EXPECT_LT(_mbsicmp("é", "Ω"), 0);
  // '_' lies between the upper and lower case letters: letters fold to lower case.
  EXPECT_GT(_mbsicmp("A", "_"), 0);
  // Antisymmetric over a mixed set, stray bytes included.
  const char* samples[] = {"", "a", "A", "ab", "é", "É", "\xFF", "\xC3", "a\xFF", "z", "Ω", "_"};
  for (const char* a : samples) {
    for (const char* b : samples) {
      EXPECT_EQ(Sign(_mbsicmp(a, b)), -Sign(_mbsicmp(b, a))) << a << " / " << b;
    }
  }
}

TEST(XString, StrayBytesCompareAsBytes) {
  EXPECT_EQ(_mbsicmp("\xE9", "\xE9"), 0);
  EXPECT_NE(_mbsicmp("\xE9", "\xC9"), 0);      // Latin-1 é and É are not folded
  EXPECT_NE(_mbsicmp("\xE9", "\xC3\xA9"), 0);  // nor taken for their UTF-8 form
  EXPECT_LT(_mbsicmp("\xC3", "\xC4"), 0);
  EXPECT_EQ(_mbsicmp("A\xC3(", "a\xC3("), 0);              // a truncated sequence, then ASCII
  EXPECT_EQ(_mbsicmp("\xED\xA0\x80", "\xED\xA0\x80"), 0);  // an encoded surrogate
  EXPECT_NE(_mbsicmp("\xED\xA0\x80", "\xED\xA0\x81"), 0);
  std::string truncated = "ab\xE2\x82";
  EXPECT_EQ(xstring_comparenocase(truncated, "AB\xE2\x82"), 0);
  EXPECT_GT(xstring_comparenocase(truncated, "AB\xE2\x82\xAC"), 0);  // stray bytes sort last
}

TEST(XString, BoundedComparisonCountsCharacters) {
  EXPECT_EQ(_mbsnicmp("Übel", "üBERALL", 3), 0);
  EXPECT_LT(_mbsnicmp("Übel", "üBERALL", 4), 0);
  EXPECT_EQ(_mbsnicmp("ab", "AB", 10), 0);
  EXPECT_LT(_mbsnicmp("ab", "ABC", 10), 0);
  EXPECT_EQ(_mbsnicmp("x", "y", 0), 0);
  EXPECT_EQ(_mbsnicmp(nullptr, "abc", 0), 0);
  EXPECT_LT(_mbsnicmp(nullptr, "abc", 1), 0);
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
  EXPECT_EQ(Tokens("a\xFF"
                   "b",
                   "\xFF"),
            (V{"a", "b"}));
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
  EXPECT_TRUE(_ismbcdigit('7'));
  EXPECT_TRUE(_ismbcdigit(0x0663));  // ARABIC-INDIC DIGIT THREE
  EXPECT_FALSE(_ismbcdigit('a'));
  EXPECT_TRUE(_ismbcalnum('a'));
  EXPECT_TRUE(_ismbcalnum(0x00E9));
  EXPECT_TRUE(_ismbcalnum(0x0663));
  EXPECT_FALSE(_ismbcalnum('-'));
  EXPECT_FALSE(_ismbcalnum(0x110000));
  EXPECT_FALSE(_ismbcdigit(0xFFFFFFFF));

  EXPECT_EQ(_mbsupr("müller.jpg"), "MÜLLER.JPG");
  EXPECT_EQ(_mbsupr("ıx"), "IX");                  // dotless i: two bytes become one
  EXPECT_EQ(_mbsupr("\xC9\x90"), "\xE2\xB1\xAF");  // ɐ: two bytes become three
  EXPECT_EQ(_mbsupr("a\xFF"
                    "b\xC3"),
            "A\xFF"
            "B\xC3");
  EXPECT_EQ(_mbsupr(""), "");
}

}  // namespace

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
