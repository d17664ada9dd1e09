#pragma once

#include <cstdint>
#include <iosfwd>
#include <memory>
#include <string>
#include <vector>

#include "QRLBlobDB.h"
#include "VXBase.h"
#include "VXProperty.h"
#include "VXTable.h"

class CQRLLogfile;

// A database of property tables. A table has a number, a name and columns (CVXTable); a row is a
// vector of CVXProperty in column order, keyed by (table, OID). The system keeps one table,
// 1000, the image properties, with one row per file under the file's OID.
//
// The tables and rows live in the SQLite file of the database's own CQRLBlobDB, which gives
// them its lock (10211 for a second opener), its WAL durability and its read-only mode. Each row
// is one versioned record, so a row stored before a column was added is shorter than the
// column list; GetRecord pads it with the column defaults.
//
// Results: 10001 success; 10020 a missing table, row or store, a refused write (read-only
// store, row longer than the table) or a store failure; 10120 AddRecord of an OID already
// present. No operation throws. A corrupt row or definition gives 10020 and is left as it is;
// SelfTest reports it. Failures other than a plain miss go to the log.
// Not safe for concurrent use of one object: the engine's lock guards it.
class CVXPropDB : public CVXBase {
 public:
  // One key of a sorted GetRecordOids: a column id of the table and its direction.
  struct SSortItem {
    uint32_t Column = 0;
    bool Ascending = true;
  };

  CVXPropDB();
  CVXPropDB(const CVXPropDB&) = delete;
  CVXPropDB& operator=(const CVXPropDB&) = delete;
  ~CVXPropDB() override;

  // Creates (replaces) the file with no tables and opens it writable. 10211 if the file is held.
  unsigned Create(const std::string& path);
  // 10211 if the file is held by another opener; 10020 if it is missing, not a store, or a
  // store without the property tables.
  unsigned Open(const std::string& path, bool readOnly);
  // 10001 also when nothing was open.
  unsigned Close();
  bool IsOpen() const;
  bool IsReadOnly() const;
  void SetLogfile(CQRLLogfile* log);

  // Adds a row. `row` may be shorter than the column list, not longer; the table must be
  // defined. With `useGivenOid` the row is stored under `oid` (1 to 2^32-1; 10120 if taken);
  // without it, under one above the highest OID of the table (1 for an empty table), which is
  // returned in `oid`.
  unsigned AddRecord(uint32_t table, unsigned long& oid, const std::vector<CVXProperty>& row,
                     bool useGivenOid);
  // The row, padded with the column defaults up to the column count. 10020 if there is none or
  // it does not decode; `row` is then unchanged.
  unsigned GetRecord(uint32_t table, uint32_t oid, std::vector<CVXProperty>& row);
  // Replaces an existing row; 10020 if there is none. Same limits as AddRecord.
  unsigned SetRecord(uint32_t table, uint32_t oid, const std::vector<CVXProperty>& row);
  // 10020 if there is no such row.
  unsigned RemoveRecord(uint32_t table, uint32_t oid);
  bool HasRecord(uint32_t table, uint32_t oid);
  // Rows of the table (0 for a table without rows or without definition).
  unsigned GetRecordCount(uint32_t table, unsigned& count);
  // OIDs of the table's rows. Without sort items (null or empty): rising OID. With them: by
  // the items' columns in turn, each compared with CVXProperty::operator< on the padded row,
  // then by rising OID; a row that does not decode sorts as all empty. 10020 if a sort column
  // is not a column of the table.
  unsigned GetRecordOids(uint32_t table, std::vector<uint32_t>& oids,
                         const std::vector<SSortItem>* sort = nullptr);
  // Fills name and columns of the table numbered in table.Properties().Table; 10020 if that
  // table is not defined (or its definition does not decode).
  unsigned GetTable(CVXTable& table);

  // The underlying store, for its file size and Flush. Closing or optimising it directly
  // bypasses this object: use Close and Optimize here.
  CQRLBlobDB& BlobDB();

  // The blob store's test, then: every table definition decodes and matches its number, every
  // row decodes, belongs to a defined table and is no longer than its column list. Report lines
  // go to `report`, problems are added to `errors`, cbProgress goes to `callback` (may be
  // null). 10190 when anything was found, 10020 when not open.
  unsigned SelfTest(std::ostream& report, unsigned long& errors, CQRLBlobDB::Callback callback,
                    void* user);
  // Rewrites the file compactly through `path` (see CQRLBlobDB::Optimize); 10020 if read-only.
  unsigned Optimize(const std::string& path, CQRLBlobDB::Callback callback, void* user);

  // For hosts that define tables (the system itself only reads definitions).
  // CreateTable: defines a new table; 10120 if the number is already defined, 10020 for table
  // number 0, a column type outside 1 to 12 or a column id used twice.
  unsigned CreateTable(const CVXTable& table);
  // SetTable: defines or redefines a table. A column keeps its id when it comes with that id,
  // or with id 0 and the name of an existing column; any other column with id 0 gets a new id.
  // When existing columns are removed or reordered, every stored row of the table is rewritten
  // in one transaction so that its values stay with their columns (a dropped column's values
  // are dropped). Values are not converted when a column changes its type.
  unsigned SetTable(const CVXTable& table);
  // The defined table numbers, rising.
  unsigned ListTables(std::vector<uint32_t>& tables);

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
};
