#pragma once

// Helpers shared by the tests: a scratch directory removed at the end, and reading back what the
// log captured.

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "QRLLogfile.h"

namespace vxtest {

// A fresh directory under the system's temporary directory, removed with its content.
class TempDir {
 public:
  TempDir() {
    std::string pattern = (std::filesystem::temp_directory_path() / "vxtest-XXXXXX").string();
    path_ = mkdtemp(pattern.data());
  }
  ~TempDir() {
    std::error_code ec;
    std::filesystem::remove_all(path_, ec);
  }
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;
  std::string operator/(const std::string& name) const { return (path_ / name).string(); }
  const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

// A log at the most detailed level that keeps its lines in memory.
class CapturedLog : public CQRLLogfile {
 public:
  CapturedLog() {
    SetLevel(4);
    SetCapture(true);
  }
  // Number of captured lines that contain `text`.
  size_t Count(const std::string& text) const {
    auto lines = Captured();
    return std::count_if(lines.begin(), lines.end(),
                         [&](const std::string& l) { return l.find(text) != std::string::npos; });
  }
  bool Has(const std::string& text) const { return Count(text) > 0; }
  // Lines that end with `text` exactly (the log's own prefix stands before it).
  bool HasLine(const std::string& text) const {
    for (const auto& l : Captured()) {
      if (l.size() >= text.size() && l.compare(l.size() - text.size(), text.size(), text) == 0) {
        return true;
      }
    }
    return false;
  }
};

inline void WriteFile(const std::string& path, const std::string& bytes) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << bytes;
}

inline std::string ReadFile(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

}  // namespace vxtest
