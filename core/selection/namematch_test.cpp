#include <gtest/gtest.h>

#include "VXNameMatch.h"

using namespace VXNameMatch;

TEST(NameMatch, SmartDifferenceWeighsPositionDigitsAndLength) {
  EXPECT_DOUBLE_EQ(SmartMatchFileName("abc.jpg", "ABC.TIF"), 0);
  // Only the last "." cuts.
  EXPECT_DOUBLE_EQ(SmartMatchFileName("a.b.jpg", "A.B.tif"), 0);
  EXPECT_NEAR(SmartMatchFileName("a.b.jpg", "A.B"), 2 * 99.9 * 0.01, 1e-12);
  EXPECT_DOUBLE_EQ(SmartMatchFileName("", ""), 0);
  // A missing tail: a letter costs the running weight, twice that when b is the longer one.
  EXPECT_DOUBLE_EQ(SmartMatchFileName("a", ""), 1.0);
  EXPECT_DOUBLE_EQ(SmartMatchFileName("", "a"), 2.0);
  EXPECT_DOUBLE_EQ(SmartMatchFileName("", "7"), 1.5);
  EXPECT_NEAR(SmartMatchFileName("ab", "a"), 99.9 * 0.01, 1e-12);
  // Counter digits differ at p = 3, where the weight has fallen to 99.7.
  EXPECT_NEAR(SmartMatchFileName("img1", "img2"), 0.25 * 99.7 * 0.01, 1e-12);
  // The first position: digit/digit w, digit/letter 1.5 w, letter/letter 2 w.
  EXPECT_DOUBLE_EQ(SmartMatchFileName("1", "2"), 1.0);
  EXPECT_DOUBLE_EQ(SmartMatchFileName("1", "x"), 1.5);
  EXPECT_DOUBLE_EQ(SmartMatchFileName("y", "x"), 2.0);
  // Later: digit/letter 1.25 w, letter/letter w, each at the weight of its position.
  EXPECT_NEAR(SmartMatchFileName("a1b", "axc"), (1.25 * 99.9 + 99.8) * 0.01, 1e-12);
  // Extra tail characters keep the weight of the position where the shorter name ended.
  EXPECT_NEAR(SmartMatchFileName("ab", "abc9"), (2 * 99.8 + 1.5 * 99.8) * 0.01, 1e-12);
}

TEST(NameMatch, LooseMatchFindsTheLettersInsideTheOtherName) {
  EXPECT_DOUBLE_EQ(LooseMatchFileName("holiday12.jpg", "HOLIDAY-beach.jpg"), 0);
  EXPECT_DOUBLE_EQ(LooseMatchFileName("Über1.jpg", "das-über.png"), 0);
  // No letters on one side: the smart difference of the full names.
  EXPECT_DOUBLE_EQ(LooseMatchFileName("123.jpg", "123abc.jpg"),
                   SmartMatchFileName("123.jpg", "123abc.jpg"));
  EXPECT_GT(LooseMatchFileName("beach.jpg", "holiday.jpg"), 0);
}

TEST(NameMatch, WordsSplitOutsideQuotes) {
  using W = std::vector<std::string>;
  EXPECT_EQ(SplitWords("a, b;;c\td"), (W{"a", "b", "c", "d"}));
  EXPECT_EQ(SplitWords("\"two words\" x"), (W{"two words", "x"}));
  EXPECT_EQ(SplitWords("say\"\"hi\"\" a.b"), (W{"say\"hi\"", "a", "b"}));
  EXPECT_EQ(SplitWords("\"a.b, c\""), (W{"a.b, c"}));
  EXPECT_EQ(SplitWords(" . ,"), W{});
}

TEST(NameMatch, PatternWordsRequireAndExclude) {
  double score = -1;
  EXPECT_TRUE(PatternMatchFileName("+sun -rain", "SUNSET.jpg", score));
  EXPECT_EQ(score, 100);
  EXPECT_FALSE(PatternMatchFileName("+sun -rain", "SUNRAIN.jpg", score));
  EXPECT_EQ(score, 0);
  EXPECT_FALSE(PatternMatchFileName("+sun -rain", "beach.jpg", score));
  EXPECT_TRUE(PatternMatchFileName("-rain", "beach.jpg", score));
  // A plain word is enough when no word is required; the extension is not searched.
  EXPECT_TRUE(PatternMatchFileName("moon sun", "sunny.jpg", score));
  EXPECT_FALSE(PatternMatchFileName("jpg", "sunny.jpg", score));
  EXPECT_FALSE(PatternMatchFileName("+sun +moon", "sunny.jpg", score));
  EXPECT_TRUE(PatternMatchFileName("\"sun set\"", "Sun Set 2.jpg", score));
  EXPECT_FALSE(PatternMatchFileName("", "sunny.jpg", score));
}
