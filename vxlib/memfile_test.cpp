#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <vector>

#include "VXMemFile.h"
#include "VXResult.h"
#include "bitvector.h"
#include "vxlib_test_util.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes Content(const CVXMemFile& f) { return Bytes(f.GetBuffer(), f.GetBuffer() + f.GetFileSize()); }

// A file of unknown length (no Remaining()), like a stream from disk.
class CStreamFile : public CVXFile {
 public:
  explicit CStreamFile(Bytes data) : data_(std::move(data)) {}

 protected:
  void WriteRaw(const void*, size_t) override {}
  void ReadRaw(void* buffer, size_t size) override {
    if (size > data_.size() - read_) VX_THROW(VX_NOT_FOUND);
    std::memcpy(buffer, data_.data() + read_, size);
    read_ += size;
  }

 private:
  Bytes data_;
  size_t read_ = 0;
};

TEST(MemFile, IntegersAndStringsAgainstTheirBytes) {
  CVXMemFile f;
  std::string binary("a\0\xff", 3);
  f << uint8_t{0x11} << uint16_t{0x2233} << uint32_t{0x44556677} << int32_t{-2}
    << uint64_t{0x0102030405060708} << 1.0 << std::string("hé") << binary
    << static_cast<const char*>(nullptr);
  EXPECT_EQ(Content(f),
            (Bytes{0x11, 0x33, 0x22, 0x77, 0x66, 0x55, 0x44, 0xFE, 0xFF, 0xFF, 0xFF, 0x08,
                   0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01, 0,    0,    0,    0,    0,
                   0,    0xF0, 0x3F, 3,    0,    0,    0,    'h',  0xC3, 0xA9, 3,    0,
                   0,    0,    'a',  0,    0xFF, 0,    0,    0,    0}));
  f.Rewind();
  std::tuple<uint8_t, uint16_t, uint32_t, int32_t, uint64_t, double> numbers;
  auto& [a, b, c, d, e, g] = numbers;
  std::string s1, s2, s3 = "x";
  f >> a >> b >> c >> d >> e >> g >> s1 >> s2 >> s3;
  EXPECT_EQ(numbers, std::tuple(0x11, 0x2233, 0x44556677u, -2, 0x0102030405060708u, 1.0));
  EXPECT_EQ(std::tuple(s1, s2, s3), std::tuple("hé", binary, ""));
  EXPECT_EQ(f.GetPosition(), f.GetFileSize());
}

TEST(MemFile, ReadsPastTheEndThrowAndKeepTargetAndPosition) {
  const uint8_t data[] = {5, 0, 0, 0, 'a', 'b', 'c'};  // 5 bytes claimed, 3 present
  CVXMemFile f(data, sizeof data);
  std::string text = "kept";
  EXPECT_EQ(ThrownCode([&] { f >> text; }), VX_NOT_FOUND);
  EXPECT_EQ(text, "kept");
  f.Rewind();
  uint32_t n;
  uint64_t big = 7;
  f >> n;
  EXPECT_EQ(ThrownCode([&] { f >> big; }), VX_NOT_FOUND);
  EXPECT_EQ(big, 7u);
  EXPECT_EQ(f.GetPosition(), 4u);  // the failed read consumed nothing
  uint8_t byte;
  f >> byte;
  EXPECT_EQ(byte, 'a');

  // On a stream of unknown length a 4 GB count must fail, not allocate or read beyond.
  for (int kind = 0; kind < 3; ++kind) {
    CStreamFile s(Bytes{0xFF, 0xFF, 0xFF, 0xFF, 1, 2, 3});
    CVXMemFile mem(data, 1);
    CBitVector bits = CBitVector(std::vector<unsigned long>{5});
    EXPECT_EQ(ThrownCode([&] { kind == 0   ? s >> text
                               : kind == 1 ? s >> mem
                                           : s >> bits; }),
              VX_NOT_FOUND);
    EXPECT_EQ(text, "kept");
    EXPECT_EQ(Content(mem), Bytes{5});
    EXPECT_TRUE(bits == CBitVector(std::vector<unsigned long>{5}));
  }
}

TEST(MemFile, CheckSumCoversWritesAndReadsBetweenBeginAndEnd) {
  const uint32_t kSum = 1 + 2 + 3 + 4 + 2 + 'A' + 'B';
  CVXMemFile f;
  f << uint8_t{0xFF};  // before: not summed
  f.BeginCheckSum();
  f << uint32_t{0x01020304} << std::string("AB");
  EXPECT_EQ(f.EndCheckSum(), kSum);
  f << uint8_t{0x7F};  // after: not summed
  f.Seek(1);
  f.BeginCheckSum();
  uint32_t v;
  std::string s;
  f >> v >> s;
  EXPECT_EQ(f.EndCheckSum(), kSum);
  f.BeginCheckSum();  // a new sum starts from 0
  EXPECT_EQ(f.EndCheckSum(), 0u);
}

TEST(MemFile, GetBufferSeekAndClearSetTheContent) {
  CVXMemFile f;
  std::memcpy(f.GetBuffer(6), "\x02\x00\x00\x00hi", 6);
  EXPECT_EQ(f.GetFileSize(), 6u);
  std::string s;
  f >> s;
  EXPECT_EQ(s, "hi");
  f.GetBuffer(2);  // shrinking clamps the position
  EXPECT_EQ(f.GetPosition(), 2u);
  f.Rewind();
  EXPECT_EQ(ThrownCode([&] { f >> s; }), VX_NOT_FOUND);

  CVXMemFile g(false, 0, 16);
  for (uint32_t i = 0; i < 1000; ++i) g << i;  // many growth steps
  g.Seek(4);
  g << uint16_t{0xAAAA};  // overwriting inside the content keeps the size
  EXPECT_EQ(g.GetFileSize(), 4000u);
  EXPECT_EQ(Bytes(g.GetBuffer(), g.GetBuffer() + 8), (Bytes{0, 0, 0, 0, 0xAA, 0xAA, 0, 0}));
  EXPECT_EQ(ThrownCode([&] { g.Seek(4001); }), VX_NOT_FOUND);
  g.Clear();
  EXPECT_EQ(g.GetFileSize() + g.GetPosition(), 0u);
}

TEST(MemFile, NestedMemFilesRoundTrip) {
  CVXMemFile inner;
  inner << uint16_t{0x0102} << std::string("in");
  CVXMemFile outer;
  outer << uint8_t{0xEE} << inner << uint8_t{0xDD};
  Bytes expected{0xEE, 8, 0, 0, 0, 0x02, 0x01, 2, 0, 0, 0, 'i', 'n', 0xDD};
  EXPECT_EQ(Content(outer), expected);
  outer.Rewind();
  uint8_t head, tail;
  CVXMemFile back;
  outer >> head >> back >> tail;
  EXPECT_EQ(tail, 0xDD);
  EXPECT_EQ(Content(back), Content(inner));
  EXPECT_EQ(back.GetPosition(), 0u);

  expected[1] = 20;  // a nested length beyond the outer content
  CVXMemFile corrupt(expected.data(), expected.size());
  corrupt >> head;
  EXPECT_EQ(ThrownCode([&] { corrupt >> back; }), VX_NOT_FOUND);
  EXPECT_EQ(Content(back), Content(inner));
}

TEST(MemFile, BitVectorsStreamAsCountAndLittleEndianBytes) {
  CBitVector bits(std::vector<unsigned long>{0, 9, 40});  // 73 bits: three 32-bit words
  CVXMemFile f;
  f << bits << CBitVector();
  EXPECT_EQ(Content(f),
            (Bytes{12, 0, 0, 0, 0x01, 0x02, 0, 0, 0, 0x01, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0}));
  f.Rewind();
  CBitVector back, none(std::vector<unsigned long>{3});
  f >> back >> none;
  EXPECT_TRUE(back == bits);
  EXPECT_EQ(back.Size(), 96u);
  EXPECT_TRUE(none.IsEmpty());

  for (Bytes data : {Bytes{8, 0, 0, 0, 1, 2, 3}, Bytes{1, 0}}) {
    CVXMemFile short_file(data.data(), data.size());
    EXPECT_EQ(ThrownCode([&] { short_file >> back; }), VX_NOT_FOUND);
    EXPECT_TRUE(back == bits);
  }
}

TEST(MemFile, FileExistsOnlyForRegularFiles) {
  auto dir = std::filesystem::temp_directory_path();
  auto path = dir / ("vxlib_exists_" + std::to_string(::getpid()));
  std::fclose(std::fopen(path.c_str(), "w"));
  EXPECT_TRUE(CVXFile::FileExists(path.string()));
  std::filesystem::remove(path);
  EXPECT_FALSE(CVXFile::FileExists(path.string()));
  EXPECT_FALSE(CVXFile::FileExists(dir.string()));
  EXPECT_FALSE(CVXFile::FileExists(""));
}

}  // namespace
