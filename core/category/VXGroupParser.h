#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "VXBase.h"

// Element kinds of a category formula. The values are stored in category records, so they never
// change. The two masks below must agree with them.
enum ETokenType : uint32_t {
  ttEnd = 1,  // no token: start or end of input, or not yet classified
  ttCategory = 2,
  ttFolder = 4,
  ttRFolder = 8,     // a folder and all folders below it
  ttSelection = 16,  // reserved operand: no text yields it
  ttPersSel = 32,
  ttAnd = 256,
  ttOr = 512,
  ttNot = 1024,  // binary: left minus right
  ttOpen = 4096,
  ttClose = 8192,
  ttResult = 16384,  // only inside evaluation, never in a token list
  ttSpace = 32768,   // one white-space character, kept to print the formula back
  ttUnassigned = 65536,
  ttRating = 262144,
  ttLabel = 524288,
};

constexpr uint32_t kTokenOperandMask = 0xD003E;
constexpr uint32_t kTokenOperatorMask = 0x700;

// Modifier bits in SToken::flags of a ttCategory token.
enum : uint32_t {
  tfNoRecurse = 1,  // the category's own assigned files only
  tfDistinct = 2,   // files in this category and in no other
};

// Result codes of formula handling. The parser raises 15000 to 15009 and 15015; the others belong
// to the category object and are listed here so that the range stands in one place.
enum : unsigned {
  VX_FORMULA_OPERAND_EXPECTED =
      15000,                        // an operand or "(" needed; also an irreducible postfix list
  VX_FORMULA_EMPTY_TOKEN = 15001,   // empty token, or "" with nothing between the quotes
  VX_FORMULA_UNKNOWN_BYTE = 15002,  // a one-byte token that is nothing known
  VX_FORMULA_UNQUOTED = 15003,      // an unquoted word, or a string without its closing quote
  VX_FORMULA_UNMATCHED_CLOSE = 15004,
  VX_FORMULA_UNMATCHED_OPEN = 15005,
  VX_FORMULA_UNKNOWN_PREFIX = 15006,  // unknown prefix before "@"
  VX_FORMULA_NO_TOKENS = 15007,
  VX_FORMULA_OPERAND_NEEDED = 15008,   // at the start, after an operator or "("
  VX_FORMULA_OPERATOR_NEEDED = 15009,  // after an operand or ")"
  VX_FORMULA_NO_CATEGORY = 15010,
  VX_FORMULA_NO_FOLDER = 15011,
  VX_FORMULA_NO_PERSSEL = 15012,
  VX_FORMULA_OPERAND_FAILED = 15013,
  VX_FORMULA_CIRCULAR = 15014,          // circular reference, or the category is in error
  VX_FORMULA_MISSING_OPERATOR = 15015,  // two operands with no operator between them
};

// Outcome of a parser step: a result code and the byte offset into the formula where it was
// found, -1 when none applies.
struct SError {
  uint32_t code;
  int32_t position;
};

// One element of a formula, infix or postfix.
struct SToken {
  uint32_t type = ttEnd;  // an ETokenType value
  std::string text;       // operand text without quotes and prefix; operators in upper case
  uint32_t reserved = 0;  // always 0
  // Offset of the first byte behind the token. The last token of a formula keeps the value of
  // the one before it (0 when it is the only one).
  uint32_t position = 0;
  uint32_t flags = 0;  // tfNoRecurse, tfDistinct
  std::string extra;   // always empty
  bool operator==(const SToken&) const = default;
};

// Turns formula text into a token list (Parse) and that list into postfix order
// (ConvertToStack). It never resolves a name. One object serves one formula: Parse, then
// ConvertToStack on the same object. Failures come back as code and position; nothing is thrown,
// and bad text of any length or encoding gives a code, never a crash.
//
// The grammar has no precedence: AND, OR and NOT rank alike and group from the left, and NOT is
// binary (a NOT b is a minus b).
class CVXGroupParser : public CVXBase {
 public:
  CVXGroupParser() = default;
  CVXGroupParser(const CVXGroupParser&) = default;
  CVXGroupParser& operator=(const CVXGroupParser&) = default;
  ~CVXGroupParser() override = default;

  // Fills `tokens` (emptied first) with the infix list, white space included. On success the
  // position is the length of the text. A null text reads as empty. On failure `tokens` holds
  // what was taken before the fault.
  SError Parse(const std::string& text, std::vector<SToken>& tokens);
  SError Parse(const char* text, std::vector<SToken>& tokens);

  // Replaces `tokens` by the postfix list; white space stays where it stands, parentheses go.
  // On failure `tokens` is untouched. Does not reset code or position, so a fault here reports
  // the position left by Parse.
  SError ConvertToStack(std::vector<SToken>& tokens);

 protected:
  // Cuts the next raw token into `part`; returns the cursor behind it. Stops at a zero byte.
  const char* NextPart(const char* cursor, std::string& part);
  // Classifies token.text into token.type, rewriting the text; false with the code set.
  bool MatchTokenType(SToken& token);
  // Tests the token against its predecessor and keeps the parenthesis depth.
  bool CheckToken(const SToken& token);
  bool Tokenize(const char* text, std::vector<SToken>& tokens);

  bool NextStackToken();
  void Expression();
  bool Factor();
  // The grammar has no precedence level between expression and factor.
  void Term() {}

 private:
  bool MatchOperand(SToken& token);
  bool OperatorTest(const SToken& token, const std::vector<SToken>& taken);
  bool AcceptToken(SToken& token, const std::vector<SToken>& taken);
  void CopySpaces();
  bool Fail(uint32_t code);  // sets the code; always false
  SError Result() const { return {code_, position_}; }

  uint32_t code_ = 10001;
  int32_t position_ = -1;
  // Tokens still to be read by the conversion, in reverse order: the next one is at the back.
  std::vector<SToken> pending_;
  size_t readMark_ = 0;  // start of the vector handed to ConvertToStack
  SToken current_;       // type ttEnd when none is there
  std::vector<SToken> output_;
  uint32_t prevType_ = ttEnd;  // type of the token before; after white space anything may follow
  int32_t depth_ = 0;
  bool operandExpected_ = false;  // set by an operator or "(", kept across white space
};
