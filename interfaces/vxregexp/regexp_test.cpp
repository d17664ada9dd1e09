#include <gtest/gtest.h>

#include <chrono>
#include <string>

#include "VXRegExp.h"

namespace {

constexpr auto kMatch = CVXRegExp::reMatch;
constexpr auto kNoMatch = CVXRegExp::reNoMatch;

CVXRegExp Compiled(const std::string& pattern, bool caseless = false) {
  CVXRegExp re;
  EXPECT_EQ(re.SetPattern(pattern, nullptr, caseless), CVXRegExp::rePatternOK) << pattern;
  return re;
}

TEST(RegExp, SearchesUtf8TextAnywhereUnlessAnchored) {
  EXPECT_EQ(Compiled("mg_[0-9]+").Match("img_0042.jpg"), kMatch);
  EXPECT_EQ(Compiled("mg_[0-9]+").Match("IMG_0042"), kNoMatch);  // case counts by default
  EXPECT_EQ(Compiled("^img\\d+$").Match("my img12"), kNoMatch);
  EXPECT_EQ(Compiled("^img\\d+$").Match("img12.jpg"), kNoMatch);
  // One "." is one character, whatever its byte count; stray bytes hide nothing.
  EXPECT_EQ(Compiled("^M.ller$").Match("Müller"), kMatch);
  EXPECT_EQ(Compiled("abc").Match("\xff\xfe"
                                  "abc\xc3"),
            kMatch);
  EXPECT_EQ(Compiled("").Match(""), kMatch);
}

TEST(RegExp, CaselessFoldsUnicode) {
  CVXRegExp re = Compiled("müller\\.jpg", true);
  EXPECT_TRUE(re.IsCaseless());
  EXPECT_EQ(re.Match("MÜLLER.JPG"), kMatch);
  EXPECT_EQ(Compiled("É", true).Match("café"), kMatch);
  EXPECT_EQ(Compiled("müller").Match("MÜLLER"), kNoMatch);
}

TEST(RegExp, RefusedPatternGivesErrorAndLeavesNoPattern) {
  CVXRegExp none;
  EXPECT_EQ(none.Match("x"), CVXRegExp::reNoPattern);
  // The last is refused for its size: its program would be huge.
  for (std::string bad : {"a(", "[z-a]", "x**", "\xff", "a\\", "((((a{100}){100}){100}){100})"}) {
    CVXRegExp re = Compiled("ok");
    std::string error, why;
    EXPECT_EQ(re.SetPattern(bad, &error), CVXRegExp::reError) << bad;
    EXPECT_FALSE(error.empty()) << bad;
    EXPECT_EQ(re.GetPattern(), "");
    EXPECT_EQ(re.Match("ok", &why), CVXRegExp::reNoPattern);
    EXPECT_FALSE(why.empty());
  }
}

TEST(RegExp, CopiesAreIndependent) {
  CVXRegExp a = Compiled("^a", true);
  CVXRegExp b(a), c;
  c = a;
  a.SetPattern("^z");
  for (const CVXRegExp* r : {&b, &c}) {
    EXPECT_EQ(r->GetPattern(), "^a");
    EXPECT_EQ(r->Match("Apple"), kMatch);
    EXPECT_EQ(r->Match("zoo"), kNoMatch);
  }
  EXPECT_EQ(a.Match("zoo"), kMatch);
  EXPECT_FALSE(a.IsCaseless());
}

// Patterns that take exponential time in a backtracking engine stay linear here.
TEST(RegExp, RunTimeIsLinearInTheText) {
  auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(Compiled("^(a+)+$").Match(std::string(200000, 'a') + "!"), kNoMatch);
  EXPECT_EQ(Compiled("(x+x+)+y").Match(std::string(100000, 'x')), kNoMatch);
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(5));
}

}  // namespace
