#include "VXSelPrefetch.h"

#include <algorithm>
#include <system_error>

#include "VXEngine.h"
#include "VXLog.h"
#include "VXResult.h"

void CManualResetEvent::Set() {
  std::lock_guard<std::mutex> hold(mutex_);
  signalled_ = true;
  changed_.notify_all();
}

void CManualResetEvent::Reset() {
  std::lock_guard<std::mutex> hold(mutex_);
  signalled_ = false;
}

void CManualResetEvent::Wait() const {
  std::unique_lock<std::mutex> hold(mutex_);
  changed_.wait(hold, [this] { return signalled_; });
}

namespace {

SPrefetchBlock gPrefetch;  // constructed at library load, signalled

// A block is read in slices of this many records. Each read holds the engine's lock, which the
// candidate loop takes twice per candidate to read the catalog: a whole block at once would stop
// the loop for as long as the read lasts, and the two threads would take turns instead of
// overlapping.
constexpr size_t kReadSlice = 200;

// Reads the selectors into `bank`, slice by slice; the first failure ends the read.
unsigned ReadSlices(CVXEngine& engine, const std::vector<CQRLBlobDB::SSelector>& selectors,
                    uint8_t* bank) {
  std::vector<CQRLBlobDB::SSelector> slice;
  for (size_t at = 0; at < selectors.size(); at += kReadSlice) {
    const size_t end = std::min(selectors.size(), at + kReadSlice);
    slice.assign(selectors.begin() + static_cast<ptrdiff_t>(at),
                 selectors.begin() + static_cast<ptrdiff_t>(end));
    if (unsigned rc = engine.GetShapeData(slice, bank + at * kShapeRecordBytes); rc != VX_OK) {
      return rc;
    }
  }
  return VX_OK;
}

// The reading thread: one block of at most 2000 records into the current bank.
void ReadBlock() {
  SPrefetchBlock& p = gPrefetch;
  p.Event.Reset();
  const std::vector<uint32_t>& candidates = *p.Candidates;
  p.Selectors.clear();
  if (p.Position < candidates.size()) {
    size_t k = std::min(candidates.size() - p.Position, kPrefetchBankRecords);
    for (size_t i = 0; i < k; ++i) p.Selectors.emplace_back(2, candidates[p.Position++]);
    p.Result = ReadSlices(*p.Engine, p.Selectors, p.Buffer + p.Bank * kPrefetchBankBytes);
    if (p.Result != VX_OK) VX_ERROR(p.Engine->LogFile(), p.Result, "Prefetch of shape records");
  }
  p.Event.Set();
}

}  // namespace

SPrefetchBlock& Prefetch() { return gPrefetch; }

bool StartPrefetch(CVXEngine* engine, uint8_t* buffer, const std::vector<uint32_t>* candidates,
                   size_t position) {
  SPrefetchBlock& p = gPrefetch;
  if (p.Reader.joinable()) p.Reader.join();  // it has signalled: the caller waited
  p.Bank = (p.Bank - 1) & 1;
  p.Engine = engine;
  p.Buffer = buffer;
  p.Candidates = candidates;
  p.Position = position;
  p.Result = VX_OK;
  p.Event.Reset();
  try {
    p.Reader = std::thread(ReadBlock);
  } catch (const std::system_error&) {
    p.Result = VX_UNKNOWN_EXCEPTION;
    p.Position = candidates->size();
    p.Event.Set();
    return false;
  }
  return true;
}

void WaitPrefetch() {
  SPrefetchBlock& p = gPrefetch;
  p.Event.Wait();
  if (p.Reader.joinable()) p.Reader.join();
}
