#include <gtest/gtest.h>

#include "vxcatalog_fixture.h"

namespace {

using CatalogGroups = vxtest::CatalogFixture;

TEST_F(CatalogGroups, TreeNamesAndParentLinks) {
  uint32_t a = AddGroup("A"), b = AddGroup("B", a), top = AddGroup("Top", VX_ALL_GROUP_OID);
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
  uint32_t a = AddGroup("a"), b = AddGroup("b", a);
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
  uint32_t p = AddGroup("p"), a = AddGroup("a", p), b = AddGroup("b", p), c = AddGroup("c", p);
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
  uint32_t a = AddGroup("a"), b = AddGroup("b");
  auto groupsOf = [&](const auto& files) {
    std::vector<uint32_t> groups;
    Cat().GetFileGroups(files, groups);
    return groups;
  };
  ASSERT_EQ(Cat().SetFileGroups(7, {a, b}, true), VX_OK);
  EXPECT_EQ(groupsOf(7), (std::vector<uint32_t>{a, b}));
  EXPECT_EQ(groupsOf(std::vector<uint32_t>{3, 7}), (std::vector<uint32_t>{a, b}));
  ASSERT_EQ(Cat().SetFileGroups(7, {b}, false), VX_OK);
  EXPECT_EQ(groupsOf(7), std::vector<uint32_t>{b});
  ASSERT_EQ(Cat().SetFileGroups(7, {}, false), VX_OK);
  EXPECT_TRUE(groupsOf(7).empty());
}

TEST_F(CatalogGroups, DataDrivenCategoriesAreMarkedAndCleared) {
  auto dataDriven = [&](const std::string& name, uint32_t parent, const std::string& tag,
                        const std::string& pattern = "") {
    CVXGroup g = Group(AddGroup(name, parent));
    g.FTITag() = tag;
    g.FTIPattern() = pattern;
    Store(g);
    return g.Oid();
  };
  uint32_t root = dataDriven("Models", 0, "EXIF:Model");
  uint32_t child = dataDriven("Canon", root, "EXIF:Model", "Canon");
  uint32_t byHand = AddGroup("Mine", root), other = dataDriven("Keywords", 0, "dc:subject");

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
  uint32_t from = AddFolder("c:/old/"), to = AddFolder("c:/new/"), cat = AddGroup("ByFolder");
  CVXGroup g = Group(cat);
  ASSERT_EQ(g.SetExpression(Cat(), "\"Folder@c:/old/<VOL.1234>\"").code, VX_OK);
  Store(g);
  ASSERT_EQ(Cat().MoveFolderReferences(from, to), VX_OK);
  EXPECT_NE(Group(cat).Expression(Cat()).find("c:/new/"), std::string::npos);
  EXPECT_TRUE(Group(cat).HasReference(to, refFolder));
  EXPECT_FALSE(Group(cat).HasReference(from, refFolder));
}

}  // namespace
