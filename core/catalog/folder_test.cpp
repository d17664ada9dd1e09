#include <gtest/gtest.h>

#include "vxbytes.h"

#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include "VXFolder.h"
#include "VXMemFile.h"
#include "VXResult.h"
#include "vxlib_test_util.h"

namespace {

// Little-endian byte builder for hand-made records.
using vxtest::Bytes;

// Reaches the fields that only Properties() exposes.
class Folder : public CVXFolder {
 public:
  using CVXFolder::CVXFolder;
  using CVXFolder::Properties;
};

std::vector<uint8_t> Serialise(const CVXFolder& f) {
  CVXMemFile file;
  file << f;
  return {file.GetBuffer(), file.GetBuffer() + file.GetFileSize()};
}

// A folder with a distinct value in every field that the current record holds.
Folder Sample() {
  Folder f(CVXURI("c:\\pics", true), 0x0A0B0C0D, 3);
  f.LastUpdate() = 0x12345678, f.MayBeOffline() = true, f.IsDBRelative() = true;
  f.MediaID() = "DISK", f.MediaSerial() = "0xDEADBEEF", f.Comment() = "c";
  f.Children() = {7, 8}, f.Files() = {9}, f.Thumbnail() = 9;
  CVXFolder::SData& d = f.Properties();
  d.HasCredentials = true, d.Proxy = "proxy", d.ProxyPort = 8080;
  std::memset(d.Credential1, 'u', sizeof d.Credential1);
  std::memset(d.Credential2, 'p', sizeof d.Credential2);
  f.SetFriendlyName("Pics");
  f.Flags() = 0x40, f.LastActiveOid() = 9, f.ThumbSize() = -1;
  return f;
}

// The record of Sample() as a folder record of `version` would hold it; versions below 4 have
// no credentials so that the short form is covered too.
std::vector<uint8_t> SampleRecord(uint16_t version) {
  Bytes r;
  r.le(uint16_t(1)).le(0x0A0B0C0Du).le(version).le(0x12345678).le(uint8_t(1));
  r.str("DISK").str("0xDEADBEEF").str("c").le(uint8_t(1));
  r.le(uint32_t(CVXURI::File)).le(uint8_t(1)).str("file://c:/pics/");
  r.le(3u).le(9u).le(2u).le(7u).le(8u).le(1u).le(9u);
  r.le(uint8_t(version >= 4));
  if (version >= 4) {
    r.b.insert(r.b.end(), 128, 'u');
    r.b.insert(r.b.end(), 128, 'p');
  }
  r.str("proxy").le(8080u);
  if (version >= 4) r.str("Pics");
  if (version >= 5) r.le(0x40u);
  if (version >= 6) r.le(9u).le(-1);
  return r.b;
}

Folder Read(const std::vector<uint8_t>& bytes) {
  CVXMemFile in(bytes.data(), bytes.size());
  Folder f;
  in >> f;
  EXPECT_EQ(in.Remaining(), 0u);
  return f;
}

TEST(FolderRecord, WritesVersion6AndReadsEveryVersion) {
  EXPECT_EQ(Serialise(Sample()), SampleRecord(6));
  for (uint16_t version = 1; version <= 6; ++version) {
    SCOPED_TRACE(version);
    Folder got = Read(SampleRecord(version));
    EXPECT_EQ(got.Oid(), 0x0A0B0C0Du);
    EXPECT_EQ(got.LastUpdate(), 0x12345678);
    EXPECT_EQ(got.MediaSerial(), "0xDEADBEEF");
    EXPECT_TRUE(got.URI() == CVXURI("c:/pics/", true));
    EXPECT_EQ(got.Children(), (std::vector<uint32_t>{7, 8}));
    EXPECT_EQ(got.Files(), std::vector<uint32_t>{9});
    EXPECT_EQ(got.Properties().HasCredentials, version >= 4);
    EXPECT_EQ(got.Properties().Proxy, "proxy");
    EXPECT_EQ(got.FriendlyName(), version >= 4 ? "Pics" : "pics");
    EXPECT_EQ(got.Flags(), version >= 5 ? 0x40u : 0u);
    EXPECT_EQ(got.LastActiveOid(), version >= 6 ? 9u : 0u);
    EXPECT_EQ(got.ThumbSize(), version >= 6 ? -1 : 0);
  }
  // What reads from the current version writes back byte for byte.
  EXPECT_EQ(Serialise(Read(SampleRecord(6))), SampleRecord(6));
}

TEST(FolderRecord, UriTypeAndFlagComeFromTheRecordAsStored) {
  std::vector<uint8_t> bytes = SampleRecord(6);
  Bytes uri;
  uri.le(uint32_t(7)).le(uint8_t(0)).str("C:\\raw");
  const size_t at = 2 + 4 + 2 + 4 + 1 + 8 + 14 + 5 + 1;  // behind IsDBRelative
  bytes.erase(bytes.begin() + at, bytes.begin() + at + 4 + 1 + 4 + 15);
  bytes.insert(bytes.begin() + at, uri.b.begin(), uri.b.end());
  Folder got = Read(bytes);
  EXPECT_EQ(got.URI().AsString(), "C:\\raw");
  EXPECT_EQ(got.URI().Type(), 7u);
  EXPECT_FALSE(got.URI().IsFolder());
  EXPECT_EQ(Serialise(got), bytes);
}

TEST(FolderRecord, TruncatedOrOversizedRecordsFailAndKeepTheTarget) {
  std::vector<uint8_t> full = SampleRecord(6);
  const Folder keep(CVXURI("d:/keep", true), 5, 0);
  for (size_t cut = 0; cut < full.size(); ++cut) {
    Folder target = keep;
    CVXMemFile in(full.data(), cut);
    EXPECT_EQ(ThrownCode([&] { in >> target; }), VX_NOT_FOUND) << cut;
    EXPECT_EQ(Serialise(target), Serialise(keep)) << cut;
  }
  // A child count far beyond the record fails before anything is allocated for it.
  const size_t childCount = 2 + 4 + 2 + 4 + 1 + 8 + 14 + 5 + 1 + 4 + 1 + 19 + 4 + 4;
  std::vector<uint8_t> huge = full;
  std::memset(&huge[childCount], 0xFF, 4);
  Folder target = keep;
  CVXMemFile in(huge.data(), huge.size());
  EXPECT_EQ(ThrownCode([&] { in >> target; }), VX_NOT_FOUND);
  EXPECT_EQ(Serialise(target), Serialise(keep));
}

TEST(Folder, ListsKeepNoDuplicatesAndTouchOnlyOnChange) {
  CVXFolder f(CVXURI("c:/", true), 1, 0);
  f.LastUpdate() = 5;
  f.AddFile(10);
  EXPECT_EQ(f.Thumbnail(), 10u);  // the first file represents the folder
  EXPECT_GE(f.LastUpdate(), std::time(nullptr) - 1);
  f.AddFile(11);
  f.AddFile(12);
  f.LastUpdate() = 5;
  f.AddFile(11);
  f.RemoveFile(99);
  f.AddChild(2);
  f.LastUpdate() = 5;
  f.AddChild(2);
  f.RemoveChild(98);
  EXPECT_EQ(f.LastUpdate(), 5);
  EXPECT_EQ(f.Files(), (std::vector<uint32_t>{10, 11, 12}));
  EXPECT_EQ(f.Children(), std::vector<uint32_t>{2});

  f.RemoveFile(11);  // not the thumbnail: it stays
  EXPECT_EQ(f.Thumbnail(), 10u);
  EXPECT_GT(f.LastUpdate(), 5);
  f.RemoveFile(10);  // the thumbnail passes to the first remaining file
  EXPECT_EQ(f.Thumbnail(), 12u);
  f.RemoveFile(12);
  EXPECT_EQ(f.Thumbnail(), 0u);

  f.AddChild(3);
  f.AddChild(4);
  f.RemoveChild(2);
  EXPECT_EQ(f.Children(), (std::vector<uint32_t>{3, 4}));
}

TEST(Folder, FriendlyNameFallsBackToTheLastNameAndOrderFollowsTheUri) {
  CVXFolder root(CVXURI("c:/", true), 1, 0);
  EXPECT_EQ(root.FriendlyName(), "c:/");
  root.SetFriendlyName("Drive C");
  EXPECT_EQ(root.FriendlyName(), "Drive C");
  root.SetFriendlyName("");
  EXPECT_EQ(root.FriendlyName(), "c:/");
  CVXFolder x(CVXURI("c:/a", true), 1, 0), y(CVXURI("C:/B", true), 2, 0);
  EXPECT_TRUE(x < y && !(y < x));
}

TEST(Folder, MediaSerialWindows) {
  const std::pair<const char*, const char*> cases[] = {
      {"3735928559", "DEAD-BEEF"}, {"", "0-0"},        {"0x1234abcd", "1234-ABCD"},
      {"65535", "0-FFFF"},         {"010", "0-8"},     {"99999999999", "FFFF-FFFF"},
      {"-2", "FFFF-FFFE"},         {" 7 tail", "0-7"}, {"junk", "0-0"},
  };
  CVXFolder f;
  for (const auto& [serial, shown] : cases) {
    f.MediaSerial() = serial;
    EXPECT_EQ(f.MediaSerialWindows(), shown) << serial;
  }
}

}  // namespace
