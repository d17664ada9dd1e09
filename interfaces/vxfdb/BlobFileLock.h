#pragma once

#include <sys/types.h>
#include <string>

// The exclusive lock that keeps a store file to one opener: flock(LOCK_EX | LOCK_NB) on a
// descriptor of the file, held until Release. Internal to the blob store; not installed.
//
// Within this process a table of held files (device, inode) answers a second opener before it
// opens a descriptor of its own. That matters because closing any descriptor of a file drops
// every POSIX record lock the process holds on it, SQLite's included; so a descriptor is only
// ever opened and closed on a file that no store of this process holds.
//
// The lock follows the inode: after the file is replaced by rename, a lock taken on the new file
// beforehand keeps covering the path.
class CBlobFileLock {
 public:
  CBlobFileLock() = default;
  CBlobFileLock(const CBlobFileLock&) = delete;
  CBlobFileLock& operator=(const CBlobFileLock&) = delete;
  CBlobFileLock(CBlobFileLock&& other) noexcept;
  CBlobFileLock& operator=(CBlobFileLock&& other) noexcept;
  ~CBlobFileLock() { Release(); }

  // Opens `path` (read-write when `writable`, created when `create`) and locks it. 10001; 10211
  // when another opener holds it, here or in another process, at once and without waiting;
  // 10020 when the file cannot be opened. On failure nothing is held.
  unsigned Acquire(const std::string& path, bool writable, bool create);
  // Unlocks and closes the descriptor. Call it only after every other user of the file in this
  // process (the SQLite connection) has closed it.
  void Release();

  bool Held() const { return fd_ >= 0; }
  // The locked descriptor, for fsync and for reading the file header; -1 when not held.
  int Fd() const { return fd_; }

 private:
  int fd_ = -1;
  dev_t dev_ = 0;
  ino_t ino_ = 0;
};
