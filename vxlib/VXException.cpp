#include "VXException.h"

#include <cstring>

#include "VXResult.h"

CVXException::CVXException(unsigned code, unsigned long extra, const char* file, int line,
                           int flag)
    : code_(code), extra_(extra), file_(file ? file : ""), line_(line), flag_(flag) {}

const char* CVXException::CodeText(unsigned code) {
  switch (code) {
    case VX_NEUTRAL_FAILURE: return "failed";
    case VX_OK: return "success";
    case VX_UNKNOWN_EXCEPTION: return "unknown exception";
    case VX_FRAMEWORK_EXCEPTION: return "framework exception";
    case VX_DISK_FULL: return "too little disk space";
    case VX_CHECKSUM: return "checksum failure";
    case VX_NO_FILE_OID: return "no file OID";
    case VX_NOT_FOUND: return "record or object not found";
    case VX_RANGE: return "index out of range";
    case VX_SHARING_VIOLATION: return "store file held by another user";
    case VX_NOT_MUTABLE: return "engine not mutable";
    case VX_NOT_OPEN: return "engine not open";
    default: return "";
  }
}

std::string CVXException::GetErrorMessage() const {
  if (!message_.empty()) return message_;
  std::string text = "Error " + std::to_string(code_);
  if (const char* what = CodeText(code_); *what) text += std::string(" (") + what + ")";
  if (!file_.empty()) {
    const char* base = std::strrchr(file_.c_str(), '/');
    text += " at " + std::string(base ? base + 1 : file_.c_str()) + ":" + std::to_string(line_);
  }
  return text;
}
