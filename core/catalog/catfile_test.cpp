#include <gtest/gtest.h>

#include "vxbytes.h"

#include <ctime>
#include <string>
#include <vector>

#include "VXCatFile.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "vxlib_test_util.h"

namespace {

// Little-endian byte builder for hand-made records.
using vxtest::Bytes;

// A file with a distinct value in every field, and its record built by hand.
CVXCatFile Sample(const std::string& name) {
  CVXCatFile f(0x01020304, name, 0x11);
  CVXCatFile::SData& d = f.Properties();
  d.Width = 0x22, d.Height = 0x33, d.Size = 0x44, d.Format = 0x55, d.CRC = 0xA1B2C3D4;
  d.Processed = -2, d.FileTime = 0x66, d.Flags = 0x8041, d.Reserved1 = 0x77;
  d.EmbeddedTime = 0x88, d.OriginalFile = 0x99, d.VersionTag = 0xAA;
  for (int i = 0; i < 19; ++i) d.Reserved4[i] = static_cast<uint8_t>(0xB0 + i);
  return f;
}

std::vector<uint8_t> SampleRecord(const std::string& name) {
  Bytes r;
  r.le(uint16_t(1)).le(uint32_t(0x01020304)).le(uint16_t(3)).str(name);
  r.le(0x11u).le(0x22u).le(0x33u).le(0x44u).le(0x55u).le(0xA1B2C3D4u).le(int32_t(-2));
  r.le(0x66).le(uint16_t(0x8041)).le(0x77u).le(0x88).le(0x99u).le(uint8_t(0xAA));
  for (int i = 0; i < 19; ++i) r.le(uint8_t(0xB0 + i));
  return r.b;
}

std::vector<uint8_t> Serialise(const CVXCatFile& f) {
  CVXMemFile file;
  file << f;
  return {file.GetBuffer(), file.GetBuffer() + file.GetFileSize()};
}

bool SameRecord(const CVXCatFile& a, const CVXCatFile& b) {
  return a.Oid() == b.Oid() && Serialise(a) == Serialise(b);
}

// Bulk loads read records straight from bytes; that reader must agree with the stream.
TEST(CatFileRecord, WritesAndReadsTheHandBuiltRecord) {
  for (const std::string name : {"Müller.jpg", ""}) {
    SCOPED_TRACE(name);
    std::vector<uint8_t> want = SampleRecord(name);
    EXPECT_EQ(want.size(), 12 + name.size() + CVXCatFile::kBlockBytes);
    EXPECT_EQ(Serialise(Sample(name)), want);

    CVXMemFile in(want.data(), want.size());
    CVXCatFile got;
    in >> got;
    EXPECT_EQ(in.Remaining(), 0u);
    EXPECT_EQ(got.Oid(), 0x01020304u);
    EXPECT_EQ(got.Name(), name);
    EXPECT_TRUE(SameRecord(got, Sample(name)));
    want.push_back(0xAB);  // the next record's first byte
    const uint8_t* at = want.data();
    EXPECT_TRUE(SameRecord(CVXCatFile(at, want.data() + want.size()), got));
    EXPECT_EQ(at, want.data() + want.size() - 1);
  }
}

TEST(CatFileRecord, TruncationAtEveryCutFailsAndKeepsTheTarget) {
  std::vector<uint8_t> full = SampleRecord("abc.jpg");
  for (size_t cut = 0; cut < full.size(); ++cut) {
    CVXCatFile target(5, "keep", 6);
    CVXCatFile before = target;
    CVXMemFile in(full.data(), cut);
    EXPECT_EQ(ThrownCode([&] { in >> target; }), VX_NOT_FOUND) << cut;
    EXPECT_TRUE(SameRecord(target, before)) << cut;
    const uint8_t* at = full.data();
    EXPECT_EQ(ThrownCode([&] { CVXCatFile read(at, full.data() + cut); }), VX_NOT_FOUND) << cut;
  }
  // A name length beyond the record fails the same way.
  std::vector<uint8_t> huge = full;
  huge[8] = huge[9] = huge[10] = huge[11] = 0xFF;
  CVXMemFile in(huge.data(), huge.size());
  CVXCatFile target;
  EXPECT_EQ(ThrownCode([&] { in >> target; }), VX_NOT_FOUND);
}

TEST(CatFile, ConstructorsStampTheTimesAndZeroTheRest) {
  time_t before = std::time(nullptr);
  CVXCatFile fromChars(3, "a.jpg", 4), fromNull(3, static_cast<const char*>(nullptr), 4);
  time_t after = std::time(nullptr);
  const CVXCatFile::SData& d = fromChars.Properties();
  EXPECT_GE(d.Processed, before);
  EXPECT_LE(d.Processed, after);
  EXPECT_EQ(d.FileTime, d.Processed);
  EXPECT_EQ(d.Folder, 4u);
  EXPECT_EQ(fromNull.Name(), "");
  CVXCatFile zero;
  zero.Properties().Processed = zero.Properties().FileTime = 0;
  Bytes want;
  want.le(uint16_t(1)).le(0u).le(uint16_t(3)).str("");
  want.b.resize(want.b.size() + CVXCatFile::kBlockBytes);
  EXPECT_EQ(Serialise(zero), want.b);
}

TEST(CatFile, NamesCompareWithoutCaseAndEqualityNeedsTheFolder) {
  CVXCatFile a(1, "Müller.JPG", 10), b(2, "MÜLLER.jpg", 10), z(4, "zebra.jpg", 1);
  EXPECT_TRUE(a == b && a == std::string("mÜller.jpg") && a < z);
  EXPECT_FALSE(a == std::string("Muller.jpg") || z < a);
  // Same name in another folder: not equal, and neither is less.
  CVXCatFile c(3, "müller.jpg", 11);
  EXPECT_FALSE(a == c || a < c || c < a);
}

TEST(CatFile, OrientationAndSortTime) {
  CVXCatFile f;
  CVXCatFile::SData& d = f.Properties();
  d.Width = d.Height = 8;
  EXPECT_TRUE(f.IsLandscape() && f.IsPortrait());
  d.Width = 9;
  EXPECT_FALSE(f.IsPortrait());
  d.FileTime = 100, d.EmbeddedTime = 200, d.Flags = 0;
  EXPECT_EQ(f.SortTime(), 100);  // not flagged
  d.Flags = cfEmbeddedTimeValid | cfGreyscale;
  EXPECT_EQ(f.SortTime(), 200);
  EXPECT_TRUE(f.IsGreyscale());
  d.EmbeddedTime = 0;
  EXPECT_EQ(f.SortTime(), 100);  // flagged but empty
}

}  // namespace
