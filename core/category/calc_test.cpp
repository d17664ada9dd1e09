#include <gtest/gtest.h>

#include "VXXMPDB.h"
#include "vxcatalog_fixture.h"

namespace {

using Oids = std::vector<uint32_t>;

// The files' OIDs, as a fresh catalog hands them out.
enum : uint32_t { r1 = 1, r2, s1, s2, o1, o2 };
const Oids kFiles = {r1, r2, s1, s2, o1, o2};

// On a closed engine whose XMP database is open:
//   c:/pics (VOL.1234): r1 r2     c:/pics/sub: s1 s2     d:/other (no media): o1 o2
//   A {r1 s1}   B {r2} with child B1 {s1 s2}   C, the category under test
// r1 and o1 are rated 3, r1 is labelled Red.
class Calc : public vxtest::CatalogFixture {
 protected:
  void SetUp() override {
    CatalogFixture::SetUp();
    ASSERT_EQ(engine_.XMPDB().Create(dir_ / "db.v3x"), 0);
    uint32_t root = AddFolder("c:/pics", "VOL"), sub = AddFolder("c:/pics/sub", "VOL");
    uint32_t other = AddFolder("d:/other", "", "");
    const uint32_t folders[] = {root, root, sub, sub, other, other};
    for (uint32_t f : kFiles) ASSERT_EQ(AddFile(folders[f - r1], std::to_string(f)), f);
    a_ = AddGroup("A", 0, {r1, s1}), b_ = AddGroup("B", 0, {r2});
    b1_ = AddGroup("B1", b_, {s1, s2}), c_ = AddGroup("C", 0, {});
    for (uint32_t f : {r1, o1}) {
      SXMPRecord rec;
      rec.Oid = f, rec.Rating = 3, rec.Label = f == r1 ? "Red" : "";
      ASSERT_EQ(engine_.XMPDB().Set(rec, false), 0);
    }
  }
  unsigned Formula(uint32_t oid, const std::string& text) {
    CVXGroup g = Group(oid);
    SError e = g.SetExpression(Cat(), text);
    if (e.code == VX_OK) Store(g);
    return e.code;
  }
  // Stores a formula naming `target`, past the checks of SetExpression, as an old catalog may.
  void ForceFormula(uint32_t oid, uint32_t target) {
    SExpr e;
    e.Type = ttCategory, e.Oid = target;
    CVXGroup g = Group(oid);
    g.Postfix() = g.Infix() = {e};
    Store(g);
  }
  Oids Content(uint32_t oid, unsigned expected = VX_OK) {
    Oids out;
    EXPECT_EQ(Cat().GetGroupImages(oid, out), expected);
    return out;
  }

  uint32_t a_, b_, b1_, c_;
};

TEST_F(Calc, EveryOperandTypeAgainstTheCatalog) {
  const std::string pics = "file://c:/pics/<VOL.1234>";
  const std::pair<std::string, Oids> cases[] = {
      {R"("A")", {r1, s1}},
      {R"("B")", {r2, s1, s2}},  // children merged
      {R"("Category@B.B1")", {s1, s2}},
      {R"("CatNoRecurse@B")", {r2}},
      {R"("CatDistinct@A")", {r1}},  // s1 is also assigned to B1
      {R"("Folder@)" + pics + "\"", {r1, r2}},
      {R"("RFolder@)" + pics + "\"", {r1, r2, s1, s2}},
      {R"("Folder@d:\other")", {o1, o2}},  // no suffix: the folder without media
      {R"("@Unassigned")", {o1, o2}},
      {R"("@Rating[ 3 ]")", {r1, o1}},
      {R"("@Rating[0]")", {r2, s1, s2, o2}},
      {R"("@Label[red]")", {r1}},
      {R"("@All")", kFiles},
      {R"("A" NOT "A")", {}},
      // No precedence: (A OR B) AND folder, never A OR (B AND folder).
      {R"("A" OR "B" AND "Folder@)" + pics + "\"", {r1, r2}},
      {"(\"A\" OR \"@Label[Red]\")\r\nAND (\"RFolder@" + pics + "\" NOT \"Category@B\")", {r1}},
  };
  for (const auto& [formula, expected] : cases) {
    SCOPED_TRACE(formula);
    ASSERT_EQ(Formula(c_, formula), VX_OK);
    EXPECT_EQ(Content(c_), expected);
  }
  EXPECT_EQ(Content(VX_ALL_GROUP_OID), kFiles);
}

// Content is assigned files, formula and children. gfNoChildImages reads the category being
// calculated: alone it keeps its own files, reached from a parent it merges its children.
TEST_F(Calc, ImagesFormulaChildrenAndNoChildImages) {
  uint32_t p = AddGroup("P", c_, {o1});
  AddGroup("Q", p, {o2});
  CVXGroup g = Group(p);
  g.Flags() |= gfNoChildImages;
  Store(g);
  EXPECT_EQ(Content(p), Oids{o1});
  ASSERT_EQ(Formula(c_, R"("CatNoRecurse@A")"), VX_OK);
  EXPECT_EQ(Content(c_), (Oids{r1, s1, o1, o2}));
  ASSERT_EQ(Formula(p, R"("CatNoRecurse@B")"), VX_OK);
  EXPECT_EQ(Content(p), (Oids{r2, o1, o2})) << "with a formula the flag does nothing";
  EXPECT_TRUE(Group(c_).HasImage(Cat(), r1));
  EXPECT_FALSE(Group(c_).HasImage(Cat(), s2));
}

TEST_F(Calc, FailuresAndTheirCodes) {
  // One operand reports Fill's own code; under an operator the same failure is 15013.
  uint32_t gone = AddFolder("e:/gone", "", "");
  ASSERT_EQ(Formula(c_, R"("Folder@e:/gone")"), VX_OK);
  CVXGroup single = Group(c_);
  ASSERT_EQ(Formula(c_, R"("Folder@e:/gone" OR "A")"), VX_OK);
  CVXGroup pair = Group(c_);
  ASSERT_EQ(Formula(c_, R"("A" AND "B.B1")"), VX_OK);
  CVXGroup named = Group(c_);
  ASSERT_EQ(Cat().RemoveFolder(gone, false), VX_OK);
  ASSERT_EQ(Cat().RemoveGroup(b1_), VX_OK);
  Oids out{99};
  EXPECT_EQ(single.Calculate(Cat(), out), VX_NOT_FOUND);
  EXPECT_TRUE(out.empty());
  EXPECT_TRUE(single.InError()) << "any formula failure marks the category";
  EXPECT_EQ(single.Calculate(Cat(), out), VX_FORMULA_CIRCULAR) << "in error: refused";
  EXPECT_EQ(pair.Calculate(Cat(), out), VX_FORMULA_OPERAND_FAILED);
  // A category that is gone fails the dependency test before anything is filled.
  EXPECT_EQ(named.Calculate(Cat(), out), VX_FORMULA_CIRCULAR);
  // Two operands and no operator pass the parser but cannot be reduced.
  ASSERT_EQ(Formula(c_, R"("A" ("B"))"), VX_OK);
  Content(c_, VX_FORMULA_OPERAND_EXPECTED);

  // A missing child stops the walk with 10020, keeps what was computed, marks nothing.
  ASSERT_EQ(Formula(c_, ""), VX_OK);
  CVXGroup c = Group(c_);
  c.Images().Set(o1);
  c.Children() = {a_, 4242, b_};
  CBitVector bits;
  EXPECT_EQ(c.Calculate(Cat(), bits), VX_NOT_FOUND);
  EXPECT_FALSE(c.InError());
  EXPECT_EQ(bits, CBitVector(std::vector<unsigned long>{r1, s1, o1}));
}

// Every loop ends with 15014, whether it passes through the calculated category or lies below
// it, through Children, through formulas, or through both.
TEST_F(Calc, LoopsEndWithCircular) {
  uint32_t x = AddGroup("X", 0, {o1}), y = AddGroup("Y", x, {o2}), z = AddGroup("Z", 0, {});
  CVXGroup g = Group(y);
  g.Children().push_back(x);  // X -> Y -> X
  Store(g);
  CVXGroup outer = Group(x);
  Oids out;
  EXPECT_EQ(outer.Calculate(Cat(), out), VX_FORMULA_CIRCULAR);
  EXPECT_TRUE(outer.InError());
  g.Children() = {z};
  Store(g);
  g = Group(z);
  g.Children() = {y};  // X -> Y -> Z -> Y
  Store(g);
  Content(x, VX_FORMULA_CIRCULAR);

  uint32_t p = AddGroup("P", 0, {}), q = AddGroup("Q", 0, {}), r = AddGroup("R", 0, {});
  ASSERT_EQ(Formula(p, R"("Q")"), VX_OK);
  ASSERT_EQ(Formula(q, R"("P")"), VX_FORMULA_CIRCULAR) << "refused when set";
  ForceFormula(q, p);  // P -> Q -> P
  Content(p, VX_FORMULA_CIRCULAR);
  ForceFormula(q, r);
  ForceFormula(r, q);  // P -> Q -> R -> Q
  Content(p, VX_FORMULA_CIRCULAR);
  ForceFormula(r, p);
  g = Group(p);
  g.Postfix().clear();
  g.Children() = {r};  // P's child R names P
  Store(g);
  Content(p, VX_FORMULA_CIRCULAR);
}

TEST_F(Calc, DataDrivenCategoryQueriesOnceAndCaches) {
  for (uint32_t f : {r1, o1}) ASSERT_EQ(engine_.XMPDB().FTISetU(f, {{"XMP:City", "Paris"}}), 0);
  ASSERT_EQ(engine_.XMPDB().FTISetU(r2, {{"XMP:City", "Rome"}}), 0);
  CVXGroup k(Cat().GenerateGroupOID());
  k.Name() = "Paris", k.FTITag() = "XMP:City", k.FTIPattern() = "Paris";
  k.Flags() = gfNeedsRecalc;
  k.Images().Set(o2);  // out of date: replaced by the query
  ASSERT_EQ(Cat().AddGroup(k), VX_OK);

  CVXGroup copy = Group(k.Oid());
  CBitVector bits;
  ASSERT_EQ(copy.Calculate(Cat(), bits), VX_OK);
  EXPECT_EQ(bits, CBitVector(std::vector<unsigned long>{r1, o1}));
  EXPECT_TRUE(copy.NeedsRecalc()) << "the caller's copy keeps its flag";
  CVXGroup cached = Group(k.Oid());
  EXPECT_FALSE(cached.NeedsRecalc());
  EXPECT_EQ(cached.Images(), bits);

  // From now on the cache answers, without files that do not exist.
  ASSERT_EQ(engine_.XMPDB().FTISetU(r2, {{"XMP:City", "Paris"}}), 0);
  cached.Images().Set(999);
  Store(cached);
  EXPECT_EQ(Content(k.Oid()), (Oids{r1, o1}));
}

}  // namespace
