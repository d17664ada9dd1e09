#include "VXXMPDB.h"

#include <algorithm>
#include <unordered_set>

#include "FTIText.h"
#include "SQLiteStatement.h"
#include "SQLiteTransaction.h"
#include "bitvector.h"
#include "xstring.h"

namespace {

// "V3X" and the schema version, in the header of the file: Open refuses other SQLite files.
constexpr int64_t kApplicationId = 0x56335800;
constexpr int64_t kSchemaVersion = 1;

// fti holds the records; fti_words is an external-content FTS5 index over fti.value, kept in
// step by the triggers (an update of oid alone, as in Move, leaves the word index alone).
// fti_tag_value serves the exact queries, the value lists and the sort values of a tag.
constexpr const char* kSchema = R"sql(
BEGIN;
CREATE TABLE xmp(
  oid INTEGER PRIMARY KEY,
  packet TEXT NOT NULL,
  rating INTEGER NOT NULL,
  label TEXT NOT NULL,
  pending INTEGER NOT NULL);
CREATE INDEX xmp_rating ON xmp(rating);
CREATE INDEX xmp_labelled ON xmp(oid, label) WHERE label <> '';
CREATE INDEX xmp_pending ON xmp(oid) WHERE pending <> 0;
CREATE TABLE fti(
  id INTEGER PRIMARY KEY,
  oid INTEGER NOT NULL,
  tag TEXT NOT NULL,
  value TEXT NOT NULL);
CREATE INDEX fti_oid ON fti(oid);
CREATE INDEX fti_tag_value ON fti(tag, value, oid);
CREATE VIRTUAL TABLE fti_words USING fts5(value, content='fti', content_rowid='id',
  tokenize='unicode61 remove_diacritics 2', prefix='2 3');
CREATE TRIGGER fti_insert AFTER INSERT ON fti BEGIN
  INSERT INTO fti_words(rowid, value) VALUES (new.id, new.value);
END;
CREATE TRIGGER fti_delete AFTER DELETE ON fti BEGIN
  INSERT INTO fti_words(fti_words, rowid, value) VALUES ('delete', old.id, old.value);
END;
CREATE TRIGGER fti_update AFTER UPDATE OF value ON fti BEGIN
  INSERT INTO fti_words(fti_words, rowid, value) VALUES ('delete', old.id, old.value);
  INSERT INTO fti_words(rowid, value) VALUES (new.id, new.value);
END;
PRAGMA application_id = 1446205440;
PRAGMA user_version = 1;
COMMIT;
)sql";
static_assert(kApplicationId == 1446205440);

// Statements that exist for "any tag" ([0]) and for one tag ([1], which binds ?1). Only one
// tag's variant can use the (tag, value) index.
using TagSql = const char* const[2];
// OID lists come back unsorted and with repeats; SortDistinct is cheaper than SQL's DISTINCT.
constexpr TagSql kTagOids = {"SELECT oid FROM fti", "SELECT oid FROM fti WHERE tag = ?1"};
constexpr TagSql kTagValues = {"SELECT DISTINCT value FROM fti",
                               "SELECT DISTINCT value FROM fti WHERE tag = ?1"};
// In value order (the index's order for one tag), so a file's first row holds its least value;
// this streams where GROUP BY oid would sort every row.
constexpr TagSql kTagByValue = {"SELECT oid, value FROM fti ORDER BY value",
                                "SELECT oid, value FROM fti WHERE tag = ?1 ORDER BY value"};
// CROSS JOIN keeps the word index in the outer loop: otherwise SQLite walks the tag's rows
// and runs the word query once for each.
constexpr TagSql kWordMatch = {
    "SELECT f.oid FROM fti_words CROSS JOIN fti AS f ON f.id = fti_words.rowid "
    "WHERE fti_words MATCH ?2",
    "SELECT f.oid FROM fti_words CROSS JOIN fti AS f ON f.id = fti_words.rowid "
    "WHERE fti_words MATCH ?2 AND f.tag = ?1"};
// Candidates of an exact query, ?2 the text: equal values, values in [?2, ?3), or a scan of
// the values holding the text. The scan compares bytes (as blobs): as text, instr steps over
// what it takes for UTF-8 tails and could miss a cut that starts at a stray byte.
constexpr TagSql kEqual = {"SELECT oid, value FROM fti WHERE value = ?2",
                           "SELECT oid, value FROM fti WHERE tag = ?1 AND value = ?2"};
constexpr TagSql kRange = {
    "SELECT oid, value FROM fti WHERE value >= ?2 AND value < ?3",
    "SELECT oid, value FROM fti WHERE tag = ?1 AND value >= ?2 AND value < ?3"};
constexpr TagSql kContains = {
    "SELECT oid, value FROM fti WHERE instr(CAST(value AS BLOB), CAST(?2 AS BLOB)) > 0",
    "SELECT oid, value FROM fti "
    "WHERE tag = ?1 AND instr(CAST(value AS BLOB), CAST(?2 AS BLOB)) > 0"};

const char* ForTag(const TagSql& sql, const std::string& tag) { return sql[tag.empty() ? 0 : 1]; }

uint32_t OidAt(const CSQLiteStatement& s, int column) {
  return static_cast<uint32_t>(s.Int64(column));
}

// Case-insensitive order made total by a byte-wise tie-break.
bool TextLess(const std::string& a, const std::string& b) {
  int c = xstring_comparenocase(a, b);
  return c != 0 ? c < 0 : a < b;
}

void SortDistinct(std::vector<uint32_t>& oids) {
  std::sort(oids.begin(), oids.end());
  oids.erase(std::unique(oids.begin(), oids.end()), oids.end());
}

std::string OidText(uint32_t oid) { return "OID " + std::to_string(oid); }

}  // namespace

int CVXXMPDB::Create(const std::string& path) {
  std::lock_guard lock(Mutex());
  return Prepare_(CVXSQLite::Create(path), true);
}

int CVXXMPDB::Open(const std::string& path) {
  std::lock_guard lock(Mutex());
  return Prepare_(CVXSQLite::Open(path), false);
}

int CVXXMPDB::Prepare_(int opened, bool created) {
  if (opened) return opened;
  int rc = created ? Execute(kSchema) : CheckSchema_();
  if (rc) CVXSQLite::Close();
  return rc;
}

int CVXXMPDB::CheckSchema_() {
  int64_t app = 0, version = 0;
  auto read = [](int64_t& out) {
    return [&out](const CSQLiteStatement& s) {
      out = s.Int64(0);
      return false;
    };
  };
  if (int rc = Query("PRAGMA application_id", nullptr, read(app))) return rc;
  if (int rc = Query("PRAGMA user_version", nullptr, read(version))) return rc;
  if (app != kApplicationId) return Fail(-1, "not an XMP database");
  if (version != kSchemaVersion) {
    return Fail(-1, "XMP database of unknown version " + std::to_string(version));
  }
  return 0;
}

// ---- XMP records

int CVXXMPDB::Set(SXMPRecord& rec, bool pending) {
  if (rec.Oid == 0) return Fail(-1, "OID 0 cannot hold XMP data");
  int rc = Query(
      "INSERT OR REPLACE INTO xmp(oid, packet, rating, label, pending) "
      "VALUES (?1, ?2, ?3, ?4, ?5)",
      [&](CSQLiteStatement& s) {
        s.Bind(1, int64_t{rec.Oid}).Bind(2, rec.Packet).Bind(3, int64_t{rec.Rating});
        s.Bind(4, rec.Label).Bind(5, int64_t{pending});
      });
  if (rc == 0) rec.PendingWriteBack = pending;
  return rc;
}

int CVXXMPDB::Get(SXMPRecord& rec, bool clearPending) {
  std::lock_guard lock(Mutex());
  SXMPRecord found;
  found.Oid = rec.Oid;
  bool hit = false;
  int rc = Query(
      "SELECT packet, rating, label, pending FROM xmp WHERE oid = ?1",
      [&](CSQLiteStatement& s) { s.Bind(1, int64_t{rec.Oid}); },
      [&](const CSQLiteStatement& s) {
        found.Packet = s.Text(0);
        found.Rating = static_cast<int32_t>(s.Int64(1));
        found.Label = s.Text(2);
        found.PendingWriteBack = s.Int64(3) != 0;
        hit = true;
        return false;
      });
  if (rc) return rc;
  if (!hit) return Miss("no XMP record for " + OidText(rec.Oid));
  if (clearPending && found.PendingWriteBack) {
    rc = Query("UPDATE xmp SET pending = 0 WHERE oid = ?1",
               [&](CSQLiteStatement& s) { s.Bind(1, int64_t{rec.Oid}); });
    if (rc) return rc;
  }
  rec = std::move(found);
  return 0;
}

int CVXXMPDB::Delete(uint32_t oid) {
  return Query("DELETE FROM xmp WHERE oid = ?1",
               [&](CSQLiteStatement& s) { s.Bind(1, int64_t{oid}); });
}

int CVXXMPDB::HasData_(uint32_t oid, bool& has) {
  has = false;
  return Query(
      "SELECT EXISTS (SELECT 1 FROM xmp WHERE oid = ?1) OR EXISTS (SELECT 1 FROM fti WHERE oid = "
      "?1)",
      [&](CSQLiteStatement& s) { s.Bind(1, int64_t{oid}); },
      [&](const CSQLiteStatement& s) {
        has = s.Int64(0) != 0;
        return false;
      });
}

int CVXXMPDB::RemoveAll_(uint32_t oid) {
  auto bind = [&](CSQLiteStatement& s) { s.Bind(1, int64_t{oid}); };
  if (int rc = Query("DELETE FROM xmp WHERE oid = ?1", bind)) return rc;
  return Query("DELETE FROM fti WHERE oid = ?1", bind);
}

int CVXXMPDB::Move(uint32_t from, uint32_t to) {
  if (from == 0 || to == 0) return Fail(-1, "Move: OID 0 holds no XMP data");
  CSQLiteTransaction trans(*this);
  if (!trans.BeginTrans()) return -1;
  bool hasFrom = false, hasTo = false;
  if (int rc = HasData_(from, hasFrom)) return rc;
  if (int rc = HasData_(to, hasTo)) return rc;
  if (!hasFrom) return Fail(-1, "Move: no XMP data for " + OidText(from));
  if (hasTo) return Fail(-1, "Move: " + OidText(to) + " already has XMP data");
  auto bind = [&](CSQLiteStatement& s) { s.Bind(1, int64_t{from}).Bind(2, int64_t{to}); };
  if (int rc = Query("UPDATE xmp SET oid = ?2 WHERE oid = ?1", bind)) return rc;
  if (int rc = Query("UPDATE fti SET oid = ?2 WHERE oid = ?1", bind)) return rc;
  return trans.Commit() ? 0 : -1;
}

int CVXXMPDB::Copy(uint32_t from, uint32_t to) {
  if (from == 0 || to == 0) return Fail(-1, "Copy: OID 0 holds no XMP data");
  CSQLiteTransaction trans(*this);
  if (!trans.BeginTrans()) return -1;
  bool hasFrom = false;
  if (int rc = HasData_(from, hasFrom)) return rc;
  if (!hasFrom) return Fail(-1, "Copy: no XMP data for " + OidText(from));
  if (from == to) return trans.Commit() ? 0 : -1;
  if (int rc = RemoveAll_(to)) return rc;
  auto bind = [&](CSQLiteStatement& s) { s.Bind(1, int64_t{from}).Bind(2, int64_t{to}); };
  int rc = Query(
      "INSERT INTO xmp(oid, packet, rating, label, pending) "
      "SELECT ?2, packet, rating, label, pending FROM xmp WHERE oid = ?1",
      bind);
  if (rc) return rc;
  rc = Query(
      "INSERT INTO fti(oid, tag, value) SELECT ?2, tag, value FROM fti WHERE oid = ?1 "
      "ORDER BY id",
      bind);
  if (rc) return rc;
  return trans.Commit() ? 0 : -1;
}

// ---- OID lists

template <typename T, typename Add>
int CVXXMPDB::Collect_(const char* sql, const Binder& bind, std::vector<T>& out, Add add) {
  std::vector<T> found;
  int rc = Query(sql, bind, [&](const CSQLiteStatement& s) {
    add(s, found);
    return true;
  });
  if (rc == 0) out.swap(found);
  return rc;
}

int CVXXMPDB::Oids_(const char* sql, const Binder& bind, std::vector<uint32_t>& oids) {
  return Collect_(sql, bind, oids, [](const CSQLiteStatement& s, std::vector<uint32_t>& found) {
    found.push_back(OidAt(s, 0));
  });
}

int CVXXMPDB::GetPendingUpdates(std::vector<uint32_t>& oids) {
  return Oids_("SELECT oid FROM xmp WHERE pending <> 0 ORDER BY oid", nullptr, oids);
}

int CVXXMPDB::GetOidsForRank(int32_t rank, std::vector<uint32_t>& oids) {
  return Oids_(
      "SELECT oid FROM xmp WHERE rating = ?1 ORDER BY oid",
      [&](CSQLiteStatement& s) { s.Bind(1, int64_t{rank}); }, oids);
}

int CVXXMPDB::GetOidsWithRank(std::vector<uint32_t>& oids) {
  return Oids_("SELECT oid FROM xmp WHERE rating <> 0 ORDER BY oid", nullptr, oids);
}

// Labels are few and short; the comparison is the library's own case folding, which SQLite's
// NOCASE (ASCII only) is not, so the labelled rows are compared here.
int CVXXMPDB::GetOidsForLabel(const std::string& label, std::vector<uint32_t>& oids) {
  if (label.empty()) {
    oids.clear();
    return 0;
  }
  return Collect_("SELECT oid, label FROM xmp WHERE label <> '' ORDER BY oid", nullptr, oids,
                  [&](const CSQLiteStatement& s, std::vector<uint32_t>& found) {
                    if (xstring_comparenocase(std::string(s.Text(1)), label) == 0) {
                      found.push_back(OidAt(s, 0));
                    }
                  });
}

int CVXXMPDB::GetOidsWithLabel(std::vector<uint32_t>& oids) {
  return Oids_("SELECT oid FROM xmp WHERE label <> '' ORDER BY oid", nullptr, oids);
}

// ---- Full-text records

int CVXXMPDB::FTISetU(uint32_t oid, const std::vector<SFTIRecord>& records) {
  if (oid == 0) return Fail(-1, "OID 0 cannot hold full-text records");
  CSQLiteTransaction trans(*this);
  if (!trans.BeginTrans()) return -1;
  if (int rc = FTIDelete(oid)) return rc;
  for (const SFTIRecord& r : records) {
    int rc = Query(
        "INSERT INTO fti(oid, tag, value) VALUES (?1, ?2, ?3)",
        [&](CSQLiteStatement& s) { s.Bind(1, int64_t{oid}).Bind(2, r.Tag).Bind(3, r.Value); });
    if (rc) return rc;
  }
  return trans.Commit() ? 0 : -1;
}

int CVXXMPDB::FTIGet(uint32_t oid, std::vector<SFTIRecord>& records) {
  return Collect_(
      "SELECT tag, value FROM fti WHERE oid = ?1 ORDER BY id",
      [&](CSQLiteStatement& s) { s.Bind(1, int64_t{oid}); }, records,
      [](const CSQLiteStatement& s, std::vector<SFTIRecord>& found) {
        found.push_back({std::string(s.Text(0)), std::string(s.Text(1))});
      });
}

int CVXXMPDB::FTIDelete(uint32_t oid) {
  return Query("DELETE FROM fti WHERE oid = ?1",
               [&](CSQLiteStatement& s) { s.Bind(1, int64_t{oid}); });
}

int CVXXMPDB::FTIGetTags(std::vector<SFTITag>& tags) {
  return Collect_("SELECT tag, COUNT(DISTINCT oid) FROM fti GROUP BY tag ORDER BY tag", nullptr,
                  tags, [](const CSQLiteStatement& s, std::vector<SFTITag>& found) {
                    found.push_back({std::string(s.Text(0)), OidAt(s, 1)});
                  });
}

int CVXXMPDB::FTIGroupTags(const std::string& tag, std::vector<std::string>& values, int32_t start,
                           int32_t len) {
  std::vector<std::string> found;
  int rc = Collect_(
      ForTag(kTagValues, tag), [&](CSQLiteStatement& s) { s.Bind(1, tag); }, found,
      [&](const CSQLiteStatement& s, std::vector<std::string>& cuts) {
        std::string cut = FTIText::SubString(s.Text(0), start, len);
        if (!cut.empty()) cuts.push_back(std::move(cut));
      });
  if (rc) return rc;
  // Equal strings are neighbours in this total order, so unique() removes every duplicate.
  std::sort(found.begin(), found.end(), TextLess);
  found.erase(std::unique(found.begin(), found.end()), found.end());
  values.swap(found);
  return 0;
}

int CVXXMPDB::FTIQuery(const std::string& tag, const std::string& text, int flag,
                       std::vector<uint32_t>& oids, int32_t a, int32_t b) {
  const int mode = flag & 15;
  const bool limited = (flag & fqLimit) != 0;
  if (mode > fqFTS || (flag & ~(15 | fqLimit)) != 0) {
    return Fail(-1, "FTIQuery: unknown flag " + std::to_string(flag));
  }
  std::vector<uint32_t> found;
  auto bindTag = [&](CSQLiteStatement& s) { s.Bind(1, tag); };
  int rc = 0;
  if (mode == fqExact ? text.empty() : FTIText::IsBlank(text)) {
    rc = Oids_(ForTag(kTagOids, tag), bindTag, found);
  } else if (mode == fqExact) {
    std::string literal = FTIText::Unquote(text).value_or(text);
    rc = MatchExact_(tag, literal, limited ? 0 : a, limited ? 0 : b, found);
  } else {
    rc = MatchWords_(tag, mode == fqPrefix ? FTIText::PrefixQuery(text) : text, found);
  }
  if (rc) return rc;
  SortDistinct(found);
  if (limited && a > 0 && found.size() > static_cast<size_t>(a)) found.resize(a);
  oids.swap(found);
  return 0;
}

int CVXXMPDB::MatchWords_(const std::string& tag, const std::string& query,
                          std::vector<uint32_t>& oids) {
  return Oids_(
      ForTag(kWordMatch, tag), [&](CSQLiteStatement& s) { s.Bind(1, tag).Bind(2, query); }, oids);
}

// Picks the narrowest index range that holds every value whose cut can equal the text, then
// checks the cut of each candidate. A cut from 0 of len characters equals a text of len
// characters only in values beginning with it, and a shorter text only in values equal to it.
int CVXXMPDB::MatchExact_(const std::string& tag, const std::string& text, int32_t start,
                          int32_t len, std::vector<uint32_t>& oids) {
  if (start < 0) start = 0;
  std::optional<std::string> end;
  const TagSql* sql = &kContains;
  if (start == 0) {
    size_t chars = FTIText::CharCount(text);
    if (len > 0 && chars > static_cast<size_t>(len)) {
      oids.clear();
      return 0;
    }
    if (len <= 0 || chars < static_cast<size_t>(len)) {
      sql = &kEqual;
    } else if ((end = FTIText::PrefixEnd(text))) {
      sql = &kRange;
    }
  }
  auto bind = [&](CSQLiteStatement& s) {
    s.Bind(1, tag).Bind(2, text);
    if (end) s.Bind(3, *end);
  };
  return Collect_(ForTag(*sql, tag), bind, oids,
                  [&](const CSQLiteStatement& s, std::vector<uint32_t>& found) {
                    if (FTIText::SubString(s.Text(1), start, len) == text) {
                      found.push_back(OidAt(s, 0));
                    }
                  });
}

int CVXXMPDB::FTIGetSorted(const std::string& tag, std::vector<SFTISortItem>& items, bool ascending,
                           const CBitVector* only) {
  std::vector<SFTISortItem> found;
  std::unordered_set<uint32_t> seen;
  int rc = Collect_(
      ForTag(kTagByValue, tag), [&](CSQLiteStatement& s) { s.Bind(1, tag); }, found,
      [&](const CSQLiteStatement& s, std::vector<SFTISortItem>& least) {
        uint32_t oid = OidAt(s, 0);
        if ((!only || only->Get(oid)) && seen.insert(oid).second) {
          least.push_back({oid, std::string(s.Text(1))});
        }
      });
  if (rc) return rc;
  // Many files share a value (a keyword, a date); equal bytes need no case folding.
  std::sort(found.begin(), found.end(), [](const SFTISortItem& x, const SFTISortItem& y) {
    if (x.Value != y.Value) {
      int c = xstring_comparenocase(x.Value, y.Value);
      if (c != 0) return c < 0;
    }
    return x.Oid < y.Oid;
  });
  if (!ascending) std::reverse(found.begin(), found.end());
  items.swap(found);
  return 0;
}
