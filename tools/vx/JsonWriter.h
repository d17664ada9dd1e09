#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

namespace vxhost {

// Writes JSON to a stream as it goes, for --json output: commas, nesting and escaping are its
// business, the order of calls the caller's. Strings are written as valid UTF-8 whatever they
// hold: a byte that is not part of a valid sequence (file names may hold any byte) becomes
// U+FFFD. Non-finite numbers become null.
class JsonWriter {
 public:
  explicit JsonWriter(std::ostream& out, bool pretty = false);

  JsonWriter& BeginObject();
  JsonWriter& EndObject();
  JsonWriter& BeginArray();
  JsonWriter& EndArray();
  // Inside an object, before each value.
  JsonWriter& Key(std::string_view name);

  JsonWriter& String(std::string_view value);
  JsonWriter& Int(int64_t value);
  JsonWriter& UInt(uint64_t value);
  JsonWriter& Double(double value);
  JsonWriter& Bool(bool value);
  JsonWriter& Null();

  // The JSON string literal for `text`, quotes included.
  static std::string Quote(std::string_view text);

 private:
  // Separator and indentation before a value or a key.
  void Prefix_();
  JsonWriter& Open_(char bracket);
  JsonWriter& Close_(char bracket);
  template <typename T>
  JsonWriter& Write_(const T& text) {
    Prefix_();
    out_ << text;
    return *this;
  }

  std::ostream& out_;
  bool pretty_;
  std::vector<bool> empty_;  // per open level: nothing written in it yet
  bool afterKey_ = false;
};

}  // namespace vxhost
