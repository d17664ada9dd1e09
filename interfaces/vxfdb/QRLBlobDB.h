#pragma once

#include <cstdint>
#include <iosfwd>
#include <memory>
#include <string>
#include <vector>

#include "VXBase.h"

class CQRLLogfile;
class CVXMemFile;
struct sqlite3;

// A store of byte-string records keyed by (type, OID), kept in one SQLite file.
//
// Durability: WAL journal with synchronous=NORMAL, so a record whose Set has returned survives a
// crash of the process; Flush checkpoints and syncs for power loss.
// Exclusivity: Create and Open take an exclusive, non-blocking lock on the file, held until
// Close; a second opener in this process or another gets 10211 at once.
// Read-only: every write answers 10020 and leaves the file untouched.
// Not safe for concurrent use of one object: the engine's lock guards it.
class CQRLBlobDB : public CVXBase {
 public:
  struct SSelector {
    uint16_t Type = 0;
    uint32_t Oid = 0;
    SSelector() = default;
    SSelector(uint16_t type, uint32_t oid) : Type(type), Oid(oid) {}
    bool operator==(const SSelector&) const = default;
  };

  // Messages of the progress callback; 4 is the progress message the engine forwards.
  enum ECBMessage : unsigned {
    cbStart = 1,
    cbInfo = 2,
    cbError = 3,
    cbProgress = 4,
    cbEnd = 5,
  };
  // (message, a, b, user, text). For cbProgress a is the step done and b the step count.
  using Callback = void (*)(ECBMessage message, unsigned long a, unsigned long b, void* user,
                            const char* text);

  CQRLBlobDB();
  CQRLBlobDB(const CQRLBlobDB&) = delete;
  CQRLBlobDB& operator=(const CQRLBlobDB&) = delete;
  ~CQRLBlobDB() override;

  // Creates (truncates) the file and opens it writable. `flags` is kept in the store's own
  // settings table; it changes nothing of the format.
  unsigned Create(const std::string& path, unsigned flags);
  // 10211 when another opener holds the file; 10020 when it is missing or not a store.
  unsigned Open(const std::string& path, bool readOnly);
  unsigned Close();
  unsigned Flush();
  bool IsOpen() const;
  bool IsReadOnly() const;
  std::string GetName() const;
  int64_t GetFileSize() const;
  void SetLogFile(CQRLLogfile* log);

  unsigned Set(const SSelector& sel, const void* data, unsigned size, unsigned flags = 0);
  // Copies the record into `buffer`, which must hold GetSize bytes.
  unsigned Get(const SSelector& sel, void* buffer);
  // Bounded form: 10020 if the record is larger than `capacity`.
  unsigned Get(const SSelector& sel, void* buffer, unsigned capacity);
  // Replaces the content of `mem` with the record and rewinds it.
  unsigned Get(const SSelector& sel, CVXMemFile& mem);
  unsigned GetSize(const SSelector& sel, unsigned& size);
  // All records one behind the other, in the order of `sels`; one read transaction. 10020 if any
  // is missing.
  unsigned Get(const std::vector<SSelector>& sels, void* buffer);
  unsigned Get(const std::vector<SSelector>& sels, void* buffer, uint64_t capacity);
  unsigned GetSize(const std::vector<SSelector>& sels, unsigned& size);
  bool HasRecord(const SSelector& sel);
  unsigned Remove(const SSelector& sel);
  unsigned GetOids(uint16_t type, std::vector<uint32_t>& oids, bool sorted);
  unsigned GetNumberOfRecords(uint16_t type, unsigned& count);
  // Reorders `oids` into the order in which their records lie in the file.
  unsigned OptimizeOidsForSequentialAccess(uint16_t type, std::vector<uint32_t>& oids);

  void EnableCaching(bool enable, unsigned size, unsigned flag = 0);
  bool CachingEnabled() const;
  // Keeps the sizes of all records of `type` in memory, so GetSize/HasRecord need no query.
  void EnableSelectorCache(uint16_t type, bool enable);
  void ReleaseCaches();

  // Integrity check plus the store's own checks; the report goes to `report`, the number of
  // errors found is added to `errors`. 10190 when errors were found.
  unsigned SelfTest(std::ostream& report, unsigned long& errors, Callback callback, void* user);
  // Rewrites the store compactly into `path`, then moves it over the store file atomically and
  // reopens it.
  unsigned Optimize(const std::string& path, Callback callback, void* user);

  // The SQLite connection, for the stores that keep their own tables in the same file (the
  // property database). Null when closed.
  sqlite3* Handle() const;

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};
