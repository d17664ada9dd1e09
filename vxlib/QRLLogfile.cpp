#include "QRLLogfile.h"

#include <chrono>
#include <cstdarg>
#include <cstring>
#include <ctime>

#include "VXException.h"

namespace {

const char* BaseName(const char* file) {
  if (!file) return "";
  const char* slash = std::strrchr(file, '/');
  return slash ? slash + 1 : file;
}

std::string TimeStamp() {
  auto now = std::chrono::system_clock::now();
  std::time_t t = std::chrono::system_clock::to_time_t(now);
  auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(now.time_since_epoch()) % 1000;
  std::tm tm{};
  localtime_r(&t, &tm);
  char buf[40];
  size_t n = std::strftime(buf, sizeof buf, "%Y-%m-%d %H:%M:%S", &tm);
  std::snprintf(buf + n, sizeof buf - n, ".%03d", static_cast<int>(ms.count()));
  return buf;
}

}  // namespace

CQRLLogfile::CQRLLogfile() = default;

CQRLLogfile::CQRLLogfile(const std::string& path) { Open(path); }

CQRLLogfile::~CQRLLogfile() { Close(); }

bool CQRLLogfile::Open(const std::string& path) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (file_) std::fclose(file_);
  file_ = std::fopen(path.c_str(), "a");
  return file_ != nullptr;
}

void CQRLLogfile::Close() {
  std::lock_guard<std::mutex> lock(mutex_);
  if (file_) std::fclose(file_);
  file_ = nullptr;
}

void CQRLLogfile::SetLevel(int threshold) {
  std::lock_guard<std::mutex> lock(mutex_);
  threshold_ = threshold;
}

int CQRLLogfile::Level() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return threshold_;
}

void CQRLLogfile::SetCapture(bool capture) {
  std::lock_guard<std::mutex> lock(mutex_);
  capture_ = capture;
}

std::vector<std::string> CQRLLogfile::Captured() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return captured_;
}

void CQRLLogfile::ClearCaptured() {
  std::lock_guard<std::mutex> lock(mutex_);
  captured_.clear();
}

// kind: 'I' trace, 'W' warning, 'E' error. Errors pass any threshold.
bool CQRLLogfile::Write_(char kind, int level, int line, const char* file,
                         const std::string& text) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (kind != 'E' && level > threshold_) return false;
  std::string out = TimeStamp() + " " + kind + std::to_string(level) + " ";
  if (file && *file) out += std::string(BaseName(file)) + ":" + std::to_string(line) + " ";
  out += text;
  if (file_) {
    std::fputs(out.c_str(), file_);
    std::fputc('\n', file_);
    std::fflush(file_);
  }
  if (capture_) captured_.push_back(std::move(out));
  return true;
}

bool CQRLLogfile::AddInformal(const char* text, int level, int line, const char* file) {
  return Write_('I', level, line, file, text ? text : "");
}

bool CQRLLogfile::AddFormat(const char* format, int level, int line, const char* file, ...) {
  if (!format) return false;
  va_list args;
  va_start(args, file);
  va_list copy;
  va_copy(copy, args);
  int n = std::vsnprintf(nullptr, 0, format, copy);
  va_end(copy);
  std::string text(n > 0 ? static_cast<size_t>(n) : 0, '\0');
  if (n > 0) std::vsnprintf(text.data(), text.size() + 1, format, args);
  va_end(args);
  return Write_('I', level, line, file, text);
}

bool CQRLLogfile::AddWarning(const char* text, int level, int line, const char* file) {
  return Write_('W', level, line, file, text ? text : "");
}

bool CQRLLogfile::AddError(unsigned code, const char* text, int line, const char* file) {
  std::string out = "Error " + std::to_string(code);
  if (text && *text) out += ": " + std::string(text);
  return Write_('E', 1, line, file, out);
}

bool CQRLLogfile::AddError(unsigned code, int line, const char* file) {
  return AddError(code, nullptr, line, file);
}

bool CQRLLogfile::AddError(const char* text, int line, const char* file) {
  return Write_('E', 1, line, file, text ? text : "");
}

bool CQRLLogfile::AddError(const CVXException* e, int line, const char* file) {
  if (!e) return AddError("unknown exception", line, file);
  // The default message already starts with "Error <code>"; a custom one gets the code added.
  std::string text = e->GetErrorMessage();
  std::string prefix = "Error " + std::to_string(e->GetCode());
  if (text.compare(0, prefix.size(), prefix) != 0) text = prefix + ": " + text;
  return Write_('E', 1, line, file, text);
}

bool CQRLLogfile::AddError(const std::exception& e, int line, const char* file) {
  return Write_('E', 1, line, file, std::string("Exception: ") + e.what());
}
