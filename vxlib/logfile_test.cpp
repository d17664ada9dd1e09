#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <regex>
#include <stdexcept>
#include <thread>

#include "QRLLogfile.h"
#include "VXException.h"
#include "VXResult.h"

namespace {

const std::string kStamp = R"(\d{4}-\d\d-\d\d \d\d:\d\d:\d\d\.\d{3} )";

std::vector<std::string> ReadLines(const std::filesystem::path& path) {
  std::ifstream in(path);
  std::vector<std::string> lines;
  for (std::string line; std::getline(in, line);) lines.push_back(line);
  return lines;
}

std::filesystem::path TempLog(const char* tag) {
  auto path = std::filesystem::temp_directory_path() /
              (std::string("vxlib_log_") + tag + "_" + std::to_string(::getpid()) + ".log");
  std::filesystem::remove(path);
  return path;
}

TEST(Logfile, EveryFormWritesOneStampedLine) {
  CQRLLogfile log;
  log.SetCapture(true);
  EXPECT_TRUE(log.AddInformal("+ VXEngine::Open", 2, 12, "/src/core/VXEngine.cpp"));
  EXPECT_TRUE(log.AddFormat("%d files in %s", 3, 0, nullptr, 42, "pics"));
  EXPECT_TRUE(log.AddWarning("disk nearly full", 1, 7, "a/b.cpp"));
  EXPECT_TRUE(log.AddError(10020u, "no record", 8, "c.cpp"));
  EXPECT_TRUE(log.AddError(10211u, 9, "c.cpp"));
  EXPECT_TRUE(log.AddError("plain failure", 10, "c.cpp"));
  CVXException e(VX_NOT_FOUND, 0, "x/VXMemFile.cpp", 5, 1);
  EXPECT_TRUE(log.AddError(&e, 11, "c.cpp"));
  e.SetErrorMessage("custom");
  EXPECT_TRUE(log.AddError(&e, 11, "c.cpp"));
  EXPECT_TRUE(log.AddError(std::runtime_error("boom"), 12, "c.cpp"));
  EXPECT_TRUE(log.AddError(static_cast<const CVXException*>(nullptr), 13, "c.cpp"));
  EXPECT_TRUE(log.AddInformal(nullptr, 2, 0, nullptr));

  const char* expected[] = {
      "I2 VXEngine.cpp:12 \\+ VXEngine::Open",
      "I3 42 files in pics",
      "W1 b.cpp:7 disk nearly full",
      "E1 c.cpp:8 Error 10020: no record",
      "E1 c.cpp:9 Error 10211",
      "E1 c.cpp:10 plain failure",
      "E1 c.cpp:11 Error 10020 \\(record or object not found\\) at VXMemFile.cpp:5",
      "E1 c.cpp:11 Error 10020: custom",
      "E1 c.cpp:12 Exception: boom",
      "E1 c.cpp:13 unknown exception",
      "I2 ",
  };
  auto lines = log.Captured();
  ASSERT_EQ(lines.size(), std::size(expected));
  for (size_t i = 0; i < lines.size(); ++i) {
    EXPECT_TRUE(std::regex_match(lines[i], std::regex(kStamp + expected[i]))) << lines[i];
  }
  log.ClearCaptured();
  EXPECT_TRUE(log.Captured().empty());
}

TEST(Logfile, ThresholdDropsTracesButNeverErrors) {
  CQRLLogfile log;
  log.SetCapture(true);
  log.SetLevel(2);
  EXPECT_TRUE(log.AddInformal("entry", 2, 1, "f.cpp"));
  EXPECT_FALSE(log.AddInformal("step", 3, 1, "f.cpp"));
  EXPECT_FALSE(log.AddFormat("detail %d", 4, 0, nullptr, 1));
  log.SetLevel(0);
  EXPECT_FALSE(log.AddWarning("warn", 1, 1, "f.cpp"));
  EXPECT_TRUE(log.AddError(10020u, 1, "f.cpp"));
  EXPECT_FALSE(log.AddFormat(nullptr, 0, 0, nullptr));
  EXPECT_EQ(log.Captured().size(), 2u);
}

TEST(Logfile, FileSinkAppendsAndCaptureIsOptional) {
  auto path = TempLog("sink");
  {
    CQRLLogfile log(path.string());
    log.AddInformal("first", 2, 1, "f.cpp");
    EXPECT_TRUE(log.Captured().empty());
  }
  CQRLLogfile log;
  ASSERT_TRUE(log.Open(path.string()));
  log.AddWarning("second", 1, 2, "f.cpp");
  log.Close();
  log.AddWarning("after close", 1, 3, "f.cpp");
  auto lines = ReadLines(path);
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_TRUE(std::regex_match(lines[0], std::regex(kStamp + "I2 f.cpp:1 first")));
  EXPECT_TRUE(std::regex_match(lines[1], std::regex(kStamp + "W1 f.cpp:2 second")));
  EXPECT_FALSE(log.Open((path / "no" / "such").string()));
  std::filesystem::remove(path);
}

TEST(Logfile, ConcurrentCallersWriteWholeLines) {
  auto path = TempLog("threads");
  CQRLLogfile log(path.string());
  log.SetCapture(true);
  constexpr int kThreads = 8, kLines = 500;
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&log, t] {
      std::string payload(100 + t, static_cast<char>('a' + t));
      for (int i = 0; i < kLines; ++i) {
        log.AddFormat("t%d n%d %s", 3, 0, nullptr, t, i, payload.c_str());
      }
    });
  }
  for (auto& th : threads) th.join();
  log.Close();
  auto lines = ReadLines(path);
  ASSERT_EQ(lines.size(), static_cast<size_t>(kThreads * kLines));
  EXPECT_EQ(log.Captured().size(), lines.size());
  std::regex whole(kStamp + R"(I3 t(\d) n(\d+) ([a-h]+))");
  std::vector<int> next(kThreads, 0);
  for (const auto& line : lines) {
    std::smatch m;
    ASSERT_TRUE(std::regex_match(line, m, whole)) << line;
    int t = std::stoi(m[1]);
    EXPECT_EQ(m[3].str(), std::string(100 + t, static_cast<char>('a' + t)));
    EXPECT_EQ(std::stoi(m[2]), next[t]++);  // each thread's lines stay in its order
  }
  std::filesystem::remove(path);
}

}  // namespace
