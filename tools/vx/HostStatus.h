#pragma once

#include <string>
#include <utility>

namespace vxhost {

// Outcome of a host-side step (decoding, reading metadata, walking folders). The host reports
// these per file and carries on; nothing here throws.
class HostStatus {
 public:
  enum Code {
    kOk = 0,
    kIoError,       // missing, unreadable or unwritable file or directory
    kUnsupported,   // not a format we can read
    kCorrupt,       // a known format whose data is damaged or truncated
    kTooLarge,      // refused before decoding: more pixels than the limit
    kInvalidInput,  // bad arguments from the caller
  };

  HostStatus() = default;
  HostStatus(Code code, std::string message) : code_(code), message_(std::move(message)) {}

  static HostStatus Ok() { return HostStatus(); }
  // kIoError with "<path>: <strerror(err)>".
  static HostStatus IoError(const std::string& path, int err);
  // Ok when `path` is a regular file (or a link to one) that we may open for reading.
  static HostStatus CheckReadable(const std::string& path);

  bool ok() const { return code_ == kOk; }
  Code code() const { return code_; }
  const std::string& message() const { return message_; }
  // "corrupt: <message>", for a report line.
  std::string ToString() const;
  static const char* CodeName(Code code);

 private:
  Code code_ = kOk;
  std::string message_;
};

}  // namespace vxhost
