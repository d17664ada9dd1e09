#include <gtest/gtest.h>
#include <sqlite3.h>

#include <string>
#include <vector>

#include "Shape.h"
#include "VXGroup.h"
#include "vxengine_fixture.h"

namespace {

using vxtest::MakeBitmap;
using vxtest::MakeRow;
using vxtest::MakeShape;
using vxtest::MakeThumb;

std::vector<uint8_t> Bytes(const SVXDBRec_3& record) {
  auto* p = reinterpret_cast<const uint8_t*>(&record);
  return {p, p + sizeof record};
}

// Record 2/OID of a file added from a bitmap: a zero flag byte, then the bitmap's shape data.
std::vector<uint8_t> ShapeOf(const CVXBitmap& bitmap) {
  SVXDBRec_3 record{};
  EXPECT_TRUE(CShape().CalcShapeInfo(bitmap, record.Info, 127));
  return Bytes(record);
}

class EngineFilesTest : public vxtest::EngineFixture {
 protected:
  void SetUp() override {
    EngineFixture::SetUp();
    vxtest::DefineColumns(engine_, 2);
    pics_ = AddFolder("c:/pics/");
    other_ = AddFolder("c:/other/");
  }

  // A file with data in every store: shape, thumbnail, properties, XMP and a category.
  uint32_t AddFullFile(uint32_t folder, const std::string& name, uint32_t seed) {
    uint32_t oid = AddFile(folder, name, seed);
    EXPECT_EQ(engine_.AddImageProperties(oid, MakeRow(seed, 2)), VX_OK);
    SetXMP(oid, name);
    CVXGroup group(engine_.Catalog().GenerateGroupOID());
    group.Name() = "g" + name;
    group.Images().Set(oid);
    EXPECT_EQ(engine_.Catalog().AddGroup(group), VX_OK);
    return oid;
  }

  // What the stores hold of a file besides its catalog record.
  struct SData {
    std::vector<uint8_t> shape, thumb;
    std::vector<CVXProperty> properties;
    std::string xmp;
    std::vector<uint32_t> groups;
    bool operator==(const SData&) const = default;
  };
  SData Data(uint32_t oid) {
    SData data{ShapeBytes(oid), {}, {}, XMPPacket(oid), {}};
    CVXThumb thumb;
    engine_.GetThumb(oid, thumb);
    data.thumb.assign(thumb.Data(), thumb.Data() + thumb.DataSize());
    engine_.GetImageProperties(oid, data.properties);
    EXPECT_EQ(engine_.GetFileGroups(oid, data.groups), VX_OK);
    return data;
  }

  // True when no store but the catalog holds anything of `oid`.
  bool Gone(uint32_t oid) {
    vxtest::StoreContents c = vxtest::ReadStores(engine_);
    return engine_.Catalog().IsUniqueFileOID(oid) && !c.shapes.count(oid) && !c.thumbs.count(oid) &&
           !c.properties.count(oid) && !c.xmp.count(oid);
  }

  uint32_t pics_ = 0;
  uint32_t other_ = 0;
};

TEST_F(EngineFilesTest, AddFileComputesShapeDataOfAnyBitmapAndUpdatesByNameIgnoringCase) {
  const uint32_t bitmaps[][3] = {{1, 1, 0}, {70000, 1, 0}, {30, 20, 1}};
  log_.ClearCaptured();
  for (const auto& [w, h, grey] : bitmaps) {
    CVXBitmap bitmap = MakeBitmap(w, h, w + h, grey);
    CVXCatFile file(0, std::to_string(w) + "x" + std::to_string(h), pics_);
    file.Properties().Processed = 0;
    ASSERT_EQ(engine_.AddFile(file, bitmap, 0xC0FFEE), VX_OK) << file.Name();
    EXPECT_NE(file.Properties().Processed, 0);
    EXPECT_EQ(file.IsGreyscale(), grey != 0);
    EXPECT_EQ(File(file.Oid()).Properties().CRC, 0xC0FFEEu);
    EXPECT_EQ(ShapeBytes(file.Oid()), ShapeOf(bitmap)) << file.Name();
  }
  for (const char* line : {"+ VXEngine::AddFile", "+ VXEngine::PF", "Insert", "- VXEngine::PF",
                           "- VXEngine::AddFile"}) {
    EXPECT_TRUE(log_.HasLine(line)) << line;
  }

  // The same name in other case updates the last file under its OID, in colour now.
  uint32_t oid = engine_.Catalog().Header().LastFileOid;
  CVXCatFile again(0, "30X20", pics_);
  again.Properties().Flags = cfGreyscale;
  CVXBitmap colour = MakeBitmap(30, 20, 6);
  log_.ClearCaptured();
  ASSERT_EQ(engine_.AddFile(again, colour, 7), VX_OK);
  EXPECT_EQ(again.Oid(), oid);
  EXPECT_TRUE(log_.HasLine("Update"));
  EXPECT_FALSE(again.IsGreyscale());
  EXPECT_EQ(ShapeBytes(oid), ShapeOf(colour));
  EXPECT_EQ(File(oid).Properties().CRC, 7u);
  EXPECT_EQ(engine_.Catalog().NumberOfFiles(), std::size(bitmaps));
}

// Adds and copies that fail spend the new OID but leave nothing under it.
TEST_F(EngineFilesTest, FailedAddsAndCopiesLeaveNothingBehind) {
  CVXCatFile file(0, "a.jpg", 999);
  EXPECT_EQ(engine_.AddFile(file, MakeBitmap(8, 8, 1), 0), VX_NOT_FOUND);
  EXPECT_NE(file.Oid(), 0u) << "a new OID was taken";
  EXPECT_TRUE(Gone(file.Oid()));

  CVXCatFile ready(0, "b.jpg", 999);
  CVXThumb thumb = MakeThumb(8, 8, 8, 1);
  log_.ClearCaptured();
  EXPECT_EQ(engine_.AddFile(ready, thumb, MakeShape(1)), VX_INDEX_CORRUPTED);
  EXPECT_TRUE(log_.Has("Index corrupted. Run Diagnosis & Repair!"));
  EXPECT_TRUE(Gone(ready.Oid()));
  EXPECT_GT(ready.Oid(), file.Oid());

  // No pixels: no shape record, no catalog record.
  CVXCatFile empty(0, "empty.jpg", pics_);
  log_.ClearCaptured();
  EXPECT_EQ(engine_.AddFile(empty, CVXBitmap(), 1), VX_NOT_FOUND);
  EXPECT_TRUE(log_.Has("Preprocess failed"));
  EXPECT_GT(empty.Oid(), ready.Oid());
  EXPECT_TRUE(Gone(empty.Oid()));

  // The property store refuses to write: the copy fails after its shape data and thumbnail
  // went in, and they go again with the catalog record.
  uint32_t a = AddFullFile(pics_, "a.jpg", 1);
  uint32_t next = engine_.Catalog().Header().LastFileOid + 1;
  unsigned long copy = 77;
  sqlite3* props = engine_.GetPropertyDatabase().BlobDB().Handle();
  ASSERT_EQ(sqlite3_exec(props, "PRAGMA query_only=1", nullptr, nullptr, nullptr), SQLITE_OK);
  EXPECT_NE(engine_.CopyFile(a, other_, copy, "x.jpg", false), VX_OK);
  ASSERT_EQ(sqlite3_exec(props, "PRAGMA query_only=0", nullptr, nullptr, nullptr), SQLITE_OK);
  EXPECT_EQ(copy, 0u);
  EXPECT_TRUE(Gone(next));
  EXPECT_EQ(engine_.Catalog().NumberOfFiles(), 1u);
  EXPECT_FALSE(Gone(a));
}

TEST_F(EngineFilesTest, AddFileFromThumbAndShapeAddsAndUpdates) {
  CVXCatFile file(0, "x.png", pics_);
  file.Properties().Processed = 0;
  CVXThumb thumb = MakeThumb(64, 48, 300, 2);
  ASSERT_EQ(engine_.AddFile(file, thumb, MakeShape(9)), VX_OK);
  uint32_t oid = file.Oid();
  EXPECT_EQ(thumb.Oid(), oid);
  EXPECT_NE(File(oid).Properties().Processed, 0) << "the stored record carries the time";
  EXPECT_EQ(ShapeBytes(oid), Bytes(MakeShape(9)));
  CVXCatFile same(0, "X.PNG", pics_);
  CVXThumb wide = MakeThumb(640, 48, 30, 3);
  ASSERT_EQ(engine_.AddFile(same, wide, MakeShape(10)), VX_OK);
  EXPECT_EQ(same.Oid(), oid);
  EXPECT_EQ(ShapeBytes(oid), Bytes(MakeShape(10)));
  CVXThumb back;
  ASSERT_EQ(engine_.GetThumb(oid, back), VX_OK);
  EXPECT_EQ(back.Width(), 640u);
  EXPECT_EQ(engine_.Catalog().NumberOfFiles(), 1u);
}

TEST_F(EngineFilesTest, MutationsNeedAnOpenWritableEngine) {
  uint32_t oid = AddFile(pics_, "a.jpg");
  Reopen(true);
  CVXCatFile file(0, "b.jpg", pics_);
  CVXFolder folder(CVXURI("c:/new/", true), 0, 0);
  unsigned long newOid = 1;
  log_.ClearCaptured();
  EXPECT_EQ(engine_.AddFile(file, MakeBitmap(4, 4, 1), 0), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.RemoveFile(oid), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.MoveFile(oid, other_, "", false), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.CopyFile(oid, other_, newOid, "", false), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.SetFile(file), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.RenameFile(oid, "c.jpg"), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.AddFolder(folder), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.RemoveFolder(pics_), VX_NOT_MUTABLE);
  CVXThumb thumb = MakeThumb(10, 10, 10, 1);
  EXPECT_EQ(engine_.AddThumb(oid, thumb), VX_NOT_MUTABLE);
  EXPECT_EQ(engine_.AddImageProperties(oid, MakeRow(1, 1)), VX_NOT_MUTABLE);
  EXPECT_EQ(log_.Count("Engine not mutable"), 10u);
  EXPECT_EQ(engine_.RemoveThumb(oid), VX_NOT_MUTABLE);
  EXPECT_EQ(log_.Count("Engine not mutable"), 10u) << "RemoveThumb refuses without the line";
  EXPECT_TRUE(HasThumb(oid));
  EXPECT_EQ(File(oid).Name(), "a.jpg");
  ASSERT_EQ(engine_.Close(), VX_OK);
  EXPECT_EQ(engine_.AddFile(file, MakeBitmap(4, 4, 1), 0), VX_NOT_MUTABLE);
}

TEST_F(EngineFilesTest, RemovalsClearEveryStoreAndTolerateMissingData) {
  uint32_t sub = AddFolder("c:/pics/sub/");
  uint32_t a = AddFullFile(pics_, "a.jpg", 1);
  uint32_t b = AddFullFile(sub, "b.jpg", 2);
  uint32_t keep = AddFullFile(other_, "c.jpg", 3);
  uint32_t gone = AddFullFile(other_, "d.jpg", 4);
  ASSERT_EQ(engine_.RemoveFile(gone), VX_OK);
  EXPECT_TRUE(Gone(gone));
  EXPECT_TRUE(Data(gone).groups.empty());
  EXPECT_EQ(engine_.RemoveFile(12345), VX_NOT_FOUND);

  // A file without shape data or thumbnail still leaves the catalog.
  CVXCatFile bare(engine_.Catalog().GenerateFileOID(), "bare.jpg", pics_);
  ASSERT_EQ(engine_.Catalog().AddFile(pics_, bare), VX_OK);
  EXPECT_EQ(engine_.RemoveFile(bare.Oid()), VX_OK);
  EXPECT_TRUE(engine_.Catalog().IsUniqueFileOID(bare.Oid()));

  // A folder goes with its sub-folders and their files; one that never got a thumbnail does
  // not hold it back.
  CVXCatFile noThumb(0, "n.jpg", sub);
  ASSERT_EQ(engine_.AddFile(noThumb, MakeBitmap(4, 4, 1), 0), VX_OK);
  ASSERT_EQ(engine_.RemoveFolder(pics_), VX_OK);
  for (uint32_t oid : {a, b, noThumb.Oid()}) EXPECT_TRUE(Gone(oid)) << oid;
  CVXFolder folder;
  EXPECT_EQ(engine_.GetFolder(sub, folder), VX_NOT_FOUND);
  EXPECT_FALSE(Gone(keep));
  EXPECT_EQ(engine_.RemoveFolder(pics_), VX_NOT_FOUND);
  EXPECT_TRUE(log_.Has("Removing folder dependends"));
}

// Only the XMP deletions are transactional: when the catalog keeps the folder they come back,
// while the other stores have lost the files' data (self test's matter).
TEST_F(EngineFilesTest, RemoveFolderRollsBackXMPWhenTheCatalogKeepsTheFolder) {
  uint32_t a = AddFullFile(pics_, "a.jpg", 1);
  uint32_t b = AddFullFile(pics_, "b.jpg", 2);
  sqlite3* catalog = engine_.Catalog().BlobDB().Handle();
  ASSERT_EQ(sqlite3_exec(catalog, "PRAGMA query_only=1", nullptr, nullptr, nullptr), SQLITE_OK);
  log_.ClearCaptured();
  EXPECT_NE(engine_.RemoveFolder(pics_), VX_OK);
  EXPECT_TRUE(log_.Has("Removing folder from catalog"));
  ASSERT_EQ(sqlite3_exec(catalog, "PRAGMA query_only=0", nullptr, nullptr, nullptr), SQLITE_OK);
  for (uint32_t oid : {a, b}) {
    EXPECT_EQ(XMPPacket(oid), oid == a ? "a.jpg" : "b.jpg");
    std::vector<SFTIRecord> fti;
    ASSERT_EQ(engine_.GetXMPFTI(oid, fti), VX_OK);
    EXPECT_EQ(fti.size(), 1u);
    EXPECT_TRUE(ShapeBytes(oid).empty());
  }
  EXPECT_EQ(engine_.RemoveFolder(pics_), VX_OK);
  EXPECT_TRUE(Gone(a) && Gone(b));
}

TEST_F(EngineFilesTest, MoveFileKeepsTheOidAndReplacesATarget) {
  uint32_t a = AddFullFile(pics_, "a.jpg", 1);
  uint32_t b = AddFullFile(other_, "b.jpg", 2);
  SData data = Data(a);

  // Onto b's name without taking over: a keeps its own data, b is gone from every store.
  ASSERT_EQ(engine_.MoveFile(a, other_, "B.JPG", false), VX_OK);
  EXPECT_EQ(File(a).Properties().Folder, other_);
  EXPECT_EQ(File(a).Name(), "B.JPG");
  EXPECT_TRUE(Gone(b));
  EXPECT_EQ(Data(a), data);

  // Taking over: the moved file gets the target's properties and categories.
  uint32_t c = AddFullFile(pics_, "c.jpg", 3);
  SData target = Data(c);
  data.properties = target.properties;
  data.groups = target.groups;
  ASSERT_EQ(engine_.MoveFile(a, pics_, "c.jpg", true), VX_OK);
  EXPECT_TRUE(Gone(c));
  EXPECT_EQ(Data(a), data);

  // Within its own folder under its own name nothing is lost.
  ASSERT_EQ(engine_.MoveFile(a, pics_, "", true), VX_OK);
  EXPECT_EQ(Data(a), data);
  EXPECT_EQ(engine_.MoveFile(999, pics_, "", false), VX_NOT_FOUND);
}

TEST_F(EngineFilesTest, CopyFileCopiesEveryStoreOrTakesOverTheTarget) {
  uint32_t a = AddFullFile(pics_, "a.jpg", 1);
  SData data = Data(a);
  unsigned long copy = 0;
  ASSERT_EQ(engine_.CopyFile(a, other_, copy, "copy.jpg", false), VX_OK);
  ASSERT_NE(copy, 0u);
  EXPECT_EQ(File(copy).Name(), "copy.jpg");
  EXPECT_EQ(Data(copy), data);
  EXPECT_EQ(Data(a), data);

  // Onto an existing name, taking over: the copy gets the target's properties and categories,
  // the source's shape, thumbnail and XMP, and the target leaves every store.
  uint32_t t = AddFullFile(other_, "t.jpg", 5);
  SData target = Data(t);
  ASSERT_EQ(engine_.CopyFile(a, other_, copy, "T.jpg", true), VX_OK);
  EXPECT_TRUE(Gone(t));
  SData over = Data(copy);
  EXPECT_EQ(over.properties, target.properties);
  EXPECT_EQ(over.groups, target.groups);
  over.properties = data.properties;
  over.groups = data.groups;
  EXPECT_EQ(over, data);

  // Onto itself: the copy replaces the source, and the source's data goes with it.
  ASSERT_EQ(engine_.CopyFile(a, pics_, copy, "", false), VX_OK);
  EXPECT_TRUE(Gone(a));
  EXPECT_EQ(Data(copy), data);
}

// A copy cut short by a crash leaves data under the OID the catalog hands out next. Neither a
// new file nor the next copy takes it over.
TEST_F(EngineFilesTest, LeftoversOfAnUnfinishedCopyAreNotAdopted) {
  uint32_t a = AddFullFile(pics_, "a.jpg", 1);
  auto leaveBehind = [&](uint32_t oid) {
    SVXDBRec_3 shape = MakeShape(99);
    ASSERT_EQ(engine_.MatchStore().Set({2, oid}, &shape, sizeof shape), VX_OK);
    unsigned long key = oid;
    ASSERT_EQ(engine_.GetPropertyDatabase().AddRecord(VX_IMAGE_PROPERTIES_TABLE, key,
                                                      MakeRow(50, 2), true),
              VX_OK);
    SetXMP(oid, "stale");
  };

  uint32_t next = engine_.Catalog().Header().LastFileOid + 1;
  leaveBehind(next);
  CVXCatFile file(0, "new.jpg", pics_);
  ASSERT_EQ(engine_.AddFile(file, MakeBitmap(8, 8, 2), 2), VX_OK);
  ASSERT_EQ(file.Oid(), next);
  EXPECT_TRUE(Data(next).properties.empty());
  EXPECT_EQ(XMPPacket(next), "");

  next = engine_.Catalog().Header().LastFileOid + 1;
  leaveBehind(next);
  unsigned long copy = 0;
  ASSERT_EQ(engine_.CopyFile(a, other_, copy, "", false), VX_OK);
  ASSERT_EQ(copy, next);
  EXPECT_EQ(Data(next), Data(a));
}

TEST_F(EngineFilesTest, SetFileUpdatesTheRecordAndWithABitmapTheShape) {
  uint32_t oid = AddFile(pics_, "a.jpg", 1);
  std::vector<uint8_t> shape = ShapeBytes(oid);
  CVXCatFile file = File(oid);
  file.Properties().Size = 1234;
  ASSERT_EQ(engine_.SetFile(file), VX_OK);
  EXPECT_EQ(File(oid).Properties().Size, 1234u);

  // An empty bitmap keeps the shape data and the record as they were.
  file.Properties().Size = 99;
  CVXBitmap bitmap;
  log_.ClearCaptured();
  EXPECT_EQ(engine_.SetFile(file, &bitmap, 5), VX_NOT_FOUND);
  EXPECT_TRUE(log_.Has("Processing file in SetFile"));
  EXPECT_EQ(ShapeBytes(oid), shape);
  EXPECT_EQ(File(oid).Properties().Size, 1234u);

  bitmap = MakeBitmap(16, 16, 9);
  ASSERT_EQ(engine_.SetFile(file, &bitmap, 55), VX_OK);
  EXPECT_EQ(ShapeBytes(oid), ShapeOf(bitmap));
  EXPECT_EQ(File(oid).Properties().CRC, 55u);
  ASSERT_EQ(engine_.SetFile(file, nullptr, 66), VX_OK);
  EXPECT_EQ(File(oid).Properties().CRC, 55u) << "without a bitmap the record goes as given";

  CVXCatFile unknown(4242, "u.jpg", pics_);
  EXPECT_EQ(engine_.SetFile(unknown, &bitmap, 1), VX_NOT_FOUND);
  EXPECT_TRUE(ShapeBytes(4242).empty());
}

TEST_F(EngineFilesTest, FoldersMatchByMediumAndRenameUnderTheirOids) {
  log_.ClearCaptured();
  uint32_t again = AddFolder("C:/PICS/", "vol", "");
  EXPECT_EQ(again, pics_) << "an empty serial matches any";
  EXPECT_TRUE(log_.Has("Folder already in database. OID is " + std::to_string(pics_)));
  EXPECT_TRUE(log_.Has("  file://C:/PICS/ Media-ID: vol, Serial "));
  EXPECT_NE(AddFolder("c:/pics/", "VOL2", "1"), pics_);
  EXPECT_TRUE(log_.Has("New Folder"));

  // The files of a renamed tree keep their OIDs and answer with the new location.
  uint32_t sub = AddFolder("c:/other/sub/");
  uint32_t b = AddFile(sub, "b.jpg");
  ASSERT_EQ(engine_.RenameFolder(other_, CVXURI("c:/moved/", true), "VOL", "1"), VX_OK);
  CVXURI uri;
  ASSERT_EQ(engine_.Catalog().GetFileURI(b, uri), VX_OK);
  EXPECT_EQ(uri.AsString(), "file://c:/moved/sub/b.jpg");

  log_.ClearCaptured();
  CVXCatFile file;
  EXPECT_EQ(engine_.GetFile(99, file), VX_NOT_FOUND);
  EXPECT_TRUE(log_.Has("Err 10020, OID searched: 99"));
}

}  // namespace
