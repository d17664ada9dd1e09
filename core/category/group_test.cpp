#include <gtest/gtest.h>

#include "vxbytes.h"

#include <string>
#include <vector>

#include "VXGroup.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "vxlib_test_util.h"

namespace {

// Little-endian byte builder for hand-made records.
using vxtest::Bytes;

std::vector<uint8_t> Serialise(const CVXGroup& g) {
  CVXMemFile file;
  file << g;
  return {file.GetBuffer(), file.GetBuffer() + file.GetFileSize()};
}

// The code of reading `bytes` into `g` (0 when it reads).
unsigned Read(const std::vector<uint8_t>& bytes, CVXGroup& g) {
  CVXMemFile file(bytes.data(), bytes.size());
  return ThrownCode([&] { file >> g; });
}

CVXGroup Deserialise(const std::vector<uint8_t>& bytes) {
  CVXGroup g;
  EXPECT_EQ(Read(bytes, g), 0u);
  return g;
}

TEST(GroupRecord, CurrentVersionMatchesHandBuiltBytes) {
  CVXGroup g(0xFFFFEFFF);
  g.Name() = "@All", g.Description() = "all", g.Children() = {7, 9};
  g.Flags() = 96, g.SortSequence() = -2, g.LastActiveOid() = 5;
  g.Images().Set(3);
  SExpr e;
  e.Type = 2, e.Oid = 7, e.Flags = 1;
  g.Postfix().push_back(e);

  Bytes want;
  want.u16(1).u32(0xFFFFEFFF).u16(7).u32(0);
  want.u32(0xFFEEFFAA).u16(4).u32(1).u32(2).u32(7).str("").str("").str("").u32(1).str("");
  want.u32(0xFFEEFFAA).u16(4).u32(0);
  want.str("@All").str("all");
  // Images: Set(3) grows the set to 36 bits, stored as two 32-bit words.
  want.u32(8).u32(1u << 3).u32(0);
  want.u32(2).u32(7).u32(9);
  want.str("").u32(96).u32(0).u32(0xFFFFFFFE).str("").str("").u32(0).u32(0).u32(0).u32(5);
  EXPECT_EQ(Serialise(g), want.b);

  // Every field is in the record, so reading it back and writing again gives the same bytes.
  CVXGroup back = Deserialise(want.b);
  EXPECT_EQ(Serialise(back), want.b);
  EXPECT_TRUE(back.Images().Get(3) && back.IsSystem() && back.IsSealed());
}

TEST(GroupRecord, OlderVersionsReadWithDefaults) {
  // Version 1: old-form lists (count, then type, OID, text) and no fields after the shortcut.
  Bytes v1;
  v1.u16(1).u32(12).u16(1).u32(3);
  v1.u32(1).u32(2).u32(8).str("");   // postfix: one category element
  v1.u32(1).u32(2).u32(8).str("x");  // infix
  v1.str("old").str("d").u32(0).u32(0).str("k");
  CVXGroup g = Deserialise(v1.b);
  EXPECT_EQ(g.Oid(), 12u);
  EXPECT_EQ(g.Parent(), 3u);
  ASSERT_EQ(g.Postfix().size(), 1u);
  EXPECT_EQ(g.Postfix()[0].Oid, 8u);
  EXPECT_EQ(g.Infix()[0].Text, "x");
  EXPECT_EQ(g.Shortcut(), "k");
  EXPECT_EQ(g.Flags(), 0u);
  EXPECT_EQ(g.SortSequence(), -1);
  EXPECT_TRUE(g.FTITag().empty());

  // Version 4 with list version 1 (no marker: the first word is the count), no flags or labels
  // in the elements; FTI fields and the last active OID absent.
  Bytes v4;
  v4.u16(1).u32(13).u16(4).u32(0);
  v4.u32(1).u32(4).u32(21).str("").str("VOL").str("SER");
  v4.u32(0);
  v4.str("n").str("").u32(0).u32(0).str("").u32(16).u32(0xFF).u32(3);
  g = Deserialise(v4.b);
  ASSERT_EQ(g.Postfix().size(), 1u);
  EXPECT_EQ(g.Postfix()[0].MediaID, "VOL");
  EXPECT_EQ(g.Postfix()[0].Flags, 0u);
  EXPECT_EQ(g.Flags(), 16u);
  EXPECT_EQ(g.Color(), 0xFFu);
  EXPECT_EQ(g.SortSequence(), 3);
  EXPECT_EQ(g.FTISubStrLen(), 0);
}

TEST(GroupRecord, TruncatedOrCorruptRecordsGiveCodeAndLeaveObjectAlone) {
  CVXGroup g(5);
  g.Name() = "keep";
  g.Postfix().resize(2);
  g.Images().Set(100);
  std::vector<uint8_t> good = Serialise(g);
  CVXGroup target(77);
  target.Name() = "before";
  for (size_t n = 0; n < good.size(); ++n) {
    ASSERT_EQ(Read({good.begin(), good.begin() + n}, target), VX_NOT_FOUND) << "length " << n;
    ASSERT_EQ(target.Name(), "before");
    ASSERT_EQ(target.Oid(), 77u);
  }
  // An element count that claims far more than the record holds is refused before allocating.
  Bytes huge;
  huge.u16(1).u32(1).u16(7).u32(0).u32(0xFFEEFFAA).u16(4).u32(0x7FFFFFFF);
  EXPECT_EQ(Read(huge.b, target), VX_NOT_FOUND);
  EXPECT_EQ(Read(good, target), 0u);
  EXPECT_EQ(target.Name(), "keep");
}

}  // namespace
