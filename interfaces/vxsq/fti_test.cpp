#include <gtest/gtest.h>

#include "VXXMPDB.h"
#include "bitvector.h"
#include "vxtest.h"

namespace {

using Oids = std::vector<uint32_t>;
using Strings = std::vector<std::string>;

class FTITest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(db.Create(dir / "f.v3x"), 0) << db.GetLastErrorMsg();
    Put(1, {{"dc:subject", "Sunset party"},
            {"dc:subject", "Beach"},
            {"xmp:CreateDate", "2021-05-03"},
            {"dc:creator", "Müller"}});
    Put(2,
        {{"dc:subject", "beach"}, {"xmp:CreateDate", "2021-07-14"}, {"dc:creator", "MÜLLER Hans"}});
    Put(3, {{"dc:subject", "Mountain"}, {"xmp:CreateDate", "2019-01-01"}});
    Put(4, {{"xmp:CreateDate", "2021"}});
    Put(5, {{"dc:title", "Beach"}});
  }
  void Put(uint32_t oid, const std::vector<SFTIRecord>& records) {
    ASSERT_EQ(db.FTISetU(oid, records), 0) << db.GetLastErrorMsg();
  }
  // The file's records as "tag=value;" in the order they were set.
  std::string Records(uint32_t oid) {
    std::vector<SFTIRecord> records{{"stale", "stale"}};
    EXPECT_EQ(db.FTIGet(oid, records), 0);
    std::string text;
    for (const auto& r : records) text += r.Tag + "=" + r.Value + ";";
    return text;
  }
  Oids Query(const std::string& tag, const std::string& text, int flag, int32_t a = 0,
             int32_t b = 0) {
    Oids oids{999};
    EXPECT_EQ(db.FTIQuery(tag, text, flag, oids, a, b), 0) << db.GetLastErrorMsg();
    return oids;
  }
  Strings Group(const std::string& tag, int32_t start, int32_t len) {
    Strings values{"stale"};
    EXPECT_EQ(db.FTIGroupTags(tag, values, start, len), 0) << db.GetLastErrorMsg();
    return values;
  }
  std::vector<std::pair<uint32_t, std::string>> Sorted(const std::string& tag, bool ascending,
                                                       const CBitVector* only = nullptr) {
    std::vector<SFTISortItem> items;
    EXPECT_EQ(db.FTIGetSorted(tag, items, ascending, only), 0);
    std::vector<std::pair<uint32_t, std::string>> out;
    out.reserve(items.size());
    for (const auto& i : items) out.emplace_back(i.Oid, i.Value);
    return out;
  }

  vxtest::TempDir dir;
  CVXXMPDB db;
};

TEST_F(FTITest, SetReplacesAllRecordsOfTheFile) {
  EXPECT_EQ(
      Records(1),
      "dc:subject=Sunset party;dc:subject=Beach;xmp:CreateDate=2021-05-03;dc:creator=Müller;");
  Put(1, {{"dc:subject", "Forest"}});
  EXPECT_EQ(Records(1), "dc:subject=Forest;");
  // The word index follows the records it replaced.
  EXPECT_EQ(Query("dc:subject", "bea", 1), (Oids{2}));
  EXPECT_EQ(Query("dc:subject", "for", 1), (Oids{1}));

  Put(1, {});
  EXPECT_EQ(Records(1), "");
  EXPECT_TRUE(Query("", "forest", 2).empty());
  ASSERT_EQ(db.FTIDelete(2), 0);
  EXPECT_EQ(db.FTIDelete(2), 0);
  EXPECT_TRUE(Query("", "beach", 2) == Oids{5});
  EXPECT_EQ(db.FTISetU(0, {{"t", "v"}}), -1);
  EXPECT_EQ(Records(77), "");
}

TEST_F(FTITest, TagsCountFiles) {
  Put(6, {{"dc:subject", "a"}, {"dc:subject", "b"}, {"dc:subject", "c"}});
  std::vector<SFTITag> tags;
  ASSERT_EQ(db.FTIGetTags(tags), 0);
  std::vector<std::pair<std::string, uint32_t>> got;
  got.reserve(tags.size());
  for (const auto& t : tags) got.emplace_back(t.Tag, t.Count);
  EXPECT_EQ(got,
            (std::vector<std::pair<std::string, uint32_t>>{
                {"dc:creator", 2}, {"dc:subject", 4}, {"dc:title", 1}, {"xmp:CreateDate", 4}}));
}

TEST_F(FTITest, GroupTagsCutsCharactersAndSortsIgnoringCase) {
  // Case variants stay distinct; case-insensitive order puts "Mountain" after both "beach"es.
  EXPECT_EQ(Group("dc:subject", 0, 0), (Strings{"Beach", "beach", "Mountain", "Sunset party"}));
  EXPECT_EQ(Group("xmp:CreateDate", 0, 4), (Strings{"2019", "2021"}));
  EXPECT_EQ(Group("xmp:CreateDate", -3, 4), (Strings{"2019", "2021"}));
  // "2021" has no characters from 5 on and drops out.
  EXPECT_EQ(Group("xmp:CreateDate", 5, 2), (Strings{"01", "05", "07"}));
  EXPECT_EQ(Group("xmp:CreateDate", 8, -1), (Strings{"01", "03", "14"}));
  // Characters, not bytes: "ü" is two bytes.
  EXPECT_EQ(Group("dc:creator", 1, 2), (Strings{"ÜL", "ül"}));
  EXPECT_EQ(Group("dc:creator", 6, 0), (Strings{" Hans"}));
  EXPECT_EQ(Group("", 0, 1), (Strings{"2", "B", "b", "M", "S"}));
  EXPECT_TRUE(Group("nope", 0, 0).empty());
}

TEST_F(FTITest, ExactQueryComparesTheCutValue) {
  EXPECT_EQ(Query("dc:subject", "Beach", 0), (Oids{1}));  // case counts
  EXPECT_EQ(Query("", "Beach", 0), (Oids{1, 5}));
  EXPECT_EQ(Query("dc:subject", "", 0), (Oids{1, 2, 3}));
  EXPECT_EQ(Query("", "", 0), (Oids{1, 2, 3, 4, 5}));
  EXPECT_TRUE(Query("dc:subject", "Beac", 0).empty());

  EXPECT_EQ(Query("xmp:CreateDate", "2021", 0, 0, 4), (Oids{1, 2, 4}));
  EXPECT_EQ(Query("xmp:CreateDate", "2021-05", 0, 0, 7), (Oids{1}));
  EXPECT_EQ(Query("xmp:CreateDate", "2021", 0, 0, 7), (Oids{4}));  // shorter than the cut
  EXPECT_TRUE(Query("xmp:CreateDate", "20215", 0, 0, 4).empty());  // longer than the cut
  EXPECT_EQ(Query("xmp:CreateDate", "07", 0, 5, 2), (Oids{2}));
  EXPECT_EQ(Query("xmp:CreateDate", "07-14", 0, 5, 0), (Oids{2}));
  EXPECT_EQ(Query("xmp:CreateDate", "0", 0, 5, 1), (Oids{1, 2, 3}));
  // A quoted text is the literal inside, quotes doubled; a broken quoting is compared as is.
  EXPECT_EQ(Query("dc:subject", "\"Beach\"", 0), (Oids{1}));
  Put(10, {{"q", "say \"hi\""}, {"q", "\"x\"\""}});
  EXPECT_EQ(Query("q", "\"say \"\"hi\"\"\"", 0), (Oids{10}));
  EXPECT_EQ(Query("q", "\"x\"\"", 0), (Oids{10}));
  EXPECT_TRUE(Query("q", "\"say \"hi\"\"", 0).empty());
  EXPECT_EQ(Query("dc:creator", "ül", 0, 1, 2), (Oids{1}));
  EXPECT_EQ(Query("dc:creator", "ÜL", 0, 1, 2), (Oids{2}));
  EXPECT_EQ(Query("", "2021", 0, 0, 4), (Oids{1, 2, 4}));

  // Values whose bytes end the index range (0xFF) are still found.
  Put(7, {{"raw", "a\xff\xff"}, {"raw", "a\xff"}});
  Put(8, {{"raw", "b"}});
  EXPECT_EQ(Query("raw", "a\xff", 0, 0, 2), (Oids{7}));
  EXPECT_EQ(Query("raw", "\xff", 0, 1, 1), (Oids{7}));
  // A cut may start at a byte that is no character of its own in valid UTF-8.
  Put(9, {{"raw", "\xe0\x80z"}});
  EXPECT_EQ(Query("raw", "\x80", 0, 1, 1), (Oids{9}));
}

TEST_F(FTITest, WordQueries) {
  EXPECT_EQ(Query("dc:subject", "bea", 1), (Oids{1, 2}));
  EXPECT_EQ(Query("dc:subject", "par sun", 1), (Oids{1}));
  EXPECT_TRUE(Query("dc:subject", "sun mount", 1).empty());  // all words in one value
  EXPECT_EQ(Query("", "bea", 1), (Oids{1, 2, 5}));
  EXPECT_EQ(Query("dc:creator", "muller", 1), (Oids{1, 2}));  // case and diacritics
  EXPECT_EQ(Query("dc:subject", " \t", 1), (Oids{1, 2, 3}));  // no words: every file
  EXPECT_EQ(Query("dc:subject", "\"bea", 1), (Oids{1, 2}));   // quotes are text here
  EXPECT_EQ(Query("dc:subject", "AND OR NOT", 1), Oids{});

  // Full-text query syntax goes to the index as it is.
  EXPECT_EQ(Query("dc:subject", "beach OR sunset", 2), (Oids{1, 2}));  // each file once
  EXPECT_EQ(Query("", "beach OR mountain", 2), (Oids{1, 2, 3, 5}));
}

TEST_F(FTITest, MalformedQueriesFailWithoutHarm) {
  // Bad syntax, a column filter, and unknown flags.
  for (auto [bad, flag, rc] : std::vector<std::tuple<const char*, int, int>>{
           {"nosuchcolumn: x", 2, 1}, {"x", 3, -1}, {"x", 32, -1}, {"AND (", 2, 1}}) {
    Oids oids{42};
    EXPECT_EQ(db.FTIQuery("dc:subject", bad, flag, oids, 0, 0), rc) << bad;
    EXPECT_EQ(oids, Oids{42}) << bad;
    EXPECT_FALSE(db.GetLastErrorMsg().empty());
  }
  EXPECT_NE(db.GetLastErrorMsg().find("syntax error"), std::string::npos);
  EXPECT_EQ(Query("dc:subject", "bea", 1), (Oids{1, 2}));  // still usable
}

TEST_F(FTITest, LimitKeepsTheLowestOids) {
  EXPECT_EQ(Query("xmp:CreateDate", "", 16, 2), (Oids{1, 2}));
  EXPECT_EQ(Query("xmp:CreateDate", "", 16, 0), (Oids{1, 2, 3, 4}));
  EXPECT_EQ(Query("", "bea", 1 | 16, 2), (Oids{1, 2}));
  EXPECT_EQ(Query("", "beach", 2 | 16, 1), (Oids{1}));
  // With the limit, b is no cut: the whole value is compared.
  EXPECT_EQ(Query("xmp:CreateDate", "2021", 16, 5, 4), (Oids{4}));
}

TEST_F(FTITest, SortedValuesPerFile) {
  using Items = std::vector<std::pair<uint32_t, std::string>>;
  // File 1's least value is "Beach"; "beach" ties with it and the OID decides.
  EXPECT_EQ(Sorted("dc:subject", true), (Items{{1, "Beach"}, {2, "beach"}, {3, "Mountain"}}));
  EXPECT_EQ(Sorted("dc:subject", false), (Items{{3, "Mountain"}, {2, "beach"}, {1, "Beach"}}));
  EXPECT_EQ(Sorted("dc:creator", true), (Items{{1, "Müller"}, {2, "MÜLLER Hans"}}));

  CBitVector only;
  only.Set(3);
  only.Set(2);
  only.Set(4000);
  EXPECT_EQ(Sorted("dc:subject", true, &only), (Items{{2, "beach"}, {3, "Mountain"}}));
  CBitVector none;
  EXPECT_TRUE(Sorted("dc:subject", true, &none).empty());
  EXPECT_EQ(Sorted("", true).size(), 5u);
}

}  // namespace
