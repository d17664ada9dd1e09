#pragma once

#include <atomic>
#include <cstdint>
#include <cstdio>
#include <functional>
#include <mutex>
#include <string>

namespace vxhost {

// Reports the progress of a long run on a stream. On a terminal it redraws one line with a bar,
// done/total, files per second and the time left; elsewhere (a log, a pipe) it writes a plain
// line every so many files or seconds. Finish() ends with a summary line. Add() may be called
// from any number of threads; a thread that finds another one drawing does not wait for it.
class Progress {
 public:
  enum class Mode { kAuto, kTerminal, kPlain };

  struct Options {
    Mode mode = Mode::kAuto;  // kAuto: kTerminal when the stream is a terminal
    double redrawSeconds = 0.1;
    uint64_t plainEveryFiles = 1000;
    double plainEverySeconds = 5;
    int barWidth = 30;
    std::function<double()> clock;  // seconds, rising; a steady clock when empty
  };

  Progress(std::FILE* out, std::string label, uint64_t total);
  Progress(std::FILE* out, std::string label, uint64_t total, Options options);
  ~Progress();  // finishes if Finish() was not called
  Progress(const Progress&) = delete;
  Progress& operator=(const Progress&) = delete;

  void Add(uint64_t files = 1);
  // A total learnt only while running; 0 means unknown.
  void SetTotal(uint64_t total);
  // Draws the last state and the summary line; later calls do nothing.
  void Finish();

  uint64_t done() const { return done_.load(); }
  bool terminal() const { return terminal_; }

  // The redrawn line, without the carriage return: "label [####----] 12/40  3.0 files/s  0:09
  // left".
  static std::string FormatBarLine(const std::string& label, uint64_t done, uint64_t total,
                                   double elapsed, int barWidth);
  // "label: 12/40 files (30%), 3.0 files/s, 0:09 left".
  static std::string FormatPlainLine(const std::string& label, uint64_t done, uint64_t total,
                                     double elapsed);
  // "label: 40 files in 0:13, 3.0 files/s".
  static std::string FormatSummary(const std::string& label, uint64_t done, double elapsed);
  // "0:09", "12:05", "1:02:03".
  static std::string FormatDuration(double seconds);

 private:
  double Now() const;
  // Writes when due (or always with `force`); the caller holds drawMutex_.
  void Draw_(bool force);

  std::FILE* out_;
  std::string label_;
  Options options_;
  bool terminal_;
  double start_;
  std::atomic<uint64_t> done_{0};
  std::atomic<uint64_t> total_;
  std::mutex drawMutex_;
  double lastDraw_ = -1;
  uint64_t lastPlainDone_ = 0;
  bool finished_ = false;
};

}  // namespace vxhost
