#include <gtest/gtest.h>
#include <sqlite3.h>

#include <sstream>

#include "QRLLogfile.h"
#include "VXPropDB.h"
#include "VXResult.h"
#include "vxtest.h"

namespace {

constexpr uint32_t kImages = 1000;

SVXColumn Column(uint32_t id, const char* name, uint32_t type, CVXProperty value = {}) {
  return {id, name, type, std::move(value), 0, 0};
}

class PropDBTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(db_.Create(path_), VX_OK);
    CVXTable images(kImages);
    images.Properties().Name = "Images";
    images.AddColumn("Title", vptString);
    images.AddColumn("Rating", vptInt32, CVXProperty(int32_t{0}));
    ASSERT_EQ(db_.CreateTable(images), VX_OK);
  }

  unsigned Add(uint32_t table, unsigned long oid, const std::vector<CVXProperty>& row) {
    return db_.AddRecord(table, oid, row, true);
  }
  std::vector<CVXProperty> Get(uint32_t table, uint32_t oid) {
    std::vector<CVXProperty> row;
    EXPECT_EQ(db_.GetRecord(table, oid, row), VX_OK) << table << "/" << oid;
    return row;
  }
  std::vector<uint32_t> Oids(uint32_t table, const std::vector<CVXPropDB::SSortItem>& sort = {}) {
    std::vector<uint32_t> oids;
    EXPECT_EQ(db_.GetRecordOids(table, oids, &sort), VX_OK);
    return oids;
  }
  void Reopen(bool readOnly) {
    ASSERT_EQ(db_.Close(), VX_OK);
    ASSERT_EQ(db_.Open(path_, readOnly), VX_OK);
  }
  // Stores raw bytes as a row or a table definition, past all checks.
  void PutRawRow(uint32_t table, uint32_t oid, const std::string& bytes) {
    PutRaw("vxprop_rows", static_cast<int64_t>((uint64_t{table} << 32) | oid), bytes);
  }
  void PutRaw(const std::string& sqlTable, int64_t key, const std::string& bytes) {
    sqlite3_stmt* s = nullptr;
    std::string sql = "INSERT OR REPLACE INTO " + sqlTable + " VALUES(?, ?)";
    ASSERT_EQ(sqlite3_prepare_v2(db_.BlobDB().Handle(), sql.c_str(), -1, &s, nullptr), SQLITE_OK);
    sqlite3_bind_int64(s, 1, key);
    sqlite3_bind_blob(s, 2, bytes.data(), static_cast<int>(bytes.size()), SQLITE_TRANSIENT);
    EXPECT_EQ(sqlite3_step(s), SQLITE_DONE);
    sqlite3_finalize(s);
  }

  vxtest::TempDir dir_;
  std::string path_ = dir_ / "db.vxp";
  CVXPropDB db_;
};

TEST_F(PropDBTest, RecordsSurviveCloseAndReopen) {
  EXPECT_EQ(Add(kImages, 15, {CVXProperty("Dune"), CVXProperty(int32_t{5})}), VX_OK);
  EXPECT_EQ(Add(kImages, 15, {CVXProperty("Other")}), VX_ALREADY_PRESENT);
  unsigned long oid = 999;
  EXPECT_EQ(db_.AddRecord(kImages, oid, {CVXProperty("Next")}, false), VX_OK);
  EXPECT_EQ(oid, 16u);
  EXPECT_EQ(Add(kImages, 3, {}), VX_OK);
  EXPECT_EQ(db_.SetRecord(kImages, 3, {CVXProperty("Three"), CVXProperty(int32_t{1})}), VX_OK);
  EXPECT_EQ(db_.SetRecord(kImages, 4, {CVXProperty("none")}), VX_NOT_FOUND);
  EXPECT_EQ(db_.RemoveRecord(kImages, 16), VX_OK);
  EXPECT_EQ(db_.RemoveRecord(kImages, 16), VX_NOT_FOUND);

  // Invalid writes: OID 0 or beyond 32 bits, a row longer than the table, an undefined table.
  EXPECT_EQ(Add(kImages, 0, {}), VX_NOT_FOUND);
  EXPECT_EQ(Add(kImages, 0x100000001ul, {}), VX_NOT_FOUND);
  EXPECT_EQ(Add(kImages, 20, {CVXProperty(), CVXProperty(), CVXProperty()}), VX_NOT_FOUND);
  EXPECT_EQ(Add(7, 1, {}), VX_NOT_FOUND);

  Reopen(false);
  EXPECT_EQ(Get(kImages, 15), (std::vector<CVXProperty>{CVXProperty("Dune"), int32_t{5}}));
  EXPECT_EQ(Get(kImages, 3)[0].String(), "Three");
  EXPECT_TRUE(db_.HasRecord(kImages, 3));
  EXPECT_FALSE(db_.HasRecord(kImages, 16));
  EXPECT_FALSE(db_.HasRecord(kImages + 1, 3));
  unsigned count = 0;
  EXPECT_EQ(db_.GetRecordCount(kImages, count), VX_OK);
  EXPECT_EQ(count, 2u);
  EXPECT_EQ(Oids(kImages), (std::vector<uint32_t>{3, 15}));
  // The next free OID is above the highest, also after a reopen.
  oid = 0;
  EXPECT_EQ(db_.AddRecord(kImages, oid, {}, false), VX_OK);
  EXPECT_EQ(oid, 16u);

  std::vector<CVXProperty> row = {CVXProperty("unchanged")};
  EXPECT_EQ(db_.GetRecord(kImages, 99, row), VX_NOT_FOUND);
  EXPECT_EQ(row.size(), 1u);
  CVXTable missing(5);
  EXPECT_EQ(db_.GetTable(missing), VX_NOT_FOUND);
}

TEST_F(PropDBTest, TablesKeepTheirRowsApart) {
  // Table numbers from 2^31 on give negative row keys; they must not mix with the others.
  CVXTable high(0x80000001u);
  high.AddColumn("v", vptInt64);
  ASSERT_EQ(db_.CreateTable(high), VX_OK);
  EXPECT_EQ(db_.CreateTable(high), VX_ALREADY_PRESENT);
  CVXTable zero(0);
  EXPECT_EQ(db_.CreateTable(zero), VX_NOT_FOUND);
  EXPECT_EQ(Add(0x80000001u, 0xFFFFFFFFu, {int64_t{1}}), VX_OK);
  EXPECT_EQ(Add(0x80000001u, 1, {int64_t{2}}), VX_OK);
  EXPECT_EQ(Add(kImages, 1, {}), VX_OK);
  EXPECT_EQ(Oids(0x80000001u), (std::vector<uint32_t>{1, 0xFFFFFFFFu}));
  EXPECT_EQ(Oids(kImages), (std::vector<uint32_t>{1}));
  unsigned long oid = 0;
  EXPECT_EQ(db_.AddRecord(0x80000001u, oid, {}, false), VX_NOT_FOUND);  // no OID left
  std::vector<uint32_t> tables;
  EXPECT_EQ(db_.ListTables(tables), VX_OK);
  EXPECT_EQ(tables, (std::vector<uint32_t>{kImages, 0x80000001u}));
}

TEST_F(PropDBTest, RedefinedColumnsKeepTheirValues) {
  EXPECT_EQ(Add(kImages, 1, {CVXProperty("one"), int32_t{4}}), VX_OK);
  EXPECT_EQ(Add(kImages, 2, {CVXProperty("two")}), VX_OK);

  // A column added later: old rows are padded with its default.
  CVXTable table(kImages);
  ASSERT_EQ(db_.GetTable(table), VX_OK);
  uint32_t place = table.AddColumn("Place", vptString, CVXProperty("nowhere"));
  ASSERT_EQ(db_.SetTable(table), VX_OK);
  Reopen(false);
  EXPECT_EQ(Get(kImages, 1), (std::vector<CVXProperty>{"one", int32_t{4}, "nowhere"}));
  EXPECT_EQ(Get(kImages, 2), (std::vector<CVXProperty>{"two", int32_t{0}, "nowhere"}));

  // Place moved first, Rating dropped, Title matched by name with id 0 (it keeps id 1), and a
  // new column with id 0 (it gets a new id).
  CVXTable next(kImages);
  next.Properties().Name = "Pictures";
  next.Columns() = {table.Columns()[2], Column(0, "Title", vptString),
                    Column(0, "Camera", vptString, CVXProperty("?"))};
  ASSERT_EQ(db_.SetTable(next), VX_OK);
  EXPECT_EQ(Get(kImages, 1), (std::vector<CVXProperty>{"nowhere", "one", "?"}));
  Reopen(true);
  EXPECT_EQ(Get(kImages, 2), (std::vector<CVXProperty>{"nowhere", "two", "?"}));
  ASSERT_EQ(db_.GetTable(table), VX_OK);
  EXPECT_EQ(table.Properties().Name, "Pictures");
  ASSERT_EQ(table.Columns().size(), 3u);
  EXPECT_EQ(table.Columns()[0].Id, place);
  EXPECT_EQ(table.Columns()[1].Id, 1u);
  EXPECT_GT(table.Columns()[2].Id, place);  // ids are never given twice

  // Two columns with one id, or a column of no valid type.
  Reopen(false);
  CVXTable twice(kImages);
  twice.Columns() = {Column(5, "a", vptInt32), Column(5, "b", vptInt32)};
  EXPECT_EQ(db_.SetTable(twice), VX_NOT_FOUND);
  twice.Columns()[1] = Column(0, "b", 13);
  EXPECT_EQ(db_.SetTable(twice), VX_NOT_FOUND);
}

TEST_F(PropDBTest, SortedOids) {
  CVXTable table(kImages);
  ASSERT_EQ(db_.GetTable(table), VX_OK);
  uint32_t title = table.FindColumn("Title"), rating = table.FindColumn("Rating");
  EXPECT_EQ(Add(kImages, 5, {CVXProperty("b"), int32_t{2}}), VX_OK);
  EXPECT_EQ(Add(kImages, 1, {CVXProperty("B"), int32_t{1}}), VX_OK);
  EXPECT_EQ(Add(kImages, 3, {CVXProperty("a")}), VX_OK);  // rating by default 0
  EXPECT_EQ(Add(kImages, 4, {CVXProperty(), int32_t{2}}), VX_OK);
  EXPECT_EQ(Add(kImages, 2, {CVXProperty("b"), int32_t{2}}), VX_OK);

  EXPECT_EQ(Oids(kImages, {{title, true}}), (std::vector<uint32_t>{4, 3, 1, 2, 5}));
  EXPECT_EQ(Oids(kImages, {{title, false}}), (std::vector<uint32_t>{1, 2, 5, 3, 4}));
  EXPECT_EQ(Oids(kImages, {{rating, false}, {title, true}}),
            (std::vector<uint32_t>{4, 2, 5, 1, 3}));
  EXPECT_EQ(Oids(kImages, {{rating, true}}), (std::vector<uint32_t>{3, 1, 2, 4, 5}));
  std::vector<uint32_t> oids = {42};
  std::vector<CVXPropDB::SSortItem> unknown = {{99, true}};
  EXPECT_EQ(db_.GetRecordOids(kImages, oids, &unknown), VX_NOT_FOUND);
  EXPECT_EQ(oids, std::vector<uint32_t>{42});
}

TEST_F(PropDBTest, ReadOnlyStoreRefusesEveryWrite) {
  EXPECT_EQ(Add(kImages, 1, {CVXProperty("x")}), VX_OK);
  CQRLLogfile log;
  log.SetCapture(true);
  db_.SetLogfile(&log);
  Reopen(true);
  EXPECT_EQ(Add(kImages, 2, {}), VX_NOT_FOUND);
  EXPECT_EQ(db_.SetRecord(kImages, 1, {}), VX_NOT_FOUND);
  EXPECT_EQ(db_.RemoveRecord(kImages, 1), VX_NOT_FOUND);
  CVXTable table(kImages);
  ASSERT_EQ(db_.GetTable(table), VX_OK);
  table.AddColumn("more", vptBool);
  EXPECT_EQ(db_.SetTable(table), VX_NOT_FOUND);
  EXPECT_EQ(db_.Optimize(dir_ / "opt.vxp", nullptr, nullptr), VX_NOT_FOUND);
  EXPECT_FALSE(log.Captured().empty());
  db_.SetLogfile(nullptr);

  Reopen(false);
  EXPECT_EQ(Get(kImages, 1)[0].String(), "x");
  ASSERT_EQ(db_.GetTable(table), VX_OK);
  EXPECT_EQ(table.Columns().size(), 2u);
}

TEST_F(PropDBTest, OpenRefusesWhatIsNotAPropertyDatabase) {
  CVXPropDB second;
  EXPECT_EQ(second.Open(path_, true), VX_SHARING_VIOLATION);
  EXPECT_EQ(second.Open(dir_ / "missing.vxp", false), VX_NOT_FOUND);
  CQRLBlobDB plain;
  std::string plainPath = dir_ / "plain.vxt";
  ASSERT_EQ(plain.Create(plainPath, 0), VX_OK);
  plain.Close();
  EXPECT_EQ(second.Open(plainPath, false), VX_NOT_FOUND);
  EXPECT_FALSE(second.IsOpen());
  std::vector<CVXProperty> row;
  EXPECT_EQ(second.GetRecord(kImages, 1, row), VX_NOT_FOUND);
  EXPECT_EQ(second.Close(), VX_OK);
}

TEST_F(PropDBTest, JunkRowsAndDefinitionsAreReportedNotFatal) {
  EXPECT_EQ(Add(kImages, 1, {CVXProperty("fine")}), VX_OK);
  CVXTable other(55);
  other.AddColumn("x", vptInt32);
  ASSERT_EQ(db_.CreateTable(other), VX_OK);
  EXPECT_EQ(Add(55, 1, {int32_t{1}}), VX_OK);
  unsigned long errors = 0;
  std::ostringstream clean;
  EXPECT_EQ(db_.SelfTest(clean, errors, nullptr, nullptr), VX_OK);
  EXPECT_EQ(errors, 0u);

  PutRawRow(kImages, 2, "junk");
  PutRawRow(kImages, 3, std::string("\x01\x00\xff\xff\xff\x7f", 6));  // count beyond the bytes
  PutRawRow(kImages, 4, std::string("\x01\x00\x01\x00\x00\x00\x00\x00\x00\x00\x00", 11));
  PutRawRow(77, 1, std::string("\x01\x00\x00\x00\x00\x00", 6));  // undefined table
  PutRawRow(kImages, 5, std::string("\x01\x00\x03\x00\x00\x00", 6) + std::string(12, '\0'));
  PutRaw("vxprop_tables", 55, std::string("\x01\x00\x37\x00\x00\x00", 6));  // cut short
  Reopen(false);
  EXPECT_EQ(db_.GetTable(other), VX_NOT_FOUND);
  EXPECT_EQ(Add(55, 2, {}), VX_NOT_FOUND);
  std::vector<CVXProperty> row = {CVXProperty("kept")};
  for (uint32_t oid : {2u, 3u, 4u}) {
    EXPECT_EQ(db_.GetRecord(kImages, oid, row), VX_NOT_FOUND) << oid;
    EXPECT_TRUE(db_.HasRecord(kImages, oid));
  }
  EXPECT_EQ(row, std::vector<CVXProperty>{CVXProperty("kept")});
  CVXTable table(kImages);
  ASSERT_EQ(db_.GetTable(table), VX_OK);
  // Junk sorts as empty values; the listing still holds every row.
  EXPECT_EQ(Oids(kImages, {{table.FindColumn("Title"), true}}),
            (std::vector<uint32_t>{2, 3, 4, 5, 1}));

  std::ostringstream report;
  EXPECT_EQ(db_.SelfTest(report, errors, nullptr, nullptr), VX_SELFTEST_ERRORS);
  EXPECT_EQ(errors, 7u);  // five rows, table 55, and its row now without a table
  for (const char* name :
       {"1000/2 ", "1000/3 ", "1000/4 ", "77/1 ", "1000/5 ", "table 55 ", "55/1 "}) {
    EXPECT_NE(report.str().find(name), std::string::npos) << name << "\n" << report.str();
  }
  // The junk is still there, untouched, after the test.
  EXPECT_TRUE(db_.HasRecord(77, 1));
  EXPECT_EQ(db_.RemoveRecord(77, 1), VX_OK);
}

TEST_F(PropDBTest, OptimizeKeepsEverything) {
  for (uint32_t oid = 1; oid <= 300; ++oid) {
    ASSERT_EQ(Add(kImages, oid, {CVXProperty(std::string(200, 'a')), int32_t(oid)}), VX_OK);
  }
  for (uint32_t oid = 1; oid <= 300; oid += 2) ASSERT_EQ(db_.RemoveRecord(kImages, oid), VX_OK);
  std::vector<CVXProperty> before = Get(kImages, 150);
  ASSERT_EQ(db_.Optimize(dir_ / "opt.vxp", nullptr, nullptr), VX_OK);
  EXPECT_EQ(Get(kImages, 150), before);
  EXPECT_EQ(Oids(kImages).size(), 150u);
  EXPECT_EQ(Add(kImages, 1, {}), VX_OK);
  Reopen(false);
  EXPECT_EQ(Oids(kImages).size(), 151u);
}

}  // namespace
