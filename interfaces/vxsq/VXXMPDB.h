#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "VXSQLite.h"

class CBitVector;

// The XMP data of one file.
struct SXMPRecord {
  uint32_t Oid = 0;               // the file; 0 is never stored
  std::string Packet;             // the XMP packet text, stored as given
  int32_t Rating = 0;             // -1 rejected, 0 none, 1 to 5 stars; other values are kept too
  std::string Label;              // the colour label, empty for none
  bool PendingWriteBack = false;  // the packet waits to be written back into the file
};

// One full-text record of a file. A file has any number of them, several per tag allowed (for
// "dc:subject", one record per keyword).
struct SFTIRecord {
  std::string Tag;
  std::string Value;
};

// A tag and the number of files having at least one record with it.
struct SFTITag {
  std::string Tag;
  uint32_t Count = 0;
};

// One file's sort value for a tag.
struct SFTISortItem {
  uint32_t Oid = 0;
  std::string Value;
};

// The XMP and full-text database (".v3x"). XMP records are keyed by the file's OID; full-text
// records are (OID, tag, value) rows with a word index (SQLite FTS5) over the values.
//
// Every operation may be called from any thread at any time (see CVXSQLite); a
// CSQLiteTransaction makes a series of them atomic. Results are those of CVXSQLite: 0, or an
// SQLite code, or -1 for "not open", "bad argument" and "missing", with the text in
// GetLastErrorMsg(). An operation that fails changes nothing.
//
// Text: tags compare exactly, byte by byte, and an empty tag in a query means any tag.
// "Case-insensitively" means by Unicode simple case folding (xstring_comparenocase), ties broken
// byte-wise so that the order is total. Sub-strings count characters (UTF-8 code points; a byte
// that is not valid UTF-8 counts as one character).
class CVXXMPDB : public CVXSQLite {
 public:
  CVXXMPDB() = default;

  // Creates the file with an empty schema (replacing an existing file).
  int Create(const std::string& path) override;
  // Opens a file made by Create; a file of another kind, or of another schema version, fails
  // with -1 and is closed again.
  int Open(const std::string& path) override;

  // XMP records.
  // Stores or replaces the record of rec.Oid; `pending` becomes its write-back flag and is
  // copied into rec.PendingWriteBack. OID 0 fails with -1.
  int Set(SXMPRecord& rec, bool pending);
  // Fills rec from the record of rec.Oid; -1 when there is none (not logged). PendingWriteBack
  // reports the flag as stored; `clearPending` then clears it in the database.
  int Get(SXMPRecord& rec, bool clearPending);
  // Removes the XMP record (not the full-text records); removing a missing record succeeds.
  int Delete(uint32_t oid);
  // Re-keys the XMP and full-text data of `from` to `to`, in one transaction. -1 when `to` has
  // either kind of data (so also when from == to), when `from` has none, or when one is 0.
  int Move(uint32_t from, uint32_t to);
  // Gives `to` a copy of the data of `from`, replacing whatever `to` had. -1 when `from` has
  // none or one is 0; from == to changes nothing.
  int Copy(uint32_t from, uint32_t to);

  // OID lists, each replaced, rising and distinct.
  // Files whose write-back flag is set.
  int GetPendingUpdates(std::vector<uint32_t>& oids);
  // Files with an XMP record rated exactly `rank`.
  int GetOidsForRank(int32_t rank, std::vector<uint32_t>& oids);
  // Files rated other than 0 (rejected ones included).
  int GetOidsWithRank(std::vector<uint32_t>& oids);
  // Files whose label equals `label` case-insensitively; an empty label finds nothing.
  int GetOidsForLabel(const std::string& label, std::vector<uint32_t>& oids);
  // Files with a non-empty label.
  int GetOidsWithLabel(std::vector<uint32_t>& oids);

  // Full-text records.
  // Replaces all records of the file with `records` (an empty vector removes them). OID 0
  // fails with -1.
  int FTISetU(uint32_t oid, const std::vector<SFTIRecord>& records);
  // The file's records in the order they were set; a file without records gives an empty
  // vector and 0.
  int FTIGet(uint32_t oid, std::vector<SFTIRecord>& records);
  // Removes the file's records; removing none succeeds.
  int FTIDelete(uint32_t oid);
  // Every tag in use with its file count, by tag byte-wise.
  int FTIGetTags(std::vector<SFTITag>& tags);
  // The distinct values of `tag`, each first cut to the characters [start, start + len):
  // start < 0 counts as 0, len <= 0 means to the end. A cut that leaves nothing (start beyond
  // the end) drops the value. Distinct byte-wise, sorted case-insensitively.
  int FTIGroupTags(const std::string& tag, std::vector<std::string>& values, int32_t start,
                   int32_t len);

  // Query modes of FTIQuery (the low bits of `flag`).
  enum EFTIQuery : int {
    fqExact = 0,   // the value, cut to (a, b) as in FTIGroupTags, equals text byte-wise; text
                   // in double quotes (inner ones doubled) is that literal, as categories pass it
    fqPrefix = 1,  // every blank-separated word of text begins a word of one value
    fqFTS = 2,     // text is an FTS5 query over the values; a syntax error fails, code 1
    fqLimit = 16,  // bit: a is the most OIDs returned (the lowest ones); a <= 0 means all
  };
  // The files having a record of `tag` (empty: any tag) whose value matches `text` in the mode
  // flag & 15. Empty text (for fqPrefix and fqFTS also text of blanks only) matches every file
  // having the tag. Words match as SQLite's unicode61 tokenizer sees them: case and diacritics
  // do not count. (a, b) is the sub-string cut of fqExact and is not used by the other modes;
  // with fqLimit set, a is the limit, b is not used, and fqExact compares whole values.
  // fqExact on a tag is answered from an index; a cut that does not start at 0 scans that tag's
  // values. An unknown mode fails with -1. oids is replaced, rising and distinct.
  int FTIQuery(const std::string& tag, const std::string& text, int flag,
               std::vector<uint32_t>& oids, int32_t a, int32_t b);
  // One item per file having `tag` (empty: any tag), holding the file's least value byte-wise;
  // only the OIDs set in `only` when it is given. Sorted by value case-insensitively, then OID;
  // descending order is the exact reverse.
  int FTIGetSorted(const std::string& tag, std::vector<SFTISortItem>& items, bool ascending,
                   const CBitVector* only);

 private:
  // After the base opened the file (result `opened`), writes or checks the schema; a failure
  // closes the file again.
  int Prepare_(int opened, bool created);
  int CheckSchema_();
  int HasData_(uint32_t oid, bool& has);
  int RemoveAll_(uint32_t oid);
  // Runs sql; `add(row, list)` appends what a row gives to a fresh list, which replaces `out`
  // only on success. Defined and used in the .cpp alone.
  template <typename T, typename Add>
  int Collect_(const char* sql, const Binder& bind, std::vector<T>& out, Add add);
  int Oids_(const char* sql, const Binder& bind, std::vector<uint32_t>& oids);
  int MatchWords_(const std::string& tag, const std::string& query, std::vector<uint32_t>& oids);
  int MatchExact_(const std::string& tag, const std::string& text, int32_t start, int32_t len,
                  std::vector<uint32_t>& oids);
};
