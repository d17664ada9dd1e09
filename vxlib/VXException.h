#pragma once

#include <string>

#include "VXBase.h"

// The library's exception. It is thrown by pointer (`throw new CVXException(...)`); whoever
// catches it owns it and deletes it. Create one with VX_THROW.
class CVXException : public CVXBase {
 public:
  CVXException(unsigned code, unsigned long extra, const char* file, int line, int flag);
  CVXException(const CVXException&) = default;
  CVXException& operator=(const CVXException&) = default;
  ~CVXException() override = default;

  unsigned GetCode() const { return code_; }
  unsigned long GetExtra() const { return extra_; }
  const char* GetFile() const { return file_.c_str(); }
  int GetLine() const { return line_; }
  int GetFlag() const { return flag_; }
  // "Error 10020 (record or object not found) at VXMemFile.cpp:42", or the text given with
  // SetErrorMessage.
  std::string GetErrorMessage() const;
  void SetErrorMessage(std::string text) { message_ = std::move(text); }

  // Text of a result code, as used in log lines; empty for codes without one.
  static const char* CodeText(unsigned code);

 private:
  unsigned code_;
  unsigned long extra_;
  std::string file_;
  int line_;
  int flag_;
  std::string message_;
};

// Throws a new CVXException with the code and the current source position.
#define VX_THROW(code) throw new CVXException((code), 0, __FILE__, __LINE__, 1)
