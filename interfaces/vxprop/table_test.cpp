#include <gtest/gtest.h>

#include <tuple>

#include "VXException.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "VXTable.h"

namespace {

TEST(TableTest, ColumnLookupFollowsIdsNotPositions) {
  CVXTable table(1000);
  EXPECT_EQ(table.AddColumn("Title", vptString), 1u);
  EXPECT_EQ(table.AddColumn("Rating", vptInt32, CVXProperty(int32_t{3})), 2u);
  EXPECT_EQ(table.AddColumn("Bad", 13), 0u);
  EXPECT_EQ(table.AddColumn("Bad", vptEmpty), 0u);
  table.Columns()[0].Id = 7;  // ids need not follow positions
  EXPECT_EQ(table.AddColumn("Taken", vptDate), 8u);
  EXPECT_EQ(table.AddColumn("Title", vptLongText), 9u);

  SVXColumn column;
  ASSERT_TRUE(table.GetColumn(2, column));
  EXPECT_EQ(column.Name, "Rating");
  EXPECT_EQ(column.Default, CVXProperty(int32_t{3}));
  EXPECT_FALSE(table.GetColumn(1, column));
  EXPECT_EQ(table.FindColumn("Title"), 9u);  // the later of two equal names
  EXPECT_EQ(table.FindColumn("title"), 0u);
  EXPECT_EQ(table.ColumnIndex(8), 2);

  std::vector<CVXProperty> row = {CVXProperty("a"), CVXProperty(int32_t{5}), CVXProperty()};
  const CVXProperty* value = nullptr;
  ASSERT_TRUE(table.GetColumnData(2, row, value));
  EXPECT_EQ(value, &row[1]);
  EXPECT_TRUE(table.GetColumnData(8, row, value));
  EXPECT_FALSE(table.GetColumnData(9, row, value));   // row too short
  EXPECT_FALSE(table.GetColumnData(42, row, value));  // unknown id
  EXPECT_EQ(value, &row[2]);

  table.Columns().back().Id = UINT32_MAX;
  EXPECT_EQ(table.AddColumn("NoRoom", vptInt32), 0u);
}

TEST(TableTest, ColumnStreamRoundTripsAndRejectsBadTypes) {
  SVXColumn in{4, "Album", vptReference, CVXProperty::MakeReference(0), 1001, 2}, out;
  for (uint32_t type : {uint32_t{vptReference}, 0u, 13u}) {
    in.Type = type;
    CVXMemFile mem;
    mem << in;
    mem.Rewind();
    try {
      mem >> out;
      EXPECT_EQ(type, unsigned{vptReference}) << "type " << type << " accepted";
    } catch (CVXException* e) {
      EXPECT_EQ(e->GetCode(), VX_NOT_FOUND);
      delete e;
    }
    // A refused column leaves the last good one as it was.
    EXPECT_EQ(std::tie(out.Id, out.Name, out.Type, out.Default, out.LinkTable, out.LinkColumn),
              std::tuple(in.Id, in.Name, uint32_t{vptReference}, in.Default, in.LinkTable,
                         in.LinkColumn));
  }
}

}  // namespace
