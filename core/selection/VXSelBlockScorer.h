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

  // Scores `candidates` against every original; their results replace the last block's.
  void ScoreBlock(const std::vector<const SVXDBRec_3*>& candidates);

  size_t Candidates() const { return candidates_.size(); }
  const SVXDBRec_3* Candidate(size_t b) const { return candidates_[b].Record; }
  // The verdict of the worker on candidate b and original i, before any cut-off.
  bool Passed(size_t b, size_t i) const { return passed_[b * originals_.size() + i] != 0; }
  double Score(size_t b, size_t i) const { return scores_[b * originals_.size() + i]; }

 private:
  void Helper_(unsigned part);
  // Scores the originals of one part, each against every candidate of the block.
  void ScorePart_(unsigned part);

  const CVXSelBase& worker_;
  std::vector<CVXSelBase::SPreparedShape> originals_;
  std::vector<CVXSelBase::SPreparedShape> candidates_;
  std::vector<double> scores_;   // original-major
  std::vector<uint8_t> passed_;  // likewise
  unsigned parts_;

  std::mutex mutex_;
  std::condition_variable start_;  // a new block, or stop
  std::condition_variable done_;   // pending_ reached 0
  uint64_t generation_ = 0;        // counts the blocks
  unsigned pending_ = 0;           // helpers still scoring the current block
  bool stop_ = false;
  std::vector<std::thread> helpers_;
};
