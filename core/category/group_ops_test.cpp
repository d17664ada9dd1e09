#include <gtest/gtest.h>

#include "vxcatalog_fixture.h"

namespace {

using Oids = std::vector<uint32_t>;

// Categories Top {Left, Right {Deep}} and Other; folders c:/pics (VOL.1234) and d:/other.
class GroupOps : public vxtest::CatalogFixture {
 protected:
  void SetUp() override {
    CatalogFixture::SetUp();
    pics_ = AddFolder("c:/pics", "VOL", "1234"), other_ = AddFolder("d:/other", "", "");
    top_ = AddGroup("Top", 0), left_ = AddGroup("Left", top_), right_ = AddGroup("Right", top_);
    deep_ = AddGroup("Deep", right_), otherGroup_ = AddGroup("Other", 0);
  }

  unsigned AddImage(uint32_t group, uint32_t file, uint32_t flags = 0) {
    CVXGroup g = Group(group);
    g.Flags() |= flags;
    unsigned rc = g.AddImage(Cat(), file);
    Store(g);
    return rc;
  }
  bool Holds(uint32_t group, uint32_t file) { return Group(group).Images().Get(file); }

  uint32_t pics_, other_, top_, left_, right_, deep_, otherGroup_;
};

TEST(GroupOrder, SequenceThenNameWithCaseWhileEqualityIgnoresCase) {
  CVXGroup a, b, ab, z;
  a.Name() = "a", b.Name() = "B", ab.Name() = "ab", z.Name() = "z";
  z.SortSequence() = -2;
  EXPECT_TRUE(b < a && !(a < b) && a < ab && z < b);
  a.SortSequence() = 0;
  EXPECT_TRUE(ab < a);
  b.Name() = "äbc", ab.Name() = "ÄBC";
  EXPECT_TRUE(b == ab && !(b == a));
  EXPECT_EQ(CVXGroup::CleanName("a.b/c"), "a_b_c");
  EXPECT_EQ(CVXGroup::CleanName("\"x=y@[z]\\é-"), "_x_y__z__é-");
  EXPECT_EQ(CVXGroup::CleanName(std::string(70, 'q')), std::string(64, 'q'));
}

// A duplicate marks the image list; a failed child removal marks the child list, a successful
// one does not. "@All" takes no change at all.
TEST_F(GroupOps, DirtyFlagRulesAndAll) {
  CVXGroup g = Group(left_);
  EXPECT_EQ(g.AddImage(Cat(), 5), VX_OK);
  g.SetImageListDirty(false);
  EXPECT_EQ(g.AddImage(Cat(), 5), VX_ALREADY_PRESENT);
  EXPECT_TRUE(g.ImageListDirty());
  EXPECT_EQ(g.AddImage(Cat(), Oids{}), VX_ALREADY_PRESENT);
  EXPECT_EQ(g.AddImage(Cat(), 0xFFFFFFFFu), VX_RANGE);
  EXPECT_EQ(g.RemoveImage(Oids{5, 7}), VX_OK);
  EXPECT_EQ(g.RemoveImage(5), VX_NOT_FOUND);
  EXPECT_EQ(g.AddChild(7), VX_OK);
  g.SetChildListDirty(false);
  EXPECT_EQ(g.RemoveChild(7), VX_OK);
  EXPECT_FALSE(g.ChildListDirty());
  EXPECT_EQ(g.RemoveChild(7), VX_NOT_FOUND);
  EXPECT_TRUE(g.ChildListDirty());

  CVXGroup all = Group(VX_ALL_GROUP_OID);
  EXPECT_EQ(all.AddImage(Cat(), 5) + all.AddChild(1), 2u * VX_OK);
  EXPECT_EQ(all.SetExpression(Cat(), R"("Top")").code, VX_OK);
  EXPECT_TRUE(all.Images().IsEmpty() && all.Children().empty() && all.Infix().empty());
}

// gfExclusiveSiblings clears the file in the parent's subtree, parent included, first;
// gfExclusiveAll everywhere.
TEST_F(GroupOps, ExclusiveFlagsTakeTheFileOutFirst) {
  for (uint32_t g : {top_, left_, deep_, otherGroup_}) AddImage(g, 3);
  EXPECT_EQ(AddImage(right_, 3, gfExclusiveSiblings), VX_OK);
  EXPECT_FALSE(Holds(top_, 3) || Holds(left_, 3) || Holds(deep_, 3));
  EXPECT_TRUE(Holds(otherGroup_, 3) && Holds(right_, 3));
  EXPECT_EQ(AddImage(left_, 3, gfExclusiveAll), VX_OK);
  EXPECT_FALSE(Holds(otherGroup_, 3) || Holds(right_, 3));
  EXPECT_TRUE(Holds(left_, 3));
}

TEST_F(GroupOps, ExpressionPrintsBackWhatWasSet) {
  // A modifier carries over to the categories behind it, so it stands last here.
  for (const std::string text : {
           R"("Top.Left" AND ("Top.Right.Deep" OR "CatDistinct@Other"))",
           "\"Folder@file://c:/pics/<VOL.1234>\" NOT\n\"RFolder@file://d:/other/\"",
           R"(("@Unassigned" OR "@Rating[-1]") AND "@Label[Red]" OR "@All" )",
       }) {
    CVXGroup g(Cat().GenerateGroupOID());
    ASSERT_EQ(g.SetExpression(Cat(), text).code, VX_OK) << text;
    EXPECT_TRUE(g.ImageListDirty() && g.ChildListDirty());
    EXPECT_EQ(g.Expression(Cat()), text);
  }
  // OIDs are stored, so a rename shows; the carried modifier is printed.
  CVXGroup g = Group(otherGroup_);
  ASSERT_EQ(g.SetExpression(Cat(), R"("CatNoRecurse@Top.Left" OR "Top")").code, VX_OK);
  CVXGroup renamed = Group(top_);
  renamed.Name() = "Root";
  Store(renamed);
  EXPECT_EQ(g.Expression(Cat()), R"("CatNoRecurse@Root.Left" OR "CatNoRecurse@Root")");

  // Media strings are upper-cased; a suffix cut short counts as none.
  ASSERT_EQ(g.SetExpression(Cat(), R"("Folder@c:\pics<vol.1234>")").code, VX_OK);
  EXPECT_EQ(g.Postfix()[0].Oid, pics_);
  EXPECT_EQ(g.Postfix()[0].MediaID, "VOL");
  EXPECT_EQ(g.SetExpression(Cat(), R"("Folder@c:/pics<VOL.1234")").code, VX_FORMULA_NO_FOLDER);
  ASSERT_EQ(g.SetExpression(Cat(), R"("Root" OR "Folder@d:/other<X.1" OR "Root")").code, VX_OK);
  ASSERT_EQ(Cat().RemoveFolder(other_, false), VX_OK);
  EXPECT_EQ(g.Expression(Cat()), R"("Root" OR )") << "printing stops at a folder that is gone";
  ASSERT_EQ(g.SetExpression(Cat(), "").code, VX_OK);
  EXPECT_TRUE(g.Infix().empty() && g.Postfix().empty());
}

TEST_F(GroupOps, SetExpressionFailuresKeepOrDropTheOldLists) {
  CVXGroup other = Group(otherGroup_);
  ASSERT_EQ(other.SetExpression(Cat(), R"("Top")").code, VX_OK);
  Store(other);
  CVXGroup g = Group(left_);
  ASSERT_EQ(g.SetExpression(Cat(), R"("Top.Right")").code, VX_OK);
  const std::vector<SExpr> before = g.Infix();
  struct {
    std::string text;
    uint32_t code;
    int32_t position;
    bool inError;
  } const kept[] = {
      {R"("Deep" AND)", VX_FORMULA_OPERAND_EXPECTED, 10, false},
      {R"("Deep" "Top" OR "Top")", VX_FORMULA_MISSING_OPERATOR, 12, false},
      {R"("Top.Right" OR "Nowhere")", VX_FORMULA_NO_CATEGORY, 15, true},
      {R"("Top.Right" OR "Top.Left")", VX_FORMULA_CIRCULAR, 15, true},  // itself
      {R"("Top" OR "Top.Right")", VX_FORMULA_CIRCULAR, 5, true},        // its parent
      // Other reaches Left through Top's subtree; the last such token decides.
      {R"("Other" OR "Other")", VX_FORMULA_CIRCULAR, 11, true},
  };
  for (const auto& c : kept) {
    SCOPED_TRACE(c.text);
    SError e = g.SetExpression(Cat(), c.text);
    EXPECT_EQ(e.code, c.code);
    EXPECT_EQ(e.position, c.position);
    EXPECT_EQ(g.InError(), c.inError);
    EXPECT_EQ(g.Infix(), before);
  }
  // Failures while converting drop the old lists and leave InError clear.
  SError e = g.SetExpression(Cat(), R"("Top.Right" OR "PersSel@gone")");
  EXPECT_EQ(e.code, VX_FORMULA_NO_PERSSEL);
  EXPECT_EQ(e.position, -1);
  EXPECT_FALSE(g.InError());
  EXPECT_EQ(g.Infix().size(), 4u) << "converted up to the selection";
  EXPECT_TRUE(g.Postfix().empty());
  EXPECT_EQ(g.SetExpression(Cat(), R"("Folder@e:/none")").code, VX_FORMULA_NO_FOLDER);
  EXPECT_TRUE(g.Infix().empty());

  CVXGroup orphan(Cat().GenerateGroupOID());
  orphan.Parent() = 4242;
  EXPECT_EQ(orphan.SetExpression(Cat(), R"("Other")").code, VX_NOT_FOUND);
  EXPECT_TRUE(orphan.InError());
}

TEST_F(GroupOps, ReferenceTests) {
  CVXGroup g = Group(otherGroup_);
  ASSERT_EQ(g.SetExpression(Cat(), R"("Top.Left" OR "RFolder@file://c:/pics/<VOL.1234>")").code,
            VX_OK);
  EXPECT_TRUE(g.HasReference(left_, refCategory) && g.HasReference(pics_, refFolder));
  EXPECT_FALSE(g.HasReference(left_, refFolder) || g.HasReference(pics_, refSelection));

  // Children, the formula, and the formulas of what lies below the formula's categories.
  EXPECT_TRUE(Group(top_).HasGroupReference(Cat(), deep_));
  EXPECT_TRUE(g.HasGroupReference(Cat(), left_));
  EXPECT_FALSE(g.HasGroupReference(Cat(), deep_));
  CVXGroup deep = Group(deep_);
  ASSERT_EQ(deep.SetExpression(Cat(), R"("Other")").code, VX_OK);
  Store(deep);
  CVXGroup x(Cat().GenerateGroupOID());
  ASSERT_EQ(x.SetExpression(Cat(), R"("Top.Right")").code, VX_OK);
  EXPECT_TRUE(x.HasGroupReference(Cat(), otherGroup_));
  EXPECT_FALSE(x.HasGroupReference(Cat(), top_));

  // Left and Right both name Top, their parent: each would examine the other without end.
  SExpr toTop;
  toTop.Type = ttCategory, toTop.Oid = top_;
  for (uint32_t oid : {left_, right_}) {
    CVXGroup loop = Group(oid);
    loop.Postfix() = {toTop};
    Store(loop);
  }
  EXPECT_TRUE(Group(left_).HasGroupReference(Cat(), x.Oid())) << "a loop counts";
}

// Only the first reference of the postfix list moves, and the infix list follows only when the
// reference opens it.
TEST_F(GroupOps, UpdateFolderReferenceHasANarrowReach) {
  uint32_t moved = AddFolder("e:/moved", "NEW", "9");
  CVXGroup g = Group(otherGroup_);
  ASSERT_EQ(g.SetExpression(Cat(), R"("Folder@d:/other" OR "RFolder@d:/other")").code, VX_OK);
  EXPECT_FALSE(g.UpdateFolderReference(Cat(), other_, 4242));
  EXPECT_FALSE(g.UpdateFolderReference(Cat(), pics_, moved));
  ASSERT_TRUE(g.UpdateFolderReference(Cat(), other_, moved));
  EXPECT_EQ(g.Postfix()[0].Oid, moved);
  EXPECT_EQ(g.Postfix()[0].MediaID + g.Postfix()[0].MediaSerial, "NEW9");
  EXPECT_EQ(g.Postfix()[3].Oid, other_);
  EXPECT_EQ(g.Infix()[0].Oid, moved);
  EXPECT_EQ(g.Infix()[4].Oid, other_);
  ASSERT_EQ(g.SetExpression(Cat(), R"(("Folder@d:/other"))").code, VX_OK);
  ASSERT_TRUE(g.UpdateFolderReference(Cat(), other_, moved));
  EXPECT_EQ(g.Infix()[1].Oid, other_);
}

}  // namespace
