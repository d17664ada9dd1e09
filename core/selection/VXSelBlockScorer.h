#pragma once

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <thread>
#include <vector>

#include "VXMatchInfo.h"
#include "VXSelBase.h"

// Scores a block of candidates against every original of a run at once, spread over several
// threads, for a worker whose verdict follows from the shape records alone
// (CVXSelBase::ScoresByShapesAlone). Each original is read once per block rather than once per
// candidate, so a run over many originals is bound by arithmetic, not by memory.
//
// Only the caller's thread calls the operations; the helper threads exist from construction to
// destruction and touch nothing but the block between the start and the end of ScoreBlock. The
// worker and the records must not change while the scorer lives.
class CVXSelBlockScorer {
 public:
  // `threads` counts the caller's thread; helpers are threads - 1.
  CVXSelBlockScorer(const CVXSelBase& worker, const std::vector<const SVXDBRec_3*>& originals,
                    unsigned threads);
  CVXSelBlockScorer(const CVXSelBlockScorer&) = delete;
  CVXSelBlockScorer& operator=(const CVXSelBlockScorer&) = delete;
  ~CVXSelBlockScorer();

  // A pair of a candidate and an original that Check would pass with a cut-off of 0 and whose
  // score reached the original's floor.
  struct SPass {
    uint32_t Original;
    double Score;
  };

  // Scores `candidates` against every original; their results replace the last block's.
  // `floors` holds one score per original below which the caller has no use for a pair; empty
  // means no floor.
  void ScoreBlock(const std::vector<const SVXDBRec_3*>& candidates,
                  const std::vector<double>& floors);

  size_t Candidates() const { return candidates_.size(); }
  const SVXDBRec_3* Candidate(size_t b) const { return candidates_[b].Record; }
  // Calls f(pass) for the passes of candidate b, by ascending original.
  template <typename F>
  void ForEachPass(size_t b, F f) const {
    for (const auto& part : passes_) {
      for (const SPass& pass : part[b]) f(pass);
    }
  }

 private:
  void Helper_(unsigned part);
  // Scores the originals of one part, each against every candidate of the block.
  void ScorePart_(unsigned part);

  const CVXSelBase& worker_;
  std::vector<CVXSelBase::SPreparedShape> originals_;
  std::vector<CVXSelBase::SPreparedShape> candidates_;
  const std::vector<double>* floors_ = nullptr;  // during ScoreBlock
  // passes_[part][b]: the passes of candidate b among the originals of that part.
  std::vector<std::vector<std::vector<SPass>>> passes_;
  unsigned parts_;

  std::mutex mutex_;
  std::condition_variable start_;  // a new block, or stop
  std::condition_variable done_;   // pending_ reached 0
  uint64_t generation_ = 0;        // counts the blocks
  unsigned pending_ = 0;           // helpers still scoring the current block
  bool stop_ = false;
  std::vector<std::thread> helpers_;
};
