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

// The wrapper's own choices: search anywhere, UTF-8 text, case counts unless asked not to.
TEST(RegExp, SearchesUtf8TextAnywhereUnlessAnchored) {
  EXPECT_EQ(Compiled("mg_[0-9]+").Match("img_0042.jpg"), kMatch);
  EXPECT_EQ(Compiled("^img\\d+$").Match("img12.jpg"), kNoMatch);
  EXPECT_EQ(Compiled("^M.ller$").Match("Müller"), kMatch);  // one "." is one character
  EXPECT_EQ(Compiled("müller").Match("MÜLLER"), kNoMatch);
  EXPECT_EQ(Compiled("müller\\.jpg", true).Match("MÜLLER.JPG"), kMatch);
}

TEST(RegExp, RefusedPatternGivesErrorAndLeavesNoPattern) {
  CVXRegExp none;
  EXPECT_EQ(none.Match("x"), CVXRegExp::reNoPattern);
  // Bad syntax, bad UTF-8, and a program too large to build.
  for (std::string bad : {"a(", "\xff", "((((a{100}){100}){100}){100})"}) {
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
