#include "Progress.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <utility>

namespace vxhost {
namespace {

double SteadySeconds() {
  using namespace std::chrono;
  return duration<double>(steady_clock::now().time_since_epoch()).count();
}

std::string Printf(const char* format, auto... args) {
  char text[256];
  int n = std::snprintf(text, sizeof text, format, args...);
  return std::string(text, static_cast<size_t>(std::clamp(n, 0, int{sizeof text} - 1)));
}

double Rate(uint64_t done, double elapsed) {
  return elapsed > 0 ? static_cast<double>(done) / elapsed : 0;
}

// "  3.0 files/s  0:09 left"; the time left only when it can be estimated.
std::string RateAndRemaining(uint64_t done, uint64_t total, double elapsed, const char* sep) {
  double rate = Rate(done, elapsed);
  std::string text = Printf("%.1f files/s", rate);
  if (total > done && rate > 0) {
    text += sep + Progress::FormatDuration(static_cast<double>(total - done) / rate) + " left";
  }
  return text;
}

}  // namespace

Progress::Progress(std::FILE* out, std::string label, uint64_t total)
    : Progress(out, std::move(label), total, Options()) {}

Progress::Progress(std::FILE* out, std::string label, uint64_t total, Options options)
    : out_(out), label_(std::move(label)), options_(std::move(options)), total_(total) {
  terminal_ = options_.mode == Mode::kTerminal ||
              (options_.mode == Mode::kAuto && ::isatty(::fileno(out_)) == 1);
  start_ = Now();
}

Progress::~Progress() { Finish(); }

double Progress::Now() const { return options_.clock ? options_.clock() : SteadySeconds(); }

void Progress::Add(uint64_t files) {
  done_.fetch_add(files);
  std::unique_lock lock(drawMutex_, std::try_to_lock);
  if (lock.owns_lock() && !finished_) Draw_(false);
}

void Progress::SetTotal(uint64_t total) { total_.store(total); }

void Progress::Finish() {
  std::lock_guard lock(drawMutex_);
  if (finished_) return;
  finished_ = true;
  double elapsed = Now() - start_;
  if (terminal_) {
    Draw_(true);
    std::fputc('\n', out_);
  }
  std::fprintf(out_, "%s\n", FormatSummary(label_, done_.load(), elapsed).c_str());
  std::fflush(out_);
}

void Progress::Draw_(bool force) {
  double now = Now();
  uint64_t done = done_.load();
  uint64_t total = total_.load();
  if (terminal_) {
    if (!force && lastDraw_ >= 0 && now - lastDraw_ < options_.redrawSeconds) return;
    // "\x1b[K" clears what a longer earlier line left behind.
    std::fprintf(out_, "\r%s\x1b[K",
                 FormatBarLine(label_, done, total, now - start_, options_.barWidth).c_str());
  } else {
    bool byFiles = done - lastPlainDone_ >= options_.plainEveryFiles;
    bool byTime =
        now - std::max(lastDraw_, start_) >= options_.plainEverySeconds && done != lastPlainDone_;
    if (force || !(byFiles || byTime)) return;  // the summary stands for the final state
    std::fprintf(out_, "%s\n", FormatPlainLine(label_, done, total, now - start_).c_str());
    lastPlainDone_ = done;
  }
  lastDraw_ = now;
  std::fflush(out_);
}

std::string Progress::FormatBarLine(const std::string& label, uint64_t done, uint64_t total,
                                    double elapsed, int barWidth) {
  std::string line = label + " ";
  if (total > 0) {
    double share = std::min(1.0, static_cast<double>(done) / static_cast<double>(total));
    int filled = static_cast<int>(share * barWidth);
    line += "[" + std::string(filled, '#') + std::string(barWidth - filled, '-') + "] ";
    line += Printf("%llu/%llu", static_cast<unsigned long long>(done),
                   static_cast<unsigned long long>(total));
  } else {
    line += Printf("%llu", static_cast<unsigned long long>(done));
  }
  return line + "  " + RateAndRemaining(done, total, elapsed, "  ");
}

std::string Progress::FormatPlainLine(const std::string& label, uint64_t done, uint64_t total,
                                      double elapsed) {
  std::string line = label + ": " + Printf("%llu", static_cast<unsigned long long>(done));
  if (total > 0) {
    line += Printf("/%llu files (%d%%), ", static_cast<unsigned long long>(total),
                   static_cast<int>(std::min<uint64_t>(100, done * 100 / total)));
  } else {
    line += " files, ";
  }
  return line + RateAndRemaining(done, total, elapsed, ", ");
}

std::string Progress::FormatSummary(const std::string& label, uint64_t done, double elapsed) {
  return label + ": " + Printf("%llu files in ", static_cast<unsigned long long>(done)) +
         FormatDuration(elapsed) + Printf(", %.1f files/s", Rate(done, elapsed));
}

std::string Progress::FormatDuration(double seconds) {
  long long s = std::isfinite(seconds) && seconds > 0 ? std::llround(seconds) : 0;
  if (s >= 3600) return Printf("%lld:%02lld:%02lld", s / 3600, s / 60 % 60, s % 60);
  return Printf("%lld:%02lld", s / 60, s % 60);
}

}  // namespace vxhost
