#pragma once

#include <cstdint>
#include <functional>
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
// Layout: one table keyed by the rowid (type << 32) | OID, so records lie in (type, OID) order,
// beside a settings table that marks the file as a store.
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

  // Unless stated otherwise an operation answers 10001, or 10020 when the store is not open or
  // SQLite fails; SQLite failures, refused writes and other misuse are logged with the code,
  // the operation and SQLite's message. A missing record is a plain 10020 and is not logged.

  // Creates (truncates) the file and opens it writable. `flags` is kept in the store's own
  // settings table; it changes nothing of the format. 10211 when another opener holds the file
  // (which is then left as it was); 10020 when it cannot be created.
  unsigned Create(const std::string& path, unsigned flags);
  // 10211 when another opener holds the file; 10020 when it is missing, not a store (junk, empty,
  // truncated, another SQLite database) or unreadable. A failed Open never changes the file.
  // Read-only opens read a WAL left by a crashed writer without changing it.
  unsigned Open(const std::string& path, bool readOnly);
  // Always 10001, also when closed. Statements that others prepared on Handle() must be
  // finalized first, or the file stays open inside SQLite after the lock is gone.
  unsigned Close();
  // Checkpoints the WAL into the file and syncs it, so that all written survives a power loss.
  // 10001 at once when read-only.
  unsigned Flush();
  bool IsOpen() const;
  bool IsReadOnly() const;
  // The path of the open file; empty when closed.
  std::string GetName() const;
  // Bytes on disk, the WAL included; -1 when closed.
  int64_t GetFileSize() const;
  void SetLogFile(CQRLLogfile* log);

  // Adds or replaces a record; once it has returned the record survives a crash of the process.
  // 10020 when read-only, for OID 0 (no identity), null data with a size, or a record beyond
  // SQLite's length limit.
  unsigned Set(const SSelector& sel, const void* data, unsigned size, unsigned flags = 0);
  // Copies the record into `buffer`, which must hold GetSize bytes. 10020 when missing.
  unsigned Get(const SSelector& sel, void* buffer);
  // Bounded form: 10020, and nothing written, if the record is larger than `capacity`.
  unsigned Get(const SSelector& sel, void* buffer, unsigned capacity);
  // Replaces the content of `mem` with the record and rewinds it; `mem` is kept when missing.
  unsigned Get(const SSelector& sel, CVXMemFile& mem);
  // Fixed-size records (headers, settings): 10020, and nothing written, unless the record is
  // exactly `size` bytes. A record of another size is as damaged as a missing one.
  unsigned GetExact(const SSelector& sel, void* buffer, unsigned size);
  // 10020 and `size` 0 if the record is missing.
  unsigned GetSize(const SSelector& sel, unsigned& size);
  // All records one behind the other, in the order of `sels`, from one read transaction (or the
  // caller's, if one is open on Handle()). 10020 if any is missing; records before it are copied.
  unsigned Get(const std::vector<SSelector>& sels, void* buffer);
  // Bounded form: 10020 at the first record that would pass `capacity`; nothing is written
  // beyond it.
  unsigned Get(const std::vector<SSelector>& sels, void* buffer, uint64_t capacity);
  // The sum of the sizes. 10020 and `size` 0 if any is missing or the sum passes 32 bits.
  unsigned GetSize(const std::vector<SSelector>& sels, unsigned& size);
  // False also when closed or SQLite fails.
  bool HasRecord(const SSelector& sel);
  // 10020 when the record is missing or the store is read-only.
  unsigned Remove(const SSelector& sel);
  // All OIDs of a type; rising if `sorted`, else in any order. The vector is emptied first,
  // and left empty on failure.
  unsigned GetOids(uint16_t type, std::vector<uint32_t>& oids, bool sorted);
  // Receives runs of GetAll: OIDs and the records' bytes one behind the other, as a batch Get
  // lays them out. It may take the vectors' content (swapping in other vectors, which are
  // cleared before they are filled); a result other than 10001 ends the walk with that result.
  using RunSink = std::function<unsigned(std::vector<uint32_t>& oids, std::vector<uint8_t>& bytes)>;
  // All records of a type in one walk, in rising OID order, handed to `sink` in runs of
  // `runLength` (the last run may be shorter; none when the type is empty): the listing of
  // GetOids and the reads of all its batches at once. Fails and logs as GetOids does. The walk
  // may run on another thread than the owner's, as long as nothing else uses the store
  // meanwhile.
  unsigned GetAll(uint16_t type, size_t runLength, const RunSink& sink);
  unsigned GetNumberOfRecords(uint16_t type, unsigned& count);
  // Reorders `oids` into the order in which their records lie in the file, which is rising OID
  // order within a type (the key is (type, OID)); after Optimize that is also page order.
  unsigned OptimizeOidsForSequentialAccess(uint16_t type, std::vector<uint32_t>& oids);

  // On: SQLite's page cache of `size` KB (32 MB when 0) and a memory map of the file. Off
  // restores SQLite's defaults. Kept across Close and Open. `flag` is unused.
  void EnableCaching(bool enable, unsigned size, unsigned flag = 0);
  bool CachingEnabled() const;
  // Keeps the sizes of all records of `type` in memory (loaded now, or on first use when
  // closed), so GetSize, HasRecord, GetOids and GetNumberOfRecords of that type need no query.
  // Set and Remove keep it current; writes made past them on Handle(), or rolled back in a
  // caller's transaction, are not seen until ReleaseCaches.
  void EnableSelectorCache(uint16_t type, bool enable);
  // Gives back SQLite's cache memory and that of the selector caches, which reload on next use.
  void ReleaseCaches();

  // SQLite's integrity check plus the store's own checks (settings table and format marker;
  // every key a (type, OID) pair with OID != 0; every value a blob). One report line and one
  // error per problem; the number found is added to `errors`. Progress goes to `callback` as
  // cbProgress (done, total). 10190 when errors were found; 10020 when the store is not open.
  unsigned SelfTest(std::ostream& report, unsigned long& errors, Callback callback, void* user);
  // Rewrites the store compactly into `path` (a stale file there is replaced), then moves it
  // over the store file atomically and reopens it; the lock covers the file throughout.
  // Progress as cbProgress (step, 3). 10020 when read-only, when `path` is the store, or on
  // any failure, and then the original store is unchanged and still open; 10211 when another
  // opener holds `path`. Handle() changes: statements prepared on it by others must be
  // finalized before, or the result is 10020.
  unsigned Optimize(const std::string& path, Callback callback, void* user);

  // The SQLite connection, for the stores that keep their own tables in the same file (the
  // property database). Null when closed.
  sqlite3* Handle() const;

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};
