#include <gtest/gtest.h>

#include <bit>
#include <string>
#include <vector>

#include "VXPersistantSelection.h"
#include "VXResultSet.h"
#include "bitvector.h"
#include "seltest_util.h"

namespace {

using seltest::Bytes;
using seltest::Streamed;
using Ref = CVXResultSet::ERefType;

// The file record's OID is the entry's unless `fileOid` says otherwise.
SVXResultSetEntry Entry(uint32_t number, uint32_t oid, uint32_t folder, const std::string& uri,
                        std::vector<SVXRSEntry> hits, uint32_t fileOid = UINT32_MAX) {
  SVXResultSetEntry e;
  e.Number = number, e.OID = oid, e.Folder = folder;
  e.URI.Set(uri, false);
  e.File = CVXCatFile(fileOid == UINT32_MAX ? oid : fileOid, e.URI.FileName(), folder);
  e.File.Properties().Processed = e.File.Properties().FileTime = 0;
  e.Hits = std::move(hits);
  return e;
}

// Two originals, the second external; numbers with a gap. Neighbouring fields hold values of
// their own (a file record OID apart from the entry's, a URI type that is not 0), so that fields
// written in the wrong order show.
CVXResultSet Sample() {
  CVXResultSet rs(0x77);
  rs.Properties().Name = "Res";
  rs.Properties().Comment = "c";
  rs.Properties().Entries = {
      Entry(1, 10, 2, "file:///p/a.jpg", {{20, 3, 99.5}, {21, 4, 50.25}}, 31),
      Entry(3, 0, 0, "http://ext/B.jpg", {})};
  return rs;
}

void EntryBytes(Bytes& b, uint32_t number, uint32_t oid, uint32_t folder, CVXURI::EType type,
                const std::string& uri, uint32_t fileOid, const std::string& name) {
  b.u32(number).u32(oid).u32(type).le(uint8_t{0}).str(uri);
  b.u16(1).u32(fileOid).u16(3).str(name).u32(folder).b.resize(b.b.size() + 62);
}

std::vector<uint8_t> SampleBytes() {
  Bytes b;
  b.u16(1).u32(0x77).u16(1).str("Res").str("c").u32(2);
  EntryBytes(b, 1, 10, 2, CVXURI::File, "file:///p/a.jpg", 31, "a.jpg");
  b.u32(2).u32(20).le(std::bit_cast<uint64_t>(99.5)).u32(21).le(std::bit_cast<uint64_t>(50.25));
  EntryBytes(b, 3, 0, 0, CVXURI::Http, "http://ext/B.jpg", 0, "B.jpg");
  b.u32(0);
  return b.b;
}

TEST(ResultSet, StreamMatchesTheHandBuiltBytesDropsTheFoldersAndFailsWhole) {
  const std::vector<uint8_t> want = SampleBytes();
  EXPECT_EQ(Streamed(Sample()), want);
  CVXResultSet back(5);
  back.Properties().DropEmpty = true;
  back.Properties().Entries.push_back(Entry(1, 1, 1, "file:///k.jpg", {{2, 2, 1.0}}));
  seltest::ExpectPrefixesFail(want, back);

  back = seltest::Read(want, back);
  ASSERT_EQ(Streamed(back), want);
  EXPECT_TRUE(back.Properties().DropEmpty);  // not stored, so not touched
  // The folders of the entry and its hits are not stored; the file record keeps its own, which
  // no reference looks at.
  EXPECT_EQ(back.Properties().Entries[0].Folder, 0u);
  EXPECT_EQ(back.Properties().Entries[0].Hits[1].Folder, 0u);
  Ref ref;
  EXPECT_FALSE(back.HasFolderReference(2, ref));
  EXPECT_TRUE(back.HasReference(21, ref));
  EXPECT_EQ(ref, CVXResultSet::rtHit);
}

TEST(ResultSet, ReferencesLookAtTheEntryBeforeItsHits) {
  CVXResultSet rs = Sample();
  rs.Properties().Entries[1].Hits = {{10, 2, 1.0}};
  Ref ref = CVXResultSet::rtHit;
  EXPECT_TRUE(rs.HasReference(10, ref));
  EXPECT_EQ(ref, CVXResultSet::rtOriginal);
  EXPECT_TRUE(rs.HasFolderReference(3, ref));
  EXPECT_EQ(ref, CVXResultSet::rtHit);
  EXPECT_FALSE(rs.HasReference(99, ref));
  ref = CVXResultSet::rtHit;
  EXPECT_TRUE(rs.HasReference(CVXURI("http://EXT/b.JPG", false), ref));
  EXPECT_EQ(ref, CVXResultSet::rtOriginal);
  EXPECT_FALSE(rs.HasReference(CVXURI("http://ext/b.jpg", true), ref));

  std::vector<unsigned long> originals = {42};
  rs.GetOriginals(originals);
  EXPECT_EQ(originals, std::vector<unsigned long>{10});
  EXPECT_EQ(rs.GetEntry(3)->OID, 0u);
  EXPECT_EQ(rs.GetEntry(2), nullptr);
  const CVXResultSet& constant = rs;
  EXPECT_EQ(constant.GetEntry(2), constant.Properties().Entries.end());
  EXPECT_EQ(constant.GetEntry(1)->OID, 10u);
}

TEST(ResultSet, RemovingReferencesKeepsTheNumbers) {
  CVXResultSet rs;
  rs.Properties().Entries = {Entry(1, 5, 1, "file:///a", {{7, 1, 1}, {6, 1, 1}, {7, 1, 1}}),
                             Entry(2, 7, 1, "file:///b", {{5, 1, 1}}),
                             Entry(3, 8, 2, "file:///c", {{7, 2, 1}, {9, 3, 1}})};
  CVXResultSet image = rs;
  // An OID that is an original and a hit elsewhere: its entry and all its hits go.
  EXPECT_TRUE(rs.RemoveFileReferences(7));
  ASSERT_EQ(rs.Properties().Entries.size(), 2u);
  EXPECT_EQ(rs.Properties().Entries[0].Hits.size(), 1u);
  EXPECT_EQ(rs.Properties().Entries[1].Number, 3u);
  EXPECT_EQ(rs.Properties().Entries[1].Hits.size(), 1u);
  EXPECT_FALSE(rs.RemoveFileReferences(7));

  EXPECT_TRUE(rs.RemoveFolderReferences(3));  // a hit's folder
  EXPECT_TRUE(rs.Properties().Entries[1].Hits.empty());
  EXPECT_TRUE(rs.RemoveFileReferences(CVXURI("FILE:///A", false)));
  EXPECT_FALSE(rs.RemoveFileReferences(CVXURI("file:///a", false)));
  EXPECT_TRUE(rs.RemoveFolderReferences(2));
  EXPECT_TRUE(rs.IsEmpty());
  std::vector<unsigned long> originals = {1};
  rs.GetOriginals(originals);
  EXPECT_TRUE(originals.empty());

  // One hit per visit of an entry: the walk restarts after the erased entry 2, so entry 1 is
  // visited twice and gives up both its hits of 7; entry 3 is visited once.
  CVXPersistantSelection sel;
  sel.Properties().Result = image;
  EXPECT_EQ(sel.RemoveImage(7), VX_OK);
  const auto& entries = sel.Properties().Result.Properties().Entries;
  ASSERT_EQ(entries.size(), 2u);
  EXPECT_EQ(entries[0].Hits.size(), 1u);
  EXPECT_EQ(entries[1].Hits.size(), 1u);
  // Without an erased entry, one of two equal hits goes.
  sel.Properties().Result.Properties().Entries[1].Hits = {{4, 0, 1}, {4, 0, 2}};
  sel.RemoveImage(4);
  EXPECT_EQ(entries[1].Hits.size(), 1u);
  EXPECT_EQ(entries[1].Hits[0].Score, 2.0);
}

TEST(PersistantSelection, ImagesAndIdentity) {
  CVXPersistantSelection sel(4);
  sel.Properties().Result = Sample();
  EXPECT_TRUE(sel.HasImage(10));
  EXPECT_TRUE(sel.HasImage(21));
  EXPECT_FALSE(sel.HasImage(2));  // a folder, not a file

  CBitVector bits;
  bits.Set(3);
  sel.GetAllResultImages(bits);
  EXPECT_EQ(bits.Count(), 2u);  // the bit set before is cleared; originals are not result images
  EXPECT_TRUE(bits.Get(20) && bits.Get(21));
  CBitVector fresh;
  sel.GetAllResultImages(fresh);
  EXPECT_EQ(fresh.Size(), 20u + 33u);

  CVXPersistantSelection other(4);
  other.Properties().Name = "different";
  EXPECT_TRUE(other == sel);
  sel.SetDirty(true);
  CVXPersistantSelection copy = sel;
  EXPECT_TRUE(copy.IsDirty());
  EXPECT_FALSE(CVXPersistantSelection(5) == sel);
}

TEST(PersistantSelection, StreamMatchesTheHandBuiltBytes) {
  CVXPersistantSelection sel(0x11);
  CVXPersistantSelection::SData& d = sel.Properties();
  d.Name = "Sel";
  d.TimeStamp = -2;
  d.Reserved = 0x33;
  d.Selector.Oid() = 0x22;
  d.Selector.Properties().Name = "S";
  d.Result = Sample();
  sel.SetDirty(true);
  Bytes want;
  want.u16(1).u32(0x11).u16(1).str("Sel").u32(0xFFFFFFFE).u32(0x33);
  want.u16(1).u32(0x22).u16(1).str("S").le(uint8_t{0}).u32(0);
  std::vector<uint8_t> result = SampleBytes();
  want.raw(result.data(), result.size()).le(uint8_t{1});
  EXPECT_EQ(Streamed(sel), want.b);
  EXPECT_EQ(Streamed(seltest::Read(want.b, CVXPersistantSelection())), want.b);
  seltest::ExpectPrefixesFail(want.b, CVXPersistantSelection(9));
}

}  // namespace
