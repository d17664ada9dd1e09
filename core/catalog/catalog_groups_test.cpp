#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "VXEngine.h"
#include "VXGroup.h"
#include "VXGroupParser.h"
#include "VXResult.h"
#include "vxcatalog.h"
#include "vxcatalog_fixture.h"
#include "vxtest.h"

namespace {

using CatalogGroups = vxtest::CatalogFixture;

TEST_F(CatalogGroups, TreeNamesAndParentLinks) {
  uint32_t a = AddGroup("A");
  uint32_t b = AddGroup("B", a);
  uint32_t top = AddGroup("Top", VX_ALL_GROUP_OID);
  EXPECT_EQ(Group(top).Parent(), 0u) << "a parent of @All means no parent";
  EXPECT_EQ(Group(a).Children(), std::vector<uint32_t>{b});
  std::string name;
  ASSERT_EQ(Cat().GetFullGroupName(b, name), VX_OK);
  EXPECT_EQ(name, "A.B");
  EXPECT_EQ(Cat().LookupGroup("A.B"), b);
  EXPECT_EQ(Cat().LookupGroup("a.b"), 0u);
  std::vector<uint32_t> all;
  Cat().GetGroups(all);
  EXPECT_EQ(all, (std::vector<uint32_t>{a, b, top, VX_ALL_GROUP_OID}));

  CVXGroup changed = Group(top);
  changed.Parent() = VX_ALL_GROUP_OID;
  ASSERT_EQ(Cat().UpdateGroup(changed), VX_OK);
  Reopen();
  EXPECT_EQ(Group(top).Parent(), VX_ALL_GROUP_OID) << "UpdateGroup stores the value as given";
  EXPECT_EQ(Group(a).Children(), std::vector<uint32_t>{b});

  ASSERT_EQ(Cat().RemoveGroup(a), VX_OK);
  CVXGroup gone;
  EXPECT_EQ(Cat().LookupGroup(b, gone), VX_NOT_FOUND) << "children go with their parent";
  EXPECT_EQ(Cat().AddGroup(CVXGroup(0)), VX_NOT_FOUND);
  EXPECT_EQ(Cat().AddGroup(Group(top)), VX_ALREADY_PRESENT);
}

TEST_F(CatalogGroups, ChildCyclesEndWithCircular) {
  uint32_t a = AddGroup("a");
  uint32_t b = AddGroup("b", a);
  CVXGroup loop = Group(b);
  loop.Children().push_back(a);  // b -> a -> b
  ASSERT_EQ(Cat().UpdateGroup(loop), VX_OK);
  std::vector<uint32_t> out;
  EXPECT_EQ(Cat().GetGroupChildrenRecursive(a, out), VX_FORMULA_CIRCULAR);
  EXPECT_EQ(out, (std::vector<uint32_t>{b, a}));
  bool depends = false;
  EXPECT_EQ(Cat().GroupDependsOn(a, b, depends), VX_FORMULA_CIRCULAR);
  // Already seen entries are not descended into.
  std::vector<uint32_t> seen = {b};
  EXPECT_EQ(Cat().GetGroupChildrenRecursive(a, seen), VX_FORMULA_CIRCULAR);
  EXPECT_EQ(seen, std::vector<uint32_t>{b});
}

TEST_F(CatalogGroups, ReorderSiblings) {
  uint32_t p = AddGroup("p");
  uint32_t a = AddGroup("a", p);
  uint32_t b = AddGroup("b", p);
  uint32_t c = AddGroup("c", p);
  uint32_t x = AddGroup("x");
  ASSERT_EQ(Cat().ReorderGroup(c, a, true), VX_OK);
  EXPECT_EQ(Group(p).Children(), (std::vector<uint32_t>{c, a, b}));
  EXPECT_EQ(Group(c).SortSequence(), 0);
  EXPECT_EQ(Group(b).SortSequence(), 2);
  ASSERT_EQ(Cat().ReorderGroup(c, a, false), VX_OK);
  EXPECT_EQ(Group(p).Children(), (std::vector<uint32_t>{a, c, b}));
  EXPECT_EQ(Cat().ReorderGroup(c, x, true), VX_NOT_FOUND);
  EXPECT_EQ(Group(p).Children(), (std::vector<uint32_t>{a, c, b}));
  ASSERT_EQ(Cat().ReorderGroup(p, 0, false), VX_OK);
  for (uint32_t o : {a, b, c}) EXPECT_EQ(Group(o).SortSequence(), -1);
  EXPECT_EQ(Group(p).Children(), (std::vector<uint32_t>{a, c, b}));
}

TEST_F(CatalogGroups, FileAssignment) {
  uint32_t a = AddGroup("a");
  uint32_t b = AddGroup("b");
  ASSERT_EQ(Cat().SetFileGroups(7, {a, b}, true), VX_OK);
  std::vector<uint32_t> groups;
  Cat().GetFileGroups(7, groups);
  EXPECT_EQ(groups, (std::vector<uint32_t>{a, b}));
  Cat().GetFileGroups(std::vector<uint32_t>{3, 7}, groups);
  EXPECT_EQ(groups, (std::vector<uint32_t>{a, b}));
  ASSERT_EQ(Cat().SetFileGroups(7, {b}, false), VX_OK);
  Cat().GetFileGroups(7, groups);
  EXPECT_EQ(groups, std::vector<uint32_t>{b});
  ASSERT_EQ(Cat().SetFileGroups(7, {}, false), VX_OK);
  Cat().GetFileGroups(7, groups);
  EXPECT_TRUE(groups.empty());
}

TEST_F(CatalogGroups, DataDrivenCategoriesAreMarkedAndCleared) {
  uint32_t root = AddGroup("Models");
  CVXGroup r = Group(root);
  r.FTITag() = "EXIF:Model";
  Store(r);
  uint32_t child = AddGroup("Canon", root);
  CVXGroup c = Group(child);
  c.FTITag() = "EXIF:Model";
  c.FTIPattern() = "Canon";
  Store(c);
  uint32_t byHand = AddGroup("Mine", root);
  uint32_t other = AddGroup("Keywords");
  CVXGroup o = Group(other);
  o.FTITag() = "dc:subject";
  Store(o);

  std::vector<uint32_t> roots;
  Cat().GetDynamicGroups(roots);
  EXPECT_EQ(roots, (std::vector<uint32_t>{root, other}));
  // No root needs a build; forcing a child alone marks it and builds nothing.
  EXPECT_EQ(Cat().UpdateDynamicGroups(0, false, false), VX_OK);
  EXPECT_FALSE(Group(child).NeedsRecalc());
  EXPECT_EQ(Cat().UpdateDynamicGroups(child, true, false), VX_OK);
  EXPECT_TRUE(Group(child).NeedsRecalc());
  EXPECT_FALSE(Group(root).NeedsRecalc());
  ASSERT_EQ(Cat().InvalidateDynamicGroups(0, "exif"), VX_OK);
  EXPECT_TRUE(Group(root).NeedsRecalc());
  EXPECT_TRUE(Group(child).NeedsRecalc());
  EXPECT_FALSE(Group(other).NeedsRecalc());
  EXPECT_FALSE(Group(byHand).NeedsRecalc());

  ASSERT_EQ(Cat().ClearDynamicGroup(root), VX_OK);
  EXPECT_FALSE(Group(root).IsFTI());
  CVXGroup gone;
  EXPECT_EQ(Cat().LookupGroup(child, gone), VX_NOT_FOUND);
  EXPECT_EQ(Group(root).Children(), std::vector<uint32_t>{byHand});
  EXPECT_EQ(Cat().ClearDynamicGroup(12345), VX_NOT_FOUND);
}

TEST_F(CatalogGroups, FolderReferencesMoveToAnotherFolder) {
  uint32_t from = AddFolder("c:/old/");
  uint32_t to = AddFolder("c:/new/");
  uint32_t cat = AddGroup("ByFolder");
  CVXGroup g = Group(cat);
  ASSERT_EQ(g.SetExpression(Cat(), "\"Folder@c:/old/<VOL.1234>\"").code, VX_OK);
  Store(g);
  ASSERT_EQ(Cat().MoveFolderReferences(from, to), VX_OK);
  EXPECT_NE(Group(cat).Expression(Cat()).find("c:/new/"), std::string::npos);
  EXPECT_TRUE(Group(cat).HasReference(to, refFolder));
  EXPECT_FALSE(Group(cat).HasReference(from, refFolder));
}

}  // namespace
