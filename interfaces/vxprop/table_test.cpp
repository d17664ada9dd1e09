#include <gtest/gtest.h>

#include "VXException.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "VXTable.h"

namespace {

TEST(TableTest, ColumnLookupFollowsIdsNotPositions) {
  CVXTable table(1000);
  EXPECT_EQ(table.Properties().Table, 1000u);
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
  SVXColumn in;
  in.Id = 4;
  in.Name = "Album";
  in.Type = vptReference;
  in.Default = CVXProperty::MakeReference(0);
  in.LinkTable = 1001;
  in.LinkColumn = 2;
  CVXMemFile mem;
  mem << in;
  mem.Rewind();
  SVXColumn out;
  mem >> out;
  EXPECT_EQ(out.Id, 4u);
  EXPECT_EQ(out.Name, "Album");
  EXPECT_EQ(out.Type, unsigned{vptReference});
  EXPECT_EQ(out.Default.Type(), unsigned{vptReference});
  EXPECT_TRUE(out.IsLinked());
  EXPECT_EQ(out.LinkTable, 1001u);
  EXPECT_EQ(out.LinkColumn, 2u);

  for (uint32_t type : {0u, 13u}) {
    in.Type = type;
    CVXMemFile bad;
    bad << in;
    bad.Rewind();
    try {
      bad >> out;
      ADD_FAILURE() << "type " << type << " accepted";
    } catch (CVXException* e) {
      EXPECT_EQ(e->GetCode(), VX_NOT_FOUND);
      delete e;
    }
    EXPECT_EQ(out.Name, "Album");
  }
}

}  // namespace
