#include "VXSelBlockScorer.h"

CVXSelBlockScorer::CVXSelBlockScorer(const CVXSelBase& worker,
                                     const std::vector<const SVXDBRec_3*>& originals,
                                     unsigned threads)
    : worker_(worker), originals_(originals.size()), parts_(threads < 1 ? 1 : threads) {
  for (size_t i = 0; i < originals.size(); ++i) worker_.PrepareShape(*originals[i], originals_[i]);
  // A part of no originals would only cost a wake-up.
  if (parts_ > originals_.size()) parts_ = originals_.empty() ? 1 : unsigned(originals_.size());
  for (unsigned part = 1; part < parts_; ++part) {
    helpers_.emplace_back(&CVXSelBlockScorer::Helper_, this, part);
  }
}

CVXSelBlockScorer::~CVXSelBlockScorer() {
  {
    std::lock_guard<std::mutex> hold(mutex_);
    stop_ = true;
  }
  start_.notify_all();
  for (std::thread& helper : helpers_) helper.join();
}

void CVXSelBlockScorer::ScoreBlock(const std::vector<const SVXDBRec_3*>& candidates,
                                   const std::vector<double>& floors) {
  candidates_.resize(candidates.size());
  for (size_t b = 0; b < candidates.size(); ++b) {
    worker_.PrepareShape(*candidates[b], candidates_[b]);
  }
  floors_ = floors.empty() ? nullptr : &floors;
  passes_.resize(parts_);
  for (auto& part : passes_) {
    part.resize(candidates_.size());
    for (auto& passes : part) passes.clear();
  }
  {
    std::lock_guard<std::mutex> hold(mutex_);
    ++generation_;
    pending_ = parts_ - 1;
  }
  start_.notify_all();
  ScorePart_(0);
  std::unique_lock<std::mutex> hold(mutex_);
  done_.wait(hold, [this] { return pending_ == 0; });
}

void CVXSelBlockScorer::Helper_(unsigned part) {
  uint64_t seen = 0;
  for (;;) {
    {
      std::unique_lock<std::mutex> hold(mutex_);
      start_.wait(hold, [&] { return stop_ || generation_ != seen; });
      if (stop_) return;
      seen = generation_;
    }
    ScorePart_(part);
    std::lock_guard<std::mutex> hold(mutex_);
    if (--pending_ == 0) done_.notify_one();
  }
}

void CVXSelBlockScorer::ScorePart_(unsigned part) {
  const size_t n = originals_.size();
  const size_t first = n * part / parts_, end = n * (part + 1) / parts_;
  const size_t m = candidates_.size();
  std::vector<double> scores(m);
  std::vector<uint8_t> passed(m);
  std::vector<std::vector<SPass>>& passes = passes_[part];
  for (size_t i = first; i < end; ++i) {
    worker_.ScoreShapes(originals_[i], candidates_.data(), m, scores.data(), passed.data());
    const double floor = floors_ ? (*floors_)[i] : 0.0;
    for (size_t b = 0; b < m; ++b) {
      // The caller's test in the same form, so that a score that is not a number fails here too.
      if (passed[b] && scores[b] >= floor) {
        passes[b].push_back({static_cast<uint32_t>(i), scores[b]});
      }
    }
  }
}
