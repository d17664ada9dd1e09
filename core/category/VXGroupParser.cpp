#include "VXGroupParser.h"

#include <cstring>
#include <iterator>
#include <utility>

#include "VXResult.h"
#include "xstring.h"

namespace {

bool IsOperand(uint32_t type) { return (type & kTokenOperandMask) != 0; }
bool IsOperator(uint32_t type) { return (type & kTokenOperatorMask) != 0; }
bool IsBlank(char c) { return c == '\t' || c == '\n' || c == '\r' || c == ' '; }

int32_t Offset(const char* cursor, const char* text) { return static_cast<int32_t>(cursor - text); }

// How a row of the operand table tests the quoted text (quotes already removed).
enum class EMatch {
  kPrefix,  // the text up to and including the first "@"
  kWhole,   // the whole text
  kBegins,  // the first characters of the text, as many as the key has
};

struct SOperandRow {
  EMatch how;
  const char* key;
  uint32_t type;
  uint32_t flag;
};

// Tried from the top; the first row that fits decides. All keys are ASCII, so a key's length in
// bytes is its length in characters.
constexpr SOperandRow kOperandRows[] = {
    {EMatch::kPrefix, "Category@", ttCategory, 0},
    {EMatch::kPrefix, "CatNoRecurse@", ttCategory, tfNoRecurse},
    {EMatch::kPrefix, "CatDistinct@", ttCategory, tfDistinct},
    {EMatch::kPrefix, "Folder@", ttFolder, 0},
    {EMatch::kPrefix, "RFolder@", ttRFolder, 0},
    {EMatch::kWhole, "@Unassigned", ttUnassigned, 0},
    {EMatch::kBegins, "@Rating", ttRating, 0},
    {EMatch::kBegins, "@Label", ttLabel, 0},
    {EMatch::kPrefix, "PersSel@", ttPersSel, 0},
};

bool RowFits(const SOperandRow& row, const std::string& text, const std::string& prefix) {
  switch (row.how) {
    case EMatch::kPrefix:
      return _mbsicmp(prefix.c_str(), row.key) == 0;
    case EMatch::kWhole:
      return _mbsicmp(text.c_str(), row.key) == 0;
    case EMatch::kBegins:
      return _mbsnicmp(text.c_str(), row.key, std::strlen(row.key)) == 0;
  }
  return false;
}

struct SOperator {
  const char* word;
  uint32_t type;
};
constexpr SOperator kOperators[] = {{"AND", ttAnd}, {"OR", ttOr}, {"NOT", ttNot}};

}  // namespace

SError CVXGroupParser::Parse(const std::string& text, std::vector<SToken>& tokens) {
  return Parse(text.c_str(), tokens);
}

SError CVXGroupParser::Parse(const char* text, std::vector<SToken>& tokens) {
  code_ = VX_OK;
  position_ = -1;
  Tokenize(text ? text : "", tokens);
  return Result();
}

SError CVXGroupParser::ConvertToStack(std::vector<SToken>& tokens) {
  if (tokens.empty()) {
    code_ = VX_FORMULA_NO_TOKENS;
    return Result();
  }
  pending_.assign(tokens.rbegin(), tokens.rend());
  readMark_ = 0;
  output_.clear();
  NextStackToken();
  // More than one expression only when two stand side by side without an operator, as in
  // "a" ("b"); the list is then not reducible and evaluation reports it.
  while (code_ == VX_OK && current_.type != ttEnd) Expression();
  if (code_ == VX_OK) tokens = output_;
  return Result();
}

// Quotes have no escape and multi-byte sequences are not recognised: every byte that matters
// here is ASCII, and a UTF-8 sequence never contains one.
const char* CVXGroupParser::NextPart(const char* cursor, std::string& part) {
  part.clear();
  bool inQuotes = false;
  for (; *cursor != '\0'; ++cursor) {
    const char c = *cursor;
    const bool single = IsBlank(c) || c == '(' || c == ')';
    if (single && !inQuotes) {
      if (!part.empty()) return cursor;
      if (c != '\r') {
        part = c;
        return cursor + 1;
      }
      // CR and CR LF are one line end, kept as a single line feed.
      part = '\n';
      return cursor[1] == '\n' ? cursor + 2 : cursor + 1;
    }
    if (c == '"') {
      if (!part.empty() && !inQuotes) return cursor;
      inQuotes = !inQuotes;
      part += c;
      if (!inQuotes) return cursor + 1;
      continue;
    }
    part += c;
  }
  return cursor;
}

bool CVXGroupParser::MatchTokenType(SToken& token) {
  token.type = ttEnd;
  std::string& text = token.text;
  if (text.empty()) return Fail(VX_FORMULA_EMPTY_TOKEN);
  for (const SOperator& op : kOperators) {
    if (_mbsicmp(text.c_str(), op.word) == 0) {
      text = _mbsupr(text);
      token.type = op.type;
      return true;
    }
  }
  if (text == "(" || text == ")") {
    token.type = text == "(" ? ttOpen : ttClose;
    return true;
  }
  if (text == " " || text == "\t" || text == "\n") {
    token.type = ttSpace;
    return true;
  }
  if (text.size() < 2) return Fail(VX_FORMULA_UNKNOWN_BYTE);
  if (text.front() != '"' || text.back() != '"') return Fail(VX_FORMULA_UNQUOTED);
  text = text.substr(1, text.size() - 2);
  if (text.empty()) return Fail(VX_FORMULA_EMPTY_TOKEN);
  return MatchOperand(token);
}

// A name without "@" is a category; otherwise the prefix up to the first "@" says what the rest
// names. A category whose name holds "@" is reached only through "Category@".
bool CVXGroupParser::MatchOperand(SToken& token) {
  std::string& text = token.text;
  const size_t at = text.find('@');
  if (at == std::string::npos) {
    token.type = ttCategory;
    return true;
  }
  const std::string prefix = text.substr(0, at + 1);
  for (const SOperandRow& row : kOperandRows) {
    if (!RowFits(row, text, prefix)) continue;
    token.type = row.type;
    token.flags |= row.flag;
    text.erase(0, at + 1);
    Trim(text, xstLeft);
    return true;
  }
  if (prefix == "@") {  // a system category such as "@All", kept whole
    token.type = ttCategory;
    return true;
  }
  return Fail(VX_FORMULA_UNKNOWN_PREFIX);
}

bool CVXGroupParser::CheckToken(const SToken& token) {
  if (token.type == ttOpen) ++depth_;
  if (token.type == ttClose && --depth_ < 0) return Fail(VX_FORMULA_UNMATCHED_CLOSE);
  const uint32_t prev = prevType_;
  uint32_t allowed = ~0u;  // after white space anything may follow
  uint32_t failure = VX_FORMULA_OPERAND_NEEDED;
  if (prev == ttEnd) {
    allowed = kTokenOperatorMask | ttOpen | kTokenOperandMask;
  } else if (IsOperand(prev) || prev == ttClose) {
    allowed = ttClose | kTokenOperatorMask | ttSpace;
    failure = VX_FORMULA_OPERATOR_NEEDED;
  } else if (IsOperator(prev) || prev == ttOpen) {
    allowed = ttOpen | kTokenOperandMask | ttSpace;
  }
  if ((token.type & allowed) == 0) code_ = failure;
  prevType_ = token.type;
  return code_ == VX_OK;
}

// White space hides a predecessor from CheckToken, so two operands in a row are caught here: the
// nearest earlier operand or "(" must have been followed by an operator or be "(" itself.
bool CVXGroupParser::OperatorTest(const SToken& token, const std::vector<SToken>& taken) {
  if (!IsOperand(token.type)) return true;
  for (auto it = taken.rbegin(); it != taken.rend(); ++it) {
    if (IsOperand(it->type) || it->type == ttOpen) {
      return operandExpected_ || Fail(VX_FORMULA_MISSING_OPERATOR);
    }
  }
  return true;
}

bool CVXGroupParser::AcceptToken(SToken& token, const std::vector<SToken>& taken) {
  return MatchTokenType(token) && CheckToken(token) && OperatorTest(token, taken);
}

// The loop always holds one raw token in `part` with the cursor behind it, so that it knows when
// the part is the last token: that one keeps the position of the token before it. The template
// token's flags are never cleared, so a modifier carries over to every later token of the
// formula; stored formulas depend on that.
bool CVXGroupParser::Tokenize(const char* text, std::vector<SToken>& tokens) {
  tokens.clear();
  depth_ = 0;
  operandExpected_ = false;
  prevType_ = ttEnd;
  SToken token;
  std::string part;
  const char* cursor = NextPart(text, part);
  while (code_ == VX_OK && *cursor != '\0') {
    token.text = part;
    if (!MatchTokenType(token)) break;
    position_ = Offset(cursor, text);
    if (!CheckToken(token) || !OperatorTest(token, tokens)) break;
    token.position = static_cast<uint32_t>(position_);
    tokens.push_back(token);
    cursor = NextPart(cursor, part);
    if (IsOperator(token.type) || token.type == ttOpen) {
      operandExpected_ = true;
    } else if (token.type != ttSpace) {
      operandExpected_ = false;
    }
  }
  if (code_ == VX_OK && !part.empty()) {
    token.text = part;
    if (AcceptToken(token, tokens)) tokens.push_back(token);
  }
  if (code_ == VX_OK) {
    position_ = Offset(cursor, text);
    if (depth_ > 0) code_ = VX_FORMULA_UNMATCHED_OPEN;
    if (depth_ < 0) code_ = VX_FORMULA_UNMATCHED_CLOSE;
  }
  return code_ == VX_OK;
}

bool CVXGroupParser::NextStackToken() {
  if (pending_.empty()) {
    current_.type = ttEnd;
    return false;
  }
  current_ = std::move(pending_.back());
  pending_.pop_back();
  return true;
}

// expression := factor { operator factor }, factor := spaces ( operand | "(" expression ")" )
// spaces. A parenthesised factor holds a whole expression; that nesting runs on an explicit
// stack rather than by recursion, so that deep parentheses cost heap, not the caller's thread
// stack. Each entry is one open expression with the operator that waits for its right factor
// (type ttEnd when none); the operator is written once that factor is complete, which gives
// left-to-right grouping with no precedence.
void CVXGroupParser::Expression() {
  std::vector<SToken> waiting(1);
  for (;;) {
    if (Factor()) {  // "(" read: a nested expression begins
      waiting.emplace_back();
      continue;
    }
    for (;;) {  // a factor of the innermost expression is complete
      CopySpaces();
      SToken& op = waiting.back();
      if (op.type != ttEnd) output_.push_back(std::exchange(op, SToken()));
      if (code_ == VX_OK && IsOperator(current_.type)) {
        op = current_;
        NextStackToken();
        break;
      }
      waiting.pop_back();
      if (waiting.empty()) return;
      // The inner expression was the content of a parenthesised factor: its ")" must follow.
      if (current_.type == ttClose) {
        NextStackToken();
      } else {
        code_ = VX_FORMULA_UNMATCHED_OPEN;
      }
    }
  }
}

// The start of a factor: its leading white space, then an operand, or "(" which opens a nested
// expression (returns true). The caller copies the trailing white space once the factor is
// complete. Anything else is 15000 and no token is read.
bool CVXGroupParser::Factor() {
  CopySpaces();
  if (IsOperand(current_.type)) {
    output_.push_back(current_);
    NextStackToken();
    return false;
  }
  if (current_.type == ttOpen) {
    NextStackToken();
    return true;
  }
  code_ = VX_FORMULA_OPERAND_EXPECTED;
  return false;
}

// White space reaches the postfix list where it stands: infix and postfix share one record type,
// and evaluation skips it.
void CVXGroupParser::CopySpaces() {
  while (current_.type == ttSpace) {
    output_.push_back(current_);
    NextStackToken();
  }
}

bool CVXGroupParser::Fail(uint32_t code) {
  code_ = code;
  return false;
}
