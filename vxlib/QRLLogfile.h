#pragma once

#include <cstdio>
#include <exception>
#include <mutex>
#include <string>
#include <vector>

class CVXException;

// The log. One line per call: time stamp, level, source position and text. Lines whose level is
// above the threshold are dropped (level 1 warnings, 2 entry and exit of public operations,
// 3 steps, 4 details; errors are always written). Sinks: a file (appended), and optionally an
// in-memory list that hosts and tests can read back. Safe to call from many threads: every call
// writes its whole line under one mutex.
class CQRLLogfile {
 public:
  CQRLLogfile();
  explicit CQRLLogfile(const std::string& path);
  CQRLLogfile(const CQRLLogfile&) = delete;
  CQRLLogfile& operator=(const CQRLLogfile&) = delete;
  ~CQRLLogfile();

  // Opens (appends to) a file sink; false if it cannot be opened.
  bool Open(const std::string& path);
  void Close();
  void SetLevel(int threshold);
  int Level() const;
  // Keeps every written line in memory as well (off by default).
  void SetCapture(bool capture);
  std::vector<std::string> Captured() const;
  void ClearCaptured();

  bool AddInformal(const char* text, int level, int line, const char* file);
  bool AddFormat(const char* format, int level, int line, const char* file, ...)
      __attribute__((format(printf, 2, 6)));
  bool AddWarning(const char* text, int level, int line, const char* file);
  bool AddError(unsigned code, const char* text, int line, const char* file);
  bool AddError(unsigned code, int line, const char* file);
  bool AddError(const char* text, int line, const char* file);
  bool AddError(const CVXException* e, int line, const char* file);
  bool AddError(const std::exception& e, int line, const char* file);

 private:
  bool Write_(char kind, int level, int line, const char* file, const std::string& text);

  mutable std::mutex mutex_;
  FILE* file_ = nullptr;
  int threshold_ = 4;
  bool capture_ = false;
  std::vector<std::string> captured_;
};
