#include <gtest/gtest.h>

#include <bit>
#include <string>
#include <utility>
#include <vector>

#include "VXGroupParser.h"
#include "VXResult.h"

namespace {

// One letter per token type, found by the type's bit.
char Kind(uint32_t type) {
  const std::string kinds = "?cfrsp??&|-?()?_u?RL";
  const size_t bit = std::countr_zero(type);
  return std::has_single_bit(type) && bit < kinds.size() ? kinds[bit] : '?';
}

// Every field of every token in one line: kind, text, position and non-zero flags, as in
// "c:a@3 _:@4 &:AND@7/2". Blanks print as nothing, tab and line feed as \t and \n.
std::string Render(const std::vector<SToken>& tokens) {
  std::string out;
  for (const SToken& t : tokens) {
    std::string text = t.text == " "    ? ""
                       : t.text == "\t" ? "\\t"
                       : t.text == "\n" ? "\\n"
                                        : t.text;
    if (!out.empty()) out += ' ';
    out += std::string(1, Kind(t.type)) + ':' + text + '@' + std::to_string(t.position);
    if (t.flags) out += '/' + std::to_string(t.flags);
    if (t.reserved || !t.extra.empty()) out += '!';
  }
  return out;
}

struct SParsed {
  SError parse;
  std::vector<SToken> infix;
  SError convert{0, 0};
  std::vector<SToken> postfix;
};

SParsed ParseAndConvert(const std::string& text) {
  CVXGroupParser parser;
  SParsed r;
  r.parse = parser.Parse(text, r.infix);
  if (r.parse.code != VX_OK) return r;
  r.postfix = r.infix;
  r.convert = parser.ConvertToStack(r.postfix);
  return r;
}

// Formulas that parse and convert: the infix and the postfix list, and the parse position.
TEST(GroupParser, TokenListsAndPostfix) {
  struct Row {
    std::string formula;
    int32_t position;
    std::string infix, postfix;
  };
  const Row rows[] = {
      {R"~("a" AND ("b" OR "c") NOT "d")~", 28,
       "c:a@3 _:@4 &:AND@7 _:@8 (:(@9 c:b@12 _:@13 |:OR@15 _:@16 c:c@19 ):)@20 _:@21 -:NOT@24 "
       "_:@25 c:d@25",
       "c:a@3 _:@4 _:@8 c:b@12 _:@13 _:@16 c:c@19 |:OR@15 _:@21 &:AND@7 _:@25 c:d@25 -:NOT@24"},
      {R"~("a")~", 3, "c:a@0", "c:a@0"},
      {R"~("a" and "b"Or"c" nOt "d")~", 24,
       "c:a@3 _:@4 &:AND@7 _:@8 c:b@11 |:OR@13 c:c@16 _:@17 -:NOT@20 _:@21 c:d@21",
       "c:a@3 _:@4 _:@8 c:b@11 &:AND@7 c:c@16 _:@17 |:OR@13 _:@21 c:d@21 -:NOT@20"},
      // No precedence: operators rank alike and group from the left.
      {R"~("a"OR"b"AND"c")~", 14, "c:a@3 |:OR@5 c:b@8 &:AND@11 c:c@11",
       "c:a@3 c:b@8 |:OR@5 c:c@11 &:AND@11"},
      {R"~(("a"NOT"b")NOT(("c")))~", 21,
       "(:(@1 c:a@4 -:NOT@7 c:b@10 ):)@11 -:NOT@14 (:(@15 (:(@16 c:c@19 ):)@20 ):)@20",
       "c:a@4 c:b@10 -:NOT@7 c:c@19 -:NOT@14"},
      // A modifier stays on every later token of the formula; stored formulas rely on it.
      {R"~("CatDistinct@a"OR"b"OR"CatNoRecurse@ c")~", 39,
       "c:a@15/2 |:OR@17/2 c:b@20/2 |:OR@22/2 c:c@22/3",
       "c:a@15/2 c:b@20/2 |:OR@17/2 c:c@22/3 |:OR@22/2"},
      // CR and CR LF give one line feed; trailing white space is kept in both lists.
      {"\"a\"\r\nOR\r\"b\"\t ", 13, "c:a@3 _:\\n@5 |:OR@7 _:\\n@8 c:b@11 _:\\t@12 _:@12",
       "c:a@3 _:\\n@5 _:\\n@8 c:b@11 _:\\t@12 _:@12 |:OR@7"},
      // A zero byte ends the text.
      {std::string("\"a\" OR \"b\"\0 OR", 14), 10, "c:a@3 _:@4 |:OR@6 _:@7 c:b@7",
       "c:a@3 _:@4 _:@7 c:b@7 |:OR@6"},
      // Two expressions side by side pass here; evaluation rejects the list.
      {R"~("a" ("b"))~", 9, "c:a@3 _:@4 (:(@5 c:b@8 ):)@8", "c:a@3 _:@4 c:b@8"},
      {"\"\xFF\" OR \"@rating\xC3\"", 17, "c:\xFF@3 _:@4 |:OR@6 _:@7 R:rating\xC3@7",
       "c:\xFF@3 _:@4 _:@7 R:rating\xC3@7 |:OR@6"},
  };
  for (const Row& row : rows) {
    SCOPED_TRACE(row.formula);
    SParsed r = ParseAndConvert(row.formula);
    ASSERT_EQ(r.parse.code, VX_OK);
    EXPECT_EQ(r.parse.position, row.position);
    EXPECT_EQ(Render(r.infix), row.infix);
    ASSERT_EQ(r.convert.code, VX_OK);
    EXPECT_EQ(r.convert.position, row.position);
    EXPECT_EQ(Render(r.postfix), row.postfix);
  }
}

// One quoted operand per row: what its prefix makes of it.
TEST(GroupParser, OperandPrefixes) {
  const std::pair<std::string, std::string> rows[] = {
      {R"~(" a b ")~", "c: a b @0"},  // no "@": nothing trimmed
      {R"~("category@x")~", "c:x@0"},
      {R"~("Category@abc@def")~", "c:abc@def@0"},
      {R"~("Category@")~", "c:@0"},
      {R"~("CatNoRecurse@  x")~", "c:x@0/1"},
      {R"~("CATDISTINCT@x ")~", "c:x @0/2"},
      {"\"Catdi\xC5\xBFtinct@x\"", "c:x@0/2"},  // long s folds to s
      {R"~("Folder@ c:\pics<VOL.7>")~", R"~(f:c:\pics<VOL.7>@0)~"},
      {"\"FOLDER@M\xC3\xBCller\"", "f:M\xC3\xBCller@0"},
      {R"~("rfolder@/a/b")~", "r:/a/b@0"},
      {R"~("@Unassigned")~", "u:Unassigned@0"},
      {R"~("@Unassigned ")~", "c:@Unassigned @0"},
      {R"~("@Rating[3]")~", "R:Rating[3]@0"},
      {R"~("@Ratingfoo")~", "R:Ratingfoo@0"},
      {R"~("@label[Red]")~", "L:label[Red]@0"},
      {R"~("PersSel@ best of")~", "p:best of@0"},
      {R"~("@All")~", "c:@All@0"},
      {"\"a (b) OR\tc\"", "c:a (b) OR\tc@0"},
  };
  for (const auto& [formula, token] : rows) {
    SCOPED_TRACE(formula);
    SParsed r = ParseAndConvert(formula);
    ASSERT_EQ(r.parse.code, VX_OK);
    EXPECT_EQ(Render(r.infix), token);
    EXPECT_EQ(r.convert.code, VX_OK);
  }
}

struct SFailure {
  std::string formula;
  uint32_t code;
  int32_t position;
  bool parses = false;  // the text parses; the conversion finds the fault
};

// A bad token reports the offset behind the token before it (-1 for the first); a failed check
// the offset behind the offending token, or for the last token behind the one before it; an
// unclosed "(" the length of the text. Faults of the conversion report the position left by
// Parse and leave the list as it was.
TEST(GroupParser, ParseAndConvertFailures) {
  const SFailure rows[] = {
      {R"~("")~", VX_FORMULA_EMPTY_TOKEN, -1},
      {R"~("a" OR "")~", VX_FORMULA_EMPTY_TOKEN, 7},
      {"x", VX_FORMULA_UNKNOWN_BYTE, -1},
      {R"~("a" OR x "b")~", VX_FORMULA_UNKNOWN_BYTE, 7},
      {R"~("a"x)~", VX_FORMULA_UNKNOWN_BYTE, 3},
      {R"~("a" OR bc)~", VX_FORMULA_UNQUOTED, 7},
      {std::string("\"ab\0c\"", 6), VX_FORMULA_UNQUOTED, -1},
      {"\377AND", VX_FORMULA_UNQUOTED, -1},
      {")", VX_FORMULA_UNMATCHED_CLOSE, -1},
      {R"~(("a")))~", VX_FORMULA_UNMATCHED_CLOSE, 5},
      {R"~(("a")) OR "b")~", VX_FORMULA_UNMATCHED_CLOSE, 6},
      {R"~((("a"))~", VX_FORMULA_UNMATCHED_OPEN, 6},
      {R"~(("a" OR ("b" )~", VX_FORMULA_UNMATCHED_OPEN, 13},
      {R"~("abc@def")~", VX_FORMULA_UNKNOWN_PREFIX, -1},
      {R"~("a" OR "Selection@x" OR "b")~", VX_FORMULA_UNKNOWN_PREFIX, 7},
      {R"~( "a")~", VX_FORMULA_OPERAND_NEEDED, 1},
      {"()", VX_FORMULA_OPERAND_NEEDED, 1},
      {R"~((OR "a"))~", VX_FORMULA_OPERAND_NEEDED, 3},
      {R"~("a""b")~", VX_FORMULA_OPERATOR_NEEDED, 3},
      {R"~(("a")("b"))~", VX_FORMULA_OPERATOR_NEEDED, 6},
      {R"~("a" "b")~", VX_FORMULA_MISSING_OPERATOR, 4},
      {R"~(("a" "b"))~", VX_FORMULA_MISSING_OPERATOR, 8},
      {R"~("a" AND "b" "c")~", VX_FORMULA_MISSING_OPERATOR, 12},
      {R"~(("a") "b")~", VX_FORMULA_MISSING_OPERATOR, 6},
      {R"~("a" AND)~", VX_FORMULA_OPERAND_EXPECTED, 7, true},
      {R"~(NOT "a")~", VX_FORMULA_OPERAND_EXPECTED, 7, true},
      {R"~("a" AND NOT "b")~", VX_FORMULA_OPERAND_EXPECTED, 15, true},
      {R"~("a" OR  OR "b")~", VX_FORMULA_OPERAND_EXPECTED, 14, true},
      // The missing operand inside the parentheses leaves ")" unread, and that decides.
      {R"~(("a" AND NOT "b"))~", VX_FORMULA_UNMATCHED_OPEN, 17, true},
      {"", VX_FORMULA_NO_TOKENS, 0, true},
  };
  for (const SFailure& row : rows) {
    SCOPED_TRACE(row.formula);
    CVXGroupParser parser;
    std::vector<SToken> tokens(1);
    SError e = parser.Parse(row.formula, tokens);
    ASSERT_EQ(e.code == VX_OK, row.parses) << e.code;
    if (row.parses) {
      const std::vector<SToken> before = tokens;
      e = parser.ConvertToStack(tokens);
      EXPECT_EQ(tokens, before);
    }
    EXPECT_EQ(e.code, row.code);
    EXPECT_EQ(e.position, row.position);
  }
}

// A parser is used again after a failure; the operand mask covers the reserved selection type
// too, which no text yields; a failed conversion's code stays for later calls on the same parser.
TEST(GroupParser, NullTextReuseAndHandMadeTokens) {
  CVXGroupParser parser;
  std::vector<SToken> tokens;
  EXPECT_EQ(parser.Parse(R"~(("a")~", tokens).code, VX_FORMULA_UNMATCHED_OPEN);
  SError e = parser.Parse(static_cast<const char*>(nullptr), tokens);
  EXPECT_EQ(e.code, VX_OK);
  EXPECT_EQ(e.position, 0);
  EXPECT_TRUE(tokens.empty());
  EXPECT_EQ(parser.Parse(R"~("a" AND "b")~", tokens).code, VX_OK);
  EXPECT_EQ(parser.ConvertToStack(tokens).code, VX_OK);
  EXPECT_EQ(Render(tokens), "c:a@3 _:@4 _:@8 c:b@8 &:AND@7");

  tokens.assign(3, SToken{});
  tokens[0].type = ttSelection, tokens[1].type = ttOr, tokens[2].type = ttResult;
  EXPECT_EQ(parser.ConvertToStack(tokens).code, VX_FORMULA_OPERAND_EXPECTED);
  tokens[2].type = ttSelection;
  EXPECT_EQ(parser.ConvertToStack(tokens).code, VX_FORMULA_OPERAND_EXPECTED);
  EXPECT_EQ(CVXGroupParser().ConvertToStack(tokens).code, VX_OK);
  EXPECT_EQ(Render(tokens), "s:@0 s:@0 |:@0");
}

// Long chains and deep nesting must neither take quadratic time nor exhaust the stack.
TEST(GroupParser, LongAndDeepFormulas) {
  std::string chain = R"~("a")~";
  for (int i = 0; i < 50000; ++i) chain += R"~( OR "b")~";
  SParsed r = ParseAndConvert(chain);
  ASSERT_EQ(r.convert.code, VX_OK);
  EXPECT_EQ(r.postfix.size(), r.infix.size());
  EXPECT_EQ(r.postfix.back().type, ttOr);

  const size_t depth = 100000;
  const std::string deep = std::string(depth, '(') + R"~("a")~" + std::string(depth, ')');
  r = ParseAndConvert(deep);
  ASSERT_EQ(r.convert.code, VX_OK);
  EXPECT_EQ(Render(r.postfix), "c:a@100003");
  EXPECT_EQ(ParseAndConvert(deep.substr(1)).parse.code, VX_FORMULA_UNMATCHED_CLOSE);
}

}  // namespace
