#include "VXPropDB.h"

#include <sqlite3.h>

#include <algorithm>
#include <map>
#include <ostream>
#include <set>

#include "PropCodec.h"
#include "QRLLogfile.h"
#include "SQLiteStatement.h"
#include "VXException.h"
#include "VXMemFile.h"
#include "VXResult.h"

using namespace vxprop;

namespace {

// Table definitions by number, and rows keyed by (table << 32 | oid) as a signed rowid, so that
// a key lookup is a rowid lookup and the rows of one table lie together in OID order.
constexpr const char* kSchema =
    "CREATE TABLE IF NOT EXISTS vxprop_tables(id INTEGER PRIMARY KEY, def BLOB NOT NULL);"
    "CREATE TABLE IF NOT EXISTS vxprop_rows(key INTEGER PRIMARY KEY, data BLOB NOT NULL);";

enum EStatement {
  kGetRow,
  kHasRow,
  kInsertRow,
  kUpdateRow,
  kDeleteRow,
  kCountRows,
  kRowKeys,
  kRows,
  kRowBatch,
  kMaxKey,
  kPutTable,
  kStatementCount
};

const char* const kSql[kStatementCount] = {
    "SELECT data FROM vxprop_rows WHERE key=?1",
    "SELECT 1 FROM vxprop_rows WHERE key=?1",
    "INSERT INTO vxprop_rows(key, data) VALUES(?1, ?2)",
    "UPDATE vxprop_rows SET data=?2 WHERE key=?1",
    "DELETE FROM vxprop_rows WHERE key=?1",
    "SELECT count(*) FROM vxprop_rows WHERE key BETWEEN ?1 AND ?2",
    "SELECT key FROM vxprop_rows WHERE key BETWEEN ?1 AND ?2 ORDER BY key",
    "SELECT key, data FROM vxprop_rows WHERE key BETWEEN ?1 AND ?2 ORDER BY key",
    "SELECT key, data FROM vxprop_rows WHERE key > ?1 AND key <= ?2 ORDER BY key LIMIT 1000",
    "SELECT max(key) FROM vxprop_rows WHERE key BETWEEN ?1 AND ?2",
    "INSERT OR REPLACE INTO vxprop_tables(id, def) VALUES(?1, ?2)",
};

int64_t RowKey(uint32_t table, uint32_t oid) {
  return static_cast<int64_t>((static_cast<uint64_t>(table) << 32) | oid);
}
uint32_t OidOfKey(int64_t key) { return static_cast<uint32_t>(static_cast<uint64_t>(key)); }
uint32_t TableOfKey(int64_t key) { return static_cast<uint32_t>(static_cast<uint64_t>(key) >> 32); }

[[noreturn]] void Throw(unsigned code, const std::string& text) {
  auto* e = new CVXException(code, 0, __FILE__, __LINE__, 1);
  e->SetErrorMessage(text);
  throw e;
}

[[noreturn]] void ThrowSql(sqlite3* db, const char* what) {
  Throw(VX_NOT_FOUND, std::string(what) + ": " + (db ? sqlite3_errmsg(db) : "no database"));
}

std::string RowName(int64_t key) {
  return std::to_string(TableOfKey(key)) + "/" + std::to_string(OidOfKey(key));
}

// Resets a statement when the scope ends, so that none stays active between calls: an active
// statement keeps a read transaction open and makes Close and Optimize fail.
class CStep {
 public:
  explicit CStep(CSQLiteStatement& s) : s_(s) {}
  ~CStep() { s_.Reset(); }
  CStep(const CStep&) = delete;
  CStep& operator=(const CStep&) = delete;

 private:
  CSQLiteStatement& s_;
};

// A write transaction, rolled back unless committed.
class CTransaction {
 public:
  explicit CTransaction(sqlite3* db) : db_(db) {
    if (SQLiteExec(db_, "BEGIN IMMEDIATE") != SQLITE_OK) ThrowSql(db_, "begin transaction");
  }
  ~CTransaction() {
    if (!done_) SQLiteExec(db_, "ROLLBACK");
  }
  CTransaction(const CTransaction&) = delete;
  CTransaction& operator=(const CTransaction&) = delete;
  void Commit() {
    if (SQLiteExec(db_, "COMMIT") != SQLITE_OK) ThrowSql(db_, "commit");
    done_ = true;
  }

 private:
  sqlite3* db_;
  bool done_ = false;
};

// Reads a stored record from a blob column with one of the codec's readers; false if it does
// not decode.
template <typename T>
bool Decode(const CSQLiteStatement& s, int column, T& value, void (*read)(CVXFile&, T&)) {
  try {
    CVXMemFile mem(s.Blob(column), static_cast<size_t>(s.Bytes(column)));
    read(mem, value);
    return true;
  } catch (CVXException* e) {
    delete e;
    return false;
  }
}

bool DecodeRow(const CSQLiteStatement& s, int column, std::vector<CVXProperty>& row) {
  return Decode(s, column, row, &ReadRow);
}

bool DecodeTableDef(const CSQLiteStatement& s, STableDef& def) {
  return Decode(s, 1, def, &ReadTableDef);
}

CVXMemFile EncodeRow(const std::vector<CVXProperty>& row) {
  CVXMemFile mem;
  WriteRow(mem, row);
  return mem;
}

// New position -> old position of each column (-1 for a new column).
std::vector<int> ColumnMap(const CVXTable& from, const CVXTable& to) {
  std::vector<int> map;
  for (const SVXColumn& c : to.Columns()) map.push_back(from.ColumnIndex(c.Id));
  return map;
}

// True when the old columns are still the first ones, in order: stored rows then need nothing.
bool KeepsLayout(const std::vector<int>& map, size_t oldCount) {
  if (map.size() < oldCount) return false;
  for (size_t i = 0; i < oldCount; ++i) {
    if (map[i] != static_cast<int>(i)) return false;
  }
  return true;
}

}  // namespace

struct CVXPropDB::Impl {
  CQRLBlobDB blob;
  CQRLLogfile* log = nullptr;
  std::map<uint32_t, STableDef> tables;  // the definitions that decode
  CSQLiteStatement statements[kStatementCount];

  sqlite3* Db() const { return blob.Handle(); }

  CSQLiteStatement& Stmt(EStatement which) {
    CSQLiteStatement& s = statements[which];
    if (!s.Ok()) {
      if (!Db()) Throw(VX_NOT_FOUND, "store not open");
      if (s.Prepare(Db(), kSql[which]) != SQLITE_OK) ThrowSql(Db(), "prepare");
    }
    return s;
  }

  void DropStatements() {
    for (CSQLiteStatement& s : statements) s.Finalize();
  }

  const STableDef* Table(uint32_t table) const {
    auto it = tables.find(table);
    return it == tables.end() ? nullptr : &it->second;
  }

  unsigned Fail(unsigned code, const char* op, const std::string& text) {
    if (log) {
      log->AddError(code, (std::string("CVXPropDB::") + op + ": " + text).c_str(), __LINE__,
                    __FILE__);
    }
    return code;
  }

  // Runs one public operation: exceptions become result codes and are logged.
  template <typename F>
  unsigned Guard(const char* op, F&& body) {
    try {
      return body();
    } catch (CVXException* e) {
      unsigned code = e->GetCode();
      Fail(code, op, e->GetErrorMessage());
      delete e;
      return code;
    } catch (const std::exception& e) {
      return Fail(VX_NOT_FOUND, op, e.what());
    } catch (...) {
      return Fail(VX_NOT_FOUND, op, "unknown exception");
    }
  }

  unsigned CheckOpen(const char* op) {
    return blob.IsOpen() ? VX_OK : Fail(VX_NOT_FOUND, op, "store not open");
  }

  unsigned CheckWritable(const char* op) {
    if (!blob.IsOpen()) return Fail(VX_NOT_FOUND, op, "store not open");
    if (blob.IsReadOnly()) return Fail(VX_NOT_FOUND, op, "store is read-only");
    return VX_OK;
  }

  // A row may be written only into a defined table and may not outgrow its columns.
  unsigned CheckRowWrite(const char* op, uint32_t table, const std::vector<CVXProperty>& row) {
    unsigned rc = CheckWritable(op);
    if (rc != VX_OK) return rc;
    const STableDef* def = Table(table);
    if (!def) return Fail(VX_NOT_FOUND, op, "table " + std::to_string(table) + " not defined");
    if (row.size() > def->Table.Columns().size()) {
      return Fail(VX_NOT_FOUND, op,
                  "row longer than the columns of table " + std::to_string(table));
    }
    return VX_OK;
  }

  void Pad(uint32_t table, std::vector<CVXProperty>& row) const {
    const STableDef* def = Table(table);
    if (!def) return;
    const std::vector<SVXColumn>& columns = def->Table.Columns();
    for (size_t i = row.size(); i < columns.size(); ++i) row.push_back(columns[i].Default);
  }

  // Reads every definition; one that does not decode is left out (SelfTest reports it).
  void LoadTables() {
    tables.clear();
    CSQLiteStatement s(Db(), "SELECT id, def FROM vxprop_tables");
    if (!s.Ok()) ThrowSql(Db(), "read table definitions");
    int rc;
    while ((rc = s.Step()) == SQLITE_ROW) {
      STableDef def;
      if (DecodeTableDef(s, def) && def.Table.Properties().Table == s.Int64(0)) {
        tables[def.Table.Properties().Table] = std::move(def);
      } else if (log) {
        log->AddWarning(("CVXPropDB: definition of table " + std::to_string(s.Int64(0)) +
                         " does not decode; table ignored")
                            .c_str(),
                        1, __LINE__, __FILE__);
      }
    }
    if (rc != SQLITE_DONE) ThrowSql(Db(), "read table definitions");
  }

  bool HasSchema() {
    CSQLiteStatement s(Db(),
                       "SELECT count(*) FROM sqlite_master WHERE type='table' AND "
                       "name IN ('vxprop_tables', 'vxprop_rows')");
    return s.Ok() && s.Step() == SQLITE_ROW && s.Int64(0) == 2;
  }

  // Runs a statement that returns no rows with the key and an optional blob.
  int Write(EStatement which, int64_t key, const CVXMemFile* data) {
    CSQLiteStatement& s = Stmt(which);
    CStep step(s);
    s.Bind(1, key);
    if (data) s.BindBlob(2, data->GetBuffer(), static_cast<size_t>(data->GetFileSize()));
    int rc = s.Step();
    if (rc != SQLITE_DONE && (rc & 0xff) != SQLITE_CONSTRAINT) ThrowSql(Db(), kSql[which]);
    return rc;
  }

  // Looks one row up by key; `onRow` sees the statement while it stands on the row.
  template <typename F>
  bool Find(EStatement which, int64_t key, F&& onRow) {
    CSQLiteStatement& s = Stmt(which);
    CStep step(s);
    s.Bind(1, key);
    int rc = s.Step();
    if (rc == SQLITE_ROW) onRow(s);
    if (rc != SQLITE_ROW && rc != SQLITE_DONE) ThrowSql(Db(), kSql[which]);
    return rc == SQLITE_ROW;
  }

  // Binds the key range of one table to ?1 and ?2.
  CSQLiteStatement& Range(EStatement which, uint32_t table) {
    CSQLiteStatement& s = Stmt(which);
    s.Bind(1, RowKey(table, 0)).Bind(2, RowKey(table, UINT32_MAX));
    return s;
  }

  unsigned NextOid(uint32_t table, uint32_t& oid) {
    CSQLiteStatement& s = Range(kMaxKey, table);
    CStep step(s);
    if (s.Step() != SQLITE_ROW) ThrowSql(Db(), "highest OID");
    if (s.IsNull(0)) {
      oid = 1;
    } else if (OidOfKey(s.Int64(0)) == UINT32_MAX) {
      return Fail(VX_NOT_FOUND, "AddRecord", "no OID left in table " + std::to_string(table));
    } else {
      oid = OidOfKey(s.Int64(0)) + 1;
    }
    return VX_OK;
  }

  unsigned SortedOids(uint32_t table, std::vector<uint32_t>& oids,
                      const std::vector<SSortItem>& sort);
  unsigned PutTable(const CVXTable& table, bool mustBeNew);
  unsigned AssignIds(const CVXTable& table, STableDef& def);
  void RewriteRows(uint32_t table, const CVXTable& from, const CVXTable& to);
  void CheckTables(std::ostream& report, unsigned long& errors);
  unsigned long CheckRows(std::ostream& report, unsigned long& errors,
                          CQRLBlobDB::Callback callback, void* user);
};

CVXPropDB::CVXPropDB() : impl_(std::make_unique<Impl>()) {}

CVXPropDB::~CVXPropDB() { Close(); }

unsigned CVXPropDB::Create(const std::string& path) {
  Close();
  unsigned rc = impl_->blob.Create(path, 0);
  if (rc != VX_OK) return rc;
  std::string error;
  if (SQLiteExec(impl_->Db(), kSchema, &error) != SQLITE_OK) {
    impl_->blob.Close();
    return impl_->Fail(VX_NOT_FOUND, "Create", error);
  }
  return VX_OK;
}

unsigned CVXPropDB::Open(const std::string& path, bool readOnly) {
  Close();
  unsigned rc = impl_->blob.Open(path, readOnly);
  if (rc != VX_OK) return rc;
  rc = impl_->Guard("Open", [&]() -> unsigned {
    if (!impl_->HasSchema()) return impl_->Fail(VX_NOT_FOUND, "Open", "not a property database");
    impl_->LoadTables();
    return VX_OK;
  });
  if (rc != VX_OK) Close();
  return rc;
}

unsigned CVXPropDB::Close() {
  impl_->DropStatements();
  impl_->tables.clear();
  return impl_->blob.IsOpen() ? impl_->blob.Close() : static_cast<unsigned>(VX_OK);
}

bool CVXPropDB::IsOpen() const { return impl_->blob.IsOpen(); }
bool CVXPropDB::IsReadOnly() const { return impl_->blob.IsReadOnly(); }

void CVXPropDB::SetLogfile(CQRLLogfile* log) {
  impl_->log = log;
  impl_->blob.SetLogFile(log);
}

CQRLBlobDB& CVXPropDB::BlobDB() { return impl_->blob; }

unsigned CVXPropDB::AddRecord(uint32_t table, unsigned long& oid,
                              const std::vector<CVXProperty>& row, bool useGivenOid) {
  return impl_->Guard("AddRecord", [&]() -> unsigned {
    unsigned rc = impl_->CheckRowWrite("AddRecord", table, row);
    if (rc != VX_OK) return rc;
    uint32_t id = static_cast<uint32_t>(oid);
    if (useGivenOid && (oid == 0 || oid > UINT32_MAX)) {
      return impl_->Fail(VX_NOT_FOUND, "AddRecord", "invalid OID " + std::to_string(oid));
    }
    if (!useGivenOid && (rc = impl_->NextOid(table, id)) != VX_OK) return rc;
    CVXMemFile data = EncodeRow(row);
    if (impl_->Write(kInsertRow, RowKey(table, id), &data) != SQLITE_DONE) {
      return VX_ALREADY_PRESENT;
    }
    oid = id;
    return VX_OK;
  });
}

unsigned CVXPropDB::GetRecord(uint32_t table, uint32_t oid, std::vector<CVXProperty>& row) {
  return impl_->Guard("GetRecord", [&]() -> unsigned {
    if (!impl_->blob.IsOpen()) return VX_NOT_FOUND;
    std::vector<CVXProperty> values;
    bool decoded = false;
    if (!impl_->Find(kGetRow, RowKey(table, oid),
                     [&](const CSQLiteStatement& s) { decoded = DecodeRow(s, 0, values); })) {
      return VX_NOT_FOUND;
    }
    if (!decoded) {
      return impl_->Fail(VX_NOT_FOUND, "GetRecord",
                         "row " + RowName(RowKey(table, oid)) + " does not decode");
    }
    impl_->Pad(table, values);
    row = std::move(values);
    return VX_OK;
  });
}

unsigned CVXPropDB::SetRecord(uint32_t table, uint32_t oid, const std::vector<CVXProperty>& row) {
  return impl_->Guard("SetRecord", [&]() -> unsigned {
    unsigned rc = impl_->CheckRowWrite("SetRecord", table, row);
    if (rc != VX_OK) return rc;
    CVXMemFile data = EncodeRow(row);
    impl_->Write(kUpdateRow, RowKey(table, oid), &data);
    return sqlite3_changes(impl_->Db()) ? VX_OK : VX_NOT_FOUND;
  });
}

unsigned CVXPropDB::RemoveRecord(uint32_t table, uint32_t oid) {
  return impl_->Guard("RemoveRecord", [&]() -> unsigned {
    unsigned rc = impl_->CheckWritable("RemoveRecord");
    if (rc != VX_OK) return rc;
    impl_->Write(kDeleteRow, RowKey(table, oid), nullptr);
    return sqlite3_changes(impl_->Db()) ? VX_OK : VX_NOT_FOUND;
  });
}

bool CVXPropDB::HasRecord(uint32_t table, uint32_t oid) {
  return impl_->Guard("HasRecord", [&]() -> unsigned {
    if (!impl_->blob.IsOpen()) return VX_NOT_FOUND;
    return impl_->Find(kHasRow, RowKey(table, oid), [](const CSQLiteStatement&) {}) ? VX_OK
                                                                                    : VX_NOT_FOUND;
  }) == VX_OK;
}

unsigned CVXPropDB::GetRecordCount(uint32_t table, unsigned& count) {
  return impl_->Guard("GetRecordCount", [&]() -> unsigned {
    unsigned rc = impl_->CheckOpen("GetRecordCount");
    if (rc != VX_OK) return rc;
    CSQLiteStatement& s = impl_->Range(kCountRows, table);
    CStep step(s);
    if (s.Step() != SQLITE_ROW) ThrowSql(impl_->Db(), "count rows");
    count = static_cast<unsigned>(s.Int64(0));
    return VX_OK;
  });
}

unsigned CVXPropDB::GetRecordOids(uint32_t table, std::vector<uint32_t>& oids,
                                  const std::vector<SSortItem>* sort) {
  return impl_->Guard("GetRecordOids", [&]() -> unsigned {
    unsigned rc = impl_->CheckOpen("GetRecordOids");
    if (rc != VX_OK) return rc;
    if (sort && !sort->empty()) return impl_->SortedOids(table, oids, *sort);
    CSQLiteStatement& s = impl_->Range(kRowKeys, table);
    CStep step(s);
    std::vector<uint32_t> result;
    while ((rc = s.Step()) == SQLITE_ROW) result.push_back(OidOfKey(s.Int64(0)));
    if (rc != SQLITE_DONE) ThrowSql(impl_->Db(), "list rows");
    oids = std::move(result);
    return VX_OK;
  });
}

unsigned CVXPropDB::Impl::SortedOids(uint32_t table, std::vector<uint32_t>& oids,
                                     const std::vector<SSortItem>& sort) {
  const STableDef* def = Table(table);
  if (!def) return Fail(VX_NOT_FOUND, "GetRecordOids", "table not defined");
  const std::vector<SVXColumn>& columns = def->Table.Columns();
  std::vector<size_t> positions;
  for (const SSortItem& item : sort) {
    int i = def->Table.ColumnIndex(item.Column);
    if (i < 0) return Fail(VX_NOT_FOUND, "GetRecordOids", "unknown sort column");
    positions.push_back(static_cast<size_t>(i));
  }
  struct SEntry {
    uint32_t Oid;
    std::vector<CVXProperty> Keys;
  };
  std::vector<SEntry> entries;
  CSQLiteStatement& s = Range(kRows, table);
  CStep step(s);
  std::vector<CVXProperty> row;
  int rc;
  while ((rc = s.Step()) == SQLITE_ROW) {
    SEntry& e = entries.emplace_back(SEntry{OidOfKey(s.Int64(0)), {}});
    if (!DecodeRow(s, 1, row)) {
      e.Keys.resize(positions.size());
      continue;
    }
    for (size_t p : positions) e.Keys.push_back(p < row.size() ? row[p] : columns[p].Default);
  }
  if (rc != SQLITE_DONE) ThrowSql(Db(), "read rows");
  // Stable, so equal keys keep the rising OID order of the scan.
  std::stable_sort(entries.begin(), entries.end(), [&](const SEntry& a, const SEntry& b) {
    for (size_t k = 0; k < sort.size(); ++k) {
      int c = a.Keys[k].Compare(b.Keys[k]);
      if (c != 0) return sort[k].Ascending ? c < 0 : c > 0;
    }
    return false;
  });
  oids.clear();
  for (const SEntry& e : entries) oids.push_back(e.Oid);
  return VX_OK;
}

unsigned CVXPropDB::GetTable(CVXTable& table) {
  const STableDef* def = impl_->Table(table.Properties().Table);
  if (!impl_->blob.IsOpen() || !def) return VX_NOT_FOUND;
  table = def->Table;
  return VX_OK;
}

unsigned CVXPropDB::ListTables(std::vector<uint32_t>& tables) {
  if (!impl_->blob.IsOpen()) return VX_NOT_FOUND;
  tables.clear();
  for (const auto& [number, def] : impl_->tables) tables.push_back(number);
  return VX_OK;
}

unsigned CVXPropDB::CreateTable(const CVXTable& table) {
  return impl_->Guard("CreateTable", [&]() -> unsigned { return impl_->PutTable(table, true); });
}

unsigned CVXPropDB::SetTable(const CVXTable& table) {
  return impl_->Guard("SetTable", [&]() -> unsigned { return impl_->PutTable(table, false); });
}

unsigned CVXPropDB::Impl::AssignIds(const CVXTable& table, STableDef& def) {
  const STableDef* old = Table(table.Properties().Table);
  def.Table = table;
  def.NextColumnId = old ? old->NextColumnId : 1;
  std::set<uint32_t> used;
  for (const SVXColumn& c : table.Columns()) {
    if (!CVXProperty::IsValidType(c.Type)) return Fail(VX_NOT_FOUND, "SetTable", "bad column type");
    if (c.Id == 0) continue;
    if (!used.insert(c.Id).second) return Fail(VX_NOT_FOUND, "SetTable", "column id used twice");
    if (c.Id >= def.NextColumnId) def.NextColumnId = c.Id == UINT32_MAX ? c.Id : c.Id + 1;
  }
  for (SVXColumn& c : def.Table.Columns()) {
    if (c.Id != 0) continue;
    uint32_t same = old ? old->Table.FindColumn(c.Name) : 0;
    if (same != 0 && used.insert(same).second) {
      c.Id = same;
      continue;
    }
    if (used.count(def.NextColumnId) || def.NextColumnId == 0) {
      return Fail(VX_NOT_FOUND, "SetTable", "no column id left");
    }
    c.Id = def.NextColumnId++;
    used.insert(c.Id);
  }
  return VX_OK;
}

unsigned CVXPropDB::Impl::PutTable(const CVXTable& table, bool mustBeNew) {
  const char* op = mustBeNew ? "CreateTable" : "SetTable";
  unsigned rc = CheckWritable(op);
  if (rc != VX_OK) return rc;
  uint32_t number = table.Properties().Table;
  if (number == 0) return Fail(VX_NOT_FOUND, op, "table number 0");
  const STableDef* old = Table(number);
  if (mustBeNew && old) return VX_ALREADY_PRESENT;
  STableDef def;
  if ((rc = AssignIds(table, def)) != VX_OK) return rc;
  CVXMemFile data;
  WriteTableDef(data, def);
  CTransaction transaction(Db());
  {
    CSQLiteStatement& s = Stmt(kPutTable);
    CStep step(s);
    s.Bind(1, static_cast<int64_t>(number)).BindBlob(2, data.GetBuffer(), data.GetFileSize());
    if (s.Step() != SQLITE_DONE) ThrowSql(Db(), "write table definition");
  }
  if (old && !KeepsLayout(ColumnMap(old->Table, def.Table), old->Table.Columns().size())) {
    RewriteRows(number, old->Table, def.Table);
  }
  transaction.Commit();
  tables[number] = std::move(def);
  return VX_OK;
}

// Moves every stored value of the table to its column's new position, in batches so that a
// large table is never held in memory at once. A row that does not decode stays as it is.
void CVXPropDB::Impl::RewriteRows(uint32_t table, const CVXTable& from, const CVXTable& to) {
  std::vector<int> map = ColumnMap(from, to);
  const std::vector<SVXColumn>& columns = to.Columns();
  int64_t last = RowKey(table, 0) - 1;
  for (;;) {
    std::vector<std::pair<int64_t, CVXMemFile>> batch;
    size_t read = 0;
    {
      CSQLiteStatement& s = Stmt(kRowBatch);
      CStep step(s);
      s.Bind(1, last).Bind(2, RowKey(table, UINT32_MAX));
      std::vector<CVXProperty> row, moved;
      int rc;
      for (; (rc = s.Step()) == SQLITE_ROW; ++read) {
        last = s.Int64(0);
        if (!DecodeRow(s, 1, row)) continue;
        moved.clear();
        for (size_t j = 0; j < map.size(); ++j) {
          size_t i = static_cast<size_t>(map[j]);
          moved.push_back(map[j] >= 0 && i < row.size() ? row[i] : columns[j].Default);
        }
        batch.emplace_back(last, EncodeRow(moved));
      }
      if (rc != SQLITE_DONE) ThrowSql(Db(), "read rows");
    }
    if (read == 0) break;
    for (const auto& [key, data] : batch) Write(kUpdateRow, key, &data);
  }
}

unsigned CVXPropDB::SelfTest(std::ostream& report, unsigned long& errors,
                             CQRLBlobDB::Callback callback, void* user) {
  unsigned long before = errors;
  unsigned rc = impl_->blob.SelfTest(report, errors, callback, user);
  if (rc != VX_OK && rc != VX_SELFTEST_ERRORS) return rc;
  rc = impl_->Guard("SelfTest", [&]() -> unsigned {
    report << "\nProperty tables:\n";
    impl_->CheckTables(report, errors);
    unsigned long rows = impl_->CheckRows(report, errors, callback, user);
    report << "  " << impl_->tables.size() << " tables, " << rows << " rows checked\n";
    return VX_OK;
  });
  if (rc != VX_OK) return rc;
  return errors > before ? VX_SELFTEST_ERRORS : VX_OK;
}

void CVXPropDB::Impl::CheckTables(std::ostream& report, unsigned long& errors) {
  CSQLiteStatement s(Db(), "SELECT id, def FROM vxprop_tables ORDER BY id");
  if (!s.Ok()) ThrowSql(Db(), "read table definitions");
  int rc;
  while ((rc = s.Step()) == SQLITE_ROW) {
    STableDef def;
    if (!DecodeTableDef(s, def) || def.Table.Properties().Table != s.Int64(0)) {
      report << "ERROR: definition of property table " << s.Int64(0) << " cannot be read\n";
      ++errors;
    }
  }
  if (rc != SQLITE_DONE) ThrowSql(Db(), "read table definitions");
}

unsigned long CVXPropDB::Impl::CheckRows(std::ostream& report, unsigned long& errors,
                                         CQRLBlobDB::Callback callback, void* user) {
  CSQLiteStatement count(Db(), "SELECT count(*) FROM vxprop_rows");
  if (!count.Ok() || count.Step() != SQLITE_ROW) ThrowSql(Db(), "count rows");
  unsigned long total = static_cast<unsigned long>(count.Int64(0)), done = 0;
  CSQLiteStatement s(Db(), "SELECT key, data FROM vxprop_rows ORDER BY key");
  if (!s.Ok()) ThrowSql(Db(), "read rows");
  std::vector<CVXProperty> row;
  int rc;
  while ((rc = s.Step()) == SQLITE_ROW) {
    int64_t key = s.Int64(0);
    const STableDef* def = Table(TableOfKey(key));
    const char* problem = nullptr;
    if (OidOfKey(key) == 0) {
      problem = "has OID 0";
    } else if (!DecodeRow(s, 1, row)) {
      problem = "cannot be decoded";
    } else if (!def) {
      problem = "belongs to an undefined table";
    } else if (row.size() > def->Table.Columns().size()) {
      problem = "has more values than its table has columns";
    }
    if (problem) {
      report << "ERROR: property row " << RowName(key) << ' ' << problem << "\n";
      ++errors;
    }
    if (++done % 1024 == 0 && callback) {
      callback(CQRLBlobDB::cbProgress, done, total, user, nullptr);
    }
  }
  if (rc != SQLITE_DONE) ThrowSql(Db(), "read rows");
  if (callback) callback(CQRLBlobDB::cbProgress, done, total, user, nullptr);
  return done;
}

unsigned CVXPropDB::Optimize(const std::string& path, CQRLBlobDB::Callback callback, void* user) {
  if (!impl_->blob.IsOpen()) return VX_NOT_FOUND;
  // The store reopens its connection; statements of the old one must be gone first.
  impl_->DropStatements();
  return impl_->blob.Optimize(path, callback, user);
}
