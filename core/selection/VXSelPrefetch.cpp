#include "VXSelPrefetch.h"

#include <algorithm>
#include <system_error>

#include "VXEngine.h"
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

// The reading thread: one block of at most 2000 records into the current bank.
void ReadBlock() {
  SPrefetchBlock& p = gPrefetch;
  p.Event.Reset();
  const std::vector<uint32_t>& candidates = *p.Candidates;
  p.Selectors.clear();
  if (p.Position < candidates.size()) {
    size_t k = std::min(candidates.size() - p.Position, kPrefetchBankRecords);
    for (size_t i = 0; i < k; ++i) p.Selectors.emplace_back(2, candidates[p.Position++]);
    p.Result = p.Engine->GetShapeData(p.Selectors, p.Buffer + p.Bank * kPrefetchBankBytes);
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
