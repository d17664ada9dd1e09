#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "SQLiteTransaction.h"
#include "VXXMPDB.h"
#include "vxtest.h"

namespace {

using Oids = std::vector<uint32_t>;

SXMPRecord Rec(uint32_t oid, std::string packet, int32_t rating = 0, std::string label = "") {
  SXMPRecord r;
  r.Oid = oid;
  r.Packet = std::move(packet);
  r.Rating = rating;
  r.Label = std::move(label);
  return r;
}

class XMPDBTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_EQ(db.Create(path), 0) << db.GetLastErrorMsg(); }

  void Put(SXMPRecord r, bool pending = false) { ASSERT_EQ(db.Set(r, pending), 0); }
  // The record of oid as "packet|rating|label[|pending]", or "-" when it has none.
  std::string Stored(uint32_t oid, bool clearPending = false) {
    SXMPRecord r;
    r.Oid = oid;
    if (db.Get(r, clearPending) != 0) return "-";
    return r.Packet + "|" + std::to_string(r.Rating) + "|" + r.Label +
           (r.PendingWriteBack ? "|pending" : "");
  }
  Oids Query(const std::string& tag, const std::string& text, int flag) {
    Oids oids;
    EXPECT_EQ(db.FTIQuery(tag, text, flag, oids, 0, 0), 0) << db.GetLastErrorMsg();
    return oids;
  }
  size_t FTICount(uint32_t oid) {
    std::vector<SFTIRecord> records;
    EXPECT_EQ(db.FTIGet(oid, records), 0);
    return records.size();
  }

  vxtest::TempDir dir;
  std::string path = dir / "x.v3x";
  CVXXMPDB db;
};

TEST_F(XMPDBTest, SetGetDeleteAndThePendingFlag) {
  SXMPRecord in = Rec(5, std::string("<x:xmpmeta>\0\xff</x:xmpmeta>", 25), -1, "Rot");
  ASSERT_EQ(db.Set(in, true), 0);
  EXPECT_TRUE(in.PendingWriteBack);
  Put(Rec(3, "other"), true);
  Put(Rec(4, "third"), false);
  Oids pending;
  ASSERT_EQ(db.GetPendingUpdates(pending), 0);
  EXPECT_EQ(pending, (Oids{3, 5}));

  EXPECT_EQ(Stored(5, true), in.Packet + "|-1|Rot|pending");  // as it was stored; cleared now
  EXPECT_EQ(Stored(5, true), in.Packet + "|-1|Rot");
  ASSERT_EQ(db.GetPendingUpdates(pending), 0);
  EXPECT_EQ(pending, (Oids{3}));

  SXMPRecord missing = Rec(6, "untouched");
  EXPECT_EQ(db.Get(missing, false), -1);
  EXPECT_EQ(missing.Packet, "untouched");
  EXPECT_NE(db.GetLastErrorMsg().find("OID 6"), std::string::npos);
  SXMPRecord zero = Rec(0, "x");
  EXPECT_EQ(db.Set(zero, false), -1);

  ASSERT_EQ(db.FTISetU(5, {{"dc:title", "t"}}), 0);
  EXPECT_EQ(db.Delete(5), 0);
  EXPECT_EQ(Stored(5), "-");
  EXPECT_EQ(FTICount(5), 1u);  // Delete leaves the full-text records
  EXPECT_EQ(db.Delete(5), 0);
}

TEST_F(XMPDBTest, RankAndLabelLists) {
  Put(Rec(1, "", 5, "Grün"));
  Put(Rec(2, "", -1, "GRÜN"));
  Put(Rec(3, "", 0, "Red"));
  Put(Rec(4, "", 5));
  Put(Rec(5, "", 0, "grüne"));
  Oids oids;
  ASSERT_EQ(db.GetOidsForRank(5, oids), 0);
  EXPECT_EQ(oids, (Oids{1, 4}));
  ASSERT_EQ(db.GetOidsWithRank(oids), 0);
  EXPECT_EQ(oids, (Oids{1, 2, 4}));
  ASSERT_EQ(db.GetOidsForLabel("grün", oids), 0);
  EXPECT_EQ(oids, (Oids{1, 2}));
  ASSERT_EQ(db.GetOidsForLabel("", oids), 0);
  EXPECT_TRUE(oids.empty());
  ASSERT_EQ(db.GetOidsWithLabel(oids), 0);
  EXPECT_EQ(oids, (Oids{1, 2, 3, 5}));
}

TEST_F(XMPDBTest, MoveAndCopyReKeyBothKindsOfData) {
  Put(Rec(1, "one", 3, "Blue"), true);
  ASSERT_EQ(db.FTISetU(1, {{"dc:subject", "beach"}, {"dc:subject", "sun"}}), 0);
  ASSERT_EQ(db.FTISetU(2, {{"dc:subject", "rain"}}), 0);
  Put(Rec(3, "three"));
  // The target has full-text data, an XMP record, is the source; no source data; OID 0.
  for (auto [from, to] :
       std::vector<std::pair<uint32_t, uint32_t>>{{1, 2}, {1, 3}, {1, 1}, {7, 8}, {0, 8}, {1, 0}}) {
    EXPECT_EQ(db.Move(from, to), -1) << from << " " << to;
  }
  ASSERT_EQ(db.Move(1, 9), 0) << db.GetLastErrorMsg();
  EXPECT_EQ(Stored(1), "-");
  EXPECT_EQ(FTICount(1), 0u);
  EXPECT_EQ(Stored(9), "one|3|Blue|pending");
  EXPECT_EQ(Query("dc:subject", "bea", 1), (Oids{9}));
  ASSERT_EQ(db.Move(2, 4), 0);  // full-text data alone is enough
  EXPECT_EQ(Query("", "rain", 2), (Oids{4}));

  // Copy replaces whatever the target had.
  ASSERT_EQ(db.FTISetU(3, {{"dc:title", "old"}}), 0);
  ASSERT_EQ(db.Copy(9, 3), 0) << db.GetLastErrorMsg();
  EXPECT_EQ(Stored(9), "one|3|Blue|pending");
  EXPECT_EQ(Stored(3), "one|3|Blue|pending");
  EXPECT_EQ(FTICount(3), 2u);
  EXPECT_EQ(Query("dc:subject", "beach", 2), (Oids{3, 9}));
  EXPECT_TRUE(Query("", "old", 2).empty());
  ASSERT_EQ(db.Copy(9, 9), 0);
  EXPECT_EQ(FTICount(9), 2u);
  EXPECT_EQ(db.Copy(5, 6), -1);
  EXPECT_EQ(db.Copy(9, 0), -1);
  ASSERT_EQ(db.Copy(4, 3), 0);  // the target's XMP record goes with the rest
  EXPECT_EQ(Stored(3), "-");
  EXPECT_EQ(Query("", "rain", 2), (Oids{3, 4}));
}

TEST_F(XMPDBTest, ReopenKeepsDataAndRefusesOtherFiles) {
  Put(Rec(1, "one", 1, "L"), true);
  ASSERT_EQ(db.FTISetU(1, {{"dc:subject", "Strand"}}), 0);
  ASSERT_EQ(db.Close(), 0);
  ASSERT_EQ(db.Open(path), 0) << db.GetLastErrorMsg();
  EXPECT_EQ(Stored(1), "one|1|L|pending");
  EXPECT_EQ(Query("dc:subject", "str", 1), (Oids{1}));

  // An SQLite file of another kind is refused and left unlocked.
  CVXSQLite plain;
  ASSERT_EQ(plain.Create(dir / "plain.db"), 0);
  ASSERT_EQ(plain.Execute("CREATE TABLE xmp(x)"), 0);
  ASSERT_EQ(plain.Close(), 0);
  CVXXMPDB other;
  EXPECT_EQ(other.Open(dir / "plain.db"), -1);
  EXPECT_NE(other.GetLastErrorMsg().find("not an XMP database"), std::string::npos);
  EXPECT_FALSE(other.IsOpen());
  EXPECT_EQ(plain.Open(dir / "plain.db"), 0);

  EXPECT_EQ(other.Open(path), 5);  // held by db
  db.Close();
  Oids oids;
  EXPECT_EQ(db.FTIQuery("", "", 0, oids, 0, 0), -1);
}

// Four threads work on their own files while a fifth rewrites a shared file in transactions,
// every third of which it abandons. A reader in a transaction must always see the shared
// file's XMP packet and full-text value from the same committed transaction.
TEST_F(XMPDBTest, ConcurrentCallsStayConsistent) {
  constexpr uint32_t kShared = 1;
  constexpr int kWrites = 300;
  std::atomic<bool> writing = true;
  std::atomic<int> failures = 0, torn = 0, reads = 0;

  std::thread writer([&] {
    for (int n = 0; n < kWrites; ++n) {
      CSQLiteTransaction trans(db);
      if (!trans.BeginTrans()) ++failures;
      bool keep = n % 3 != 0;
      std::string v = keep ? "v" + std::to_string(n) : "abandoned";
      SXMPRecord r = Rec(kShared, v);
      if (db.Set(r, false) != 0) ++failures;
      std::this_thread::yield();
      if (db.FTISetU(kShared, {{"t", v}}) != 0) ++failures;
      if (keep && !trans.Commit()) ++failures;
    }
    writing = false;
  });
  auto worker = [&](uint32_t base) {
    for (uint32_t k = 0; writing || k < 50; ++k) {
      uint32_t oid = base + k % 20;
      std::string v = "w" + std::to_string(base) + "-" + std::to_string(k);
      SXMPRecord r = Rec(oid, v);
      if (db.Set(r, false) != 0 || Stored(oid) != v + "|0|") ++failures;
      if (db.FTISetU(oid, {{"w", v}}) != 0) ++failures;
      Oids hit;
      if (db.FTIQuery("w", v, 0, hit, 0, 0) != 0 || hit != Oids{oid}) ++failures;

      CSQLiteTransaction trans(db);
      if (!trans.BeginTrans()) ++failures;
      SXMPRecord shared = Rec(kShared, "");
      std::vector<SFTIRecord> fti;
      if (db.Get(shared, false) == 0 && db.FTIGet(kShared, fti) == 0) {
        ++reads;
        if (fti.size() != 1 || fti[0].Value != shared.Packet) ++torn;
        if (shared.Packet == "abandoned") ++torn;
      }
      trans.Commit();
    }
  };
  std::vector<std::thread> workers;
  for (uint32_t i = 1; i <= 4; ++i) workers.emplace_back(worker, i * 1000);
  writer.join();
  for (auto& w : workers) w.join();

  EXPECT_EQ(failures, 0);
  EXPECT_EQ(torn, 0);
  EXPECT_GT(reads, 0);
  EXPECT_EQ(Stored(kShared), "v" + std::to_string(kWrites - 1) + "|0|");
  EXPECT_EQ(Query("w", "", 0).size(), 80u);
}

}  // namespace
