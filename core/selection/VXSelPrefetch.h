#pragma once

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <thread>
#include <vector>

#include "QRLBlobDB.h"

class CVXEngine;

// A manual-reset event: Set lets every waiter through until Reset.
class CManualResetEvent {
 public:
  explicit CManualResetEvent(bool signalled) : signalled_(signalled) {}
  void Set();
  void Reset();
  void Wait() const;

 private:
  mutable std::mutex mutex_;
  mutable std::condition_variable changed_;
  bool signalled_;
};

// Shape records are read ahead of the selection loop, up to 2000 at a time, into one of two banks
// while the loop scores from the other.
constexpr size_t kPrefetchBankRecords = 2000;
constexpr size_t kShapeRecordBytes = 1601;
constexpr size_t kPrefetchBankBytes = kPrefetchBankRecords * kShapeRecordBytes;

// The one prefetch of the process, shared by every selection engine: two runs must not
// overlap. Event is the only synchronisation of the block: while it is reset the reading thread
// owns Bank, Position, Result, Selectors and the bank it fills; the loop touches them only after
// Wait returned.
//
// One reading thread serves a run from its first block to StopPrefetch, woken through Request
// for each block: starting a thread for every block put the start-up latency of a thread
// (about 0.3 ms here) between any two reads, and the reads are what a run waits for.
struct SPrefetchBlock {
  CVXEngine* Engine = nullptr;
  int Bank = 1;
  uint8_t* Buffer = nullptr;                          // both banks; owned by the run
  const std::vector<uint32_t>* Candidates = nullptr;  // read only
  size_t Position = 0;                                // next candidate to read
  unsigned Result = 10001;
  std::vector<CQRLBlobDB::SSelector> Selectors;  // the block just read
  CManualResetEvent Event{true};
  CManualResetEvent Request{false};  // a block to read, or Stop
  bool Stop = false;                 // set with Request: the thread ends
  std::thread Reader;
};

// The process's block, made at library load.
SPrefetchBlock& Prefetch();

// Flips the bank and has the next block of `candidates` from `position` read into it.
// False (Result 10002, the event signalled) when no thread could be started.
bool StartPrefetch(CVXEngine* engine, uint8_t* buffer, const std::vector<uint32_t>* candidates,
                   size_t position);

// Waits until the block under way is read; the block is then the caller's.
void WaitPrefetch();

// Waits for the block under way and ends the reading thread: nothing touches the banks after.
void StopPrefetch();
