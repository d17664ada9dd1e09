#include "JsonWriter.h"

#include <charconv>
#include <cmath>

namespace vxhost {
namespace {

// Length of the valid UTF-8 sequence at s[i], 0 when the byte there does not start one.
size_t Utf8Length(std::string_view s, size_t i) {
  auto byte = [&](size_t k) { return static_cast<unsigned char>(s[k]); };
  unsigned char c = byte(i);
  size_t n = c < 0x80                 ? 1
             : c >= 0xC2 && c <= 0xDF ? 2
             : c >= 0xE0 && c <= 0xEF ? 3
             : c >= 0xF0 && c <= 0xF4 ? 4
                                      : 0;
  if (n == 0 || i + n > s.size()) return 0;
  for (size_t k = 1; k < n; ++k) {
    if ((byte(i + k) & 0xC0) != 0x80) return 0;
  }
  // Overlong forms, surrogates and code points above U+10FFFF.
  if (n == 3 && ((c == 0xE0 && byte(i + 1) < 0xA0) || (c == 0xED && byte(i + 1) >= 0xA0))) {
    return 0;
  }
  if (n == 4 && ((c == 0xF0 && byte(i + 1) < 0x90) || (c == 0xF4 && byte(i + 1) >= 0x90))) {
    return 0;
  }
  return n;
}

}  // namespace

JsonWriter::JsonWriter(std::ostream& out, bool pretty) : out_(out), pretty_(pretty) {}

std::string JsonWriter::Quote(std::string_view text) {
  static const char kHex[] = "0123456789abcdef";
  std::string out = "\"";
  for (size_t i = 0; i < text.size();) {
    unsigned char c = static_cast<unsigned char>(text[i]);
    size_t n = Utf8Length(text, i);
    if (n == 0) {
      out += "\xEF\xBF\xBD";
      ++i;
      continue;
    }
    if (c == '"' || c == '\\') {
      out += '\\';
      out += static_cast<char>(c);
    } else if (c == '\n') {
      out += "\\n";
    } else if (c == '\t') {
      out += "\\t";
    } else if (c == '\r') {
      out += "\\r";
    } else if (c < 0x20 || c == 0x7F) {
      out += "\\u00";
      out += kHex[c >> 4];
      out += kHex[c & 15];
    } else {
      out.append(text.substr(i, n));
    }
    i += n;
  }
  return out + "\"";
}

void JsonWriter::Prefix_() {
  if (afterKey_) {
    afterKey_ = false;
    return;
  }
  if (empty_.empty()) return;
  if (!empty_.back()) out_ << ',';
  empty_.back() = false;
  if (pretty_) out_ << '\n' << std::string(2 * empty_.size(), ' ');
}

JsonWriter& JsonWriter::Open_(char bracket) {
  Prefix_();
  out_ << bracket;
  empty_.push_back(true);
  return *this;
}

JsonWriter& JsonWriter::Close_(char bracket) {
  bool wasEmpty = empty_.empty() || empty_.back();
  if (!empty_.empty()) empty_.pop_back();
  if (pretty_ && !wasEmpty) out_ << '\n' << std::string(2 * empty_.size(), ' ');
  out_ << bracket;
  if (pretty_ && empty_.empty()) out_ << '\n';
  return *this;
}

JsonWriter& JsonWriter::BeginObject() { return Open_('{'); }
JsonWriter& JsonWriter::EndObject() { return Close_('}'); }
JsonWriter& JsonWriter::BeginArray() { return Open_('['); }
JsonWriter& JsonWriter::EndArray() { return Close_(']'); }

JsonWriter& JsonWriter::Key(std::string_view name) {
  Prefix_();
  out_ << Quote(name) << (pretty_ ? ": " : ":");
  afterKey_ = true;
  return *this;
}

JsonWriter& JsonWriter::String(std::string_view value) { return Write_(Quote(value)); }
JsonWriter& JsonWriter::Int(int64_t value) { return Write_(value); }
JsonWriter& JsonWriter::UInt(uint64_t value) { return Write_(value); }
JsonWriter& JsonWriter::Bool(bool value) { return Write_(value ? "true" : "false"); }
JsonWriter& JsonWriter::Null() { return Write_("null"); }

JsonWriter& JsonWriter::Double(double value) {
  if (!std::isfinite(value)) return Null();
  char text[32];
  auto result = std::to_chars(text, text + sizeof text, value);  // shortest exact form
  return Write_(std::string_view(text, static_cast<size_t>(result.ptr - text)));
}

}  // namespace vxhost
