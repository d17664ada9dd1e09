#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "SelTempStore.h"
#include "VXEngine.h"
#include "VXResult.h"
#include "vxtest.h"

namespace {

// The bytes of an empty store: header, its byte-sum checksum, and the zero checksum of an empty
// template section.
std::string EmptyStoreBytes(uint32_t lastOid, const char* magic = "VXST") {
  std::string b(272, '\0');
  std::memcpy(b.data(), magic, 4);
  b[4] = 1;
  std::memcpy(b.data() + 12, &lastOid, 4);
  uint32_t sum = 0;
  for (unsigned char c : b) sum += c;
  b.append(reinterpret_cast<const char*>(&sum), 4);
  b.append(4, '\0');
  return b;
}

class SelTempStoreTest : public ::testing::Test {
 protected:
  void SetUp() override {
    engine_.SetLogFile(&log_);
    store_.SetEngine(&engine_);
  }
  std::string Path() const { return dir_ / "db.vxl"; }

  vxtest::TempDir dir_;
  vxtest::CapturedLog log_;
  CVXEngine engine_;
  SelTempStore store_;
};

TEST_F(SelTempStoreTest, CreateWritesTheEmptyLayout) {
  ASSERT_EQ(store_.Create(Path()), VX_OK);
  EXPECT_TRUE(store_.IsOpen());
  ASSERT_EQ(store_.Close(), VX_OK);
  EXPECT_EQ(vxtest::ReadFile(Path()), EmptyStoreBytes(0));
}

TEST_F(SelTempStoreTest, MissingFileIsCreatedWithAWarning) {
  ASSERT_EQ(store_.Open(Path(), false), VX_OK);
  EXPECT_TRUE(log_.Has("Creating a new selection template storage"));
  EXPECT_TRUE(log_.HasLine("- Completed"));
  EXPECT_EQ(vxtest::ReadFile(Path()), EmptyStoreBytes(0));
}

TEST_F(SelTempStoreTest, ChecksumIsTheOnlyTest) {
  // A foreign magic with a right checksum opens; the last OID is kept and written back.
  vxtest::WriteFile(Path(), EmptyStoreBytes(41, "ABCD"));
  ASSERT_EQ(store_.Open(Path(), false), VX_OK);
  EXPECT_EQ(uint32_t{store_.Header().LastOid}, 41u);
  ASSERT_EQ(store_.Close(), VX_OK);
  EXPECT_EQ(vxtest::ReadFile(Path()), EmptyStoreBytes(41, "ABCD"));

  // Any flipped byte is caught; the store stays open and empty and the next flush repairs it.
  for (size_t at : {size_t{0}, size_t{100}, size_t{273}, size_t{277}}) {
    std::string bytes = EmptyStoreBytes(41);
    bytes[at] ^= 0x10;
    vxtest::WriteFile(Path(), bytes);
    log_.ClearCaptured();
    EXPECT_EQ(store_.Open(Path(), false), VX_CHECKSUM) << "byte " << at;
    EXPECT_TRUE(log_.Has("Clearing templates due to error"));
    EXPECT_TRUE(store_.IsOpen());
    ASSERT_EQ(store_.Flush(), VX_OK);
    EXPECT_EQ(vxtest::ReadFile(Path()), EmptyStoreBytes(0));
    ASSERT_EQ(store_.Close(), VX_OK);
  }
}

TEST_F(SelTempStoreTest, ShortFilesGiveCodesAndReadOnlyWritesNothing) {
  for (const std::string& bytes :
       {std::string(), std::string("VXST"), EmptyStoreBytes(0).substr(0, 275)}) {
    vxtest::WriteFile(Path(), bytes);
    EXPECT_EQ(store_.Open(Path(), true), VX_NOT_FOUND);
    EXPECT_EQ(store_.Flush(), VX_OK);
    EXPECT_EQ(vxtest::ReadFile(Path()), bytes) << "a read-only store wrote its file";
  }
}

}  // namespace
