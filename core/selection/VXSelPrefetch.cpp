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

// One block of at most 2000 records into the current bank.
void ReadBlock() {
  SPrefetchBlock& p = gPrefetch;
  p.Event.Reset();
  const std::vector<uint32_t>& candidates = *p.Candidates;
  p.Selectors.clear();
  if (p.Position < candidates.size()) {
    size_t k = std::min(candidates.size() - p.Position, kPrefetchBankRecords);
    for (size_t i = 0; i < k; ++i) p.Selectors.emplace_back(2, candidates[p.Position++]);
    p.Result = p.Engine->GetShapeData(p.Selectors, p.Buffer + p.Bank * kPrefetchBankBytes);
    if (p.Result != VX_OK) VX_ERROR(p.Engine->LogFile(), p.Result, "Prefetch of shape records");
  }
  p.Event.Set();
}

// The reading thread: a block for each request until told to stop.
void Reader() {
  SPrefetchBlock& p = gPrefetch;
  for (;;) {
    p.Request.Wait();
    p.Request.Reset();
    if (p.Stop) return;
    ReadBlock();
  }
}

}  // namespace

SPrefetchBlock& Prefetch() { return gPrefetch; }

bool StartPrefetch(CVXEngine* engine, uint8_t* buffer, const std::vector<uint32_t>* candidates,
                   size_t position) {
  SPrefetchBlock& p = gPrefetch;
  p.Bank = (p.Bank - 1) & 1;
  p.Engine = engine;
  p.Buffer = buffer;
  p.Candidates = candidates;
  p.Position = position;
  p.Result = VX_OK;
  p.Event.Reset();
  if (!p.Reader.joinable()) {
    p.Stop = false;
    try {
      p.Reader = std::thread(Reader);
    } catch (const std::system_error&) {
      p.Result = VX_UNKNOWN_EXCEPTION;
      p.Position = candidates->size();
      p.Event.Set();
      return false;
    }
  }
  p.Request.Set();
  return true;
}

void WaitPrefetch() { gPrefetch.Event.Wait(); }

void StopPrefetch() {
  SPrefetchBlock& p = gPrefetch;
  p.Event.Wait();
  if (!p.Reader.joinable()) return;
  p.Stop = true;
  p.Request.Set();
  p.Reader.join();
  p.Request.Reset();
}
