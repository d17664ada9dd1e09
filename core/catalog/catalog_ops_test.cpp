#include <gtest/gtest.h>

#include "VXMemFile.h"
#include "vxcatalog_fixture.h"

namespace {

class CatalogOps : public vxtest::CatalogFixture {
 protected:
  std::string UriOf(uint32_t folder) { return Folder(folder).URI().AsString(); }
  template <typename T>
  static std::vector<uint8_t> Bytes(const T& record) {
    CVXMemFile f;
    f << record;
    return {f.GetBuffer(), f.GetBuffer() + f.GetFileSize()};
  }
};

TEST_F(CatalogOps, TreeLinksWhateverTheOrderAndSurvivesReopen) {
  uint32_t b = AddFolder("c:\\a\\b"), c = AddFolder("c:\\a\\b\\c");
  uint32_t a = AddFolder("c:\\a");  // added after its child: ConnectChildren links it
  uint32_t other = AddFolder("c:\\a\\b", "VOL", "9999");
  EXPECT_EQ(Folder(b).ParentFolder(), a);
  EXPECT_EQ(Folder(c).ParentFolder(), b);
  EXPECT_EQ(Folder(a).Children(), std::vector<uint32_t>{b});
  EXPECT_EQ(Folder(other).ParentFolder(), 0u) << "another medium is another tree";
  std::vector<uint32_t> roots;
  Cat().GetRootFolders(roots);
  EXPECT_EQ(roots, (std::vector<uint32_t>{a, other}));
  std::vector<CVXFolder> same;
  Cat().EnumFolders(CVXURI("c:/A/B/", true), same);
  EXPECT_EQ(same.size(), 2u);
  EXPECT_EQ(Cat().LookupFolder(CVXURI("C:\\A\\B", true), "vol", ""), b);

  uint32_t f1 = AddFile(c, "one.jpg");
  AddFile(b, "two.jpg", 30, 30, 77);
  EXPECT_EQ(Folder(c).Thumbnail(), f1);
  std::vector<uint32_t> files;
  ASSERT_EQ(Cat().GetFolderFiles(a, files, true), VX_OK);
  EXPECT_EQ(files.size(), 2u);
  ASSERT_EQ(Cat().GetFolderChildren(a, files, true), VX_OK);
  EXPECT_EQ(files, (std::vector<uint32_t>{a, b, c}));
  ASSERT_EQ(Cat().GetFolderChildren(c, files, true), VX_OK);
  EXPECT_EQ(files, std::vector<uint32_t>{c});

  AddGroup("Other");
  CVXGroup g = Group(AddGroup("Sub", AddGroup("Top", 0, {f1})));
  ASSERT_EQ(g.SetExpression(Cat(), R"("RFolder@file://c:/a/b/<VOL.1234>" NOT "Other")").code,
            VX_OK);
  Store(g);

  // Every record of the three maps comes back byte for byte, under the same keys; the first
  // load only adds "@Interactive".
  auto maps = [&](uint32_t skip) {
    std::vector<std::pair<uint32_t, std::vector<uint8_t>>> all;
    for (const auto& [oid, f] : Cat().Files()) all.emplace_back(oid, Bytes(f));
    for (const auto& [oid, f] : Cat().Folders()) all.emplace_back(oid, Bytes(f));
    for (const auto& [oid, f] : Cat().Groups()) {
      if (oid != skip) all.emplace_back(oid, Bytes(f));
    }
    return all;
  };
  const auto built = maps(0);
  EXPECT_EQ(built.size(), 2u + 4u + 4u);
  Reopen();
  EXPECT_EQ(maps(Cat().GetInteractiveGroup()), built);
  const auto loaded = maps(0);
  Reopen();
  EXPECT_EQ(maps(0), loaded);
}

TEST_F(CatalogOps, LookupsAndFileSets) {
  uint32_t d = AddFolder("/pics/"), e = AddFolder("/other/", "X", "");
  uint32_t wide = AddFile(d, "IMG1.JPG", 40, 30, 5), square = AddFile(d, "sq.png", 20, 20, 5);
  uint32_t tall = AddFile(e, "tall.jpg", 10, 30, 6);
  EXPECT_EQ(Cat().LookupFile("img1.jpg", d), wide);
  EXPECT_EQ(Cat().LookupFile("img1.jpg", 999), 0u);
  CBitVector bits;
  Cat().GetFilesForOrientation(true, bits);
  EXPECT_TRUE(bits.Get(square) && bits.Get(tall) && !bits.Get(wide));
  Cat().GetFilesForOrientation(false, bits);
  EXPECT_TRUE(bits.Get(square) && bits.Get(wide) && !bits.Get(tall));
  Cat().GetFilesForCRC(5, 0, bits);
  EXPECT_EQ(bits.Count(), 2u);
  std::vector<uint32_t> found;
  Cat().LookupFile(5, "anything", "", found);
  EXPECT_EQ(found.size(), 2u) << "an empty serial ignores the medium";
  Cat().LookupFile(6, "X", "1", found);
  EXPECT_TRUE(found.empty());
  CVXURI uri;
  ASSERT_EQ(Cat().GetFileURI(tall, uri), VX_OK);
  EXPECT_EQ(uri.AsString(), "file:///other/tall.jpg");
}

TEST_F(CatalogOps, MoveAndCopyReplaceFilesInTheWay) {
  uint32_t src = AddFolder("/src/"), dst = AddFolder("/dst/");
  uint32_t a = AddFile(src, "a.jpg"), b = AddFile(src, "b.jpg"), victim = AddFile(dst, "A.JPG");

  // Within one folder, no new name: the file stays, once, at the end of the list.
  ASSERT_EQ(Cat().MoveFile(a, src, ""), VX_OK);
  EXPECT_EQ(Folder(src).Files(), (std::vector<uint32_t>{b, a}));

  ASSERT_EQ(Cat().MoveFile(a, dst, ""), VX_OK);
  CVXCatFile gone;
  EXPECT_EQ(Cat().LookupFile(victim, gone), VX_NOT_FOUND) << "the file moved onto is removed";
  EXPECT_EQ(Folder(dst).Files(), std::vector<uint32_t>{a});
  EXPECT_EQ(Folder(src).Files(), std::vector<uint32_t>{b});

  unsigned long copy = 0;
  ASSERT_EQ(Cat().CopyFile(b, dst, copy, "a.jpg"), VX_OK);
  EXPECT_GT(copy, b);
  EXPECT_EQ(Cat().LookupFile(a, gone), VX_NOT_FOUND) << "the copy replaced a.jpg";
  EXPECT_EQ(Cat().LookupFile("a.jpg", dst), copy);
  // A move to a folder that does not exist changes nothing and still succeeds.
  EXPECT_EQ(Cat().MoveFile(b, 999, "x.jpg"), VX_OK);
  EXPECT_EQ(Cat().LookupFile("b.jpg", src), b);
  Reopen();
  EXPECT_EQ(Cat().LookupFile("a.jpg", dst), copy);
  EXPECT_EQ(Folder(src).Files(), std::vector<uint32_t>{b});

  // A crash between the stores of a move can leave the file listed in both folders; moving it
  // again must not take it for the file in its way.
  CVXFolder both = Folder(dst);
  both.AddFile(b);
  ASSERT_EQ(Cat().UpdateFolder(both), VX_OK);
  ASSERT_EQ(Cat().MoveFile(b, dst, ""), VX_OK);
  EXPECT_EQ(Cat().LookupFile("b.jpg", dst), b);
  EXPECT_EQ(Folder(dst).Files(), (std::vector<uint32_t>{static_cast<uint32_t>(copy), b}));
  EXPECT_TRUE(Folder(src).Files().empty());
}

TEST_F(CatalogOps, RenameAndUpdateFiles) {
  uint32_t d = AddFolder("/pics/"), f = AddFile(d, "old.jpg");
  ASSERT_EQ(Cat().RenameFile(f, "new.jpg"), VX_OK);
  EXPECT_EQ(Cat().LookupFile("NEW.JPG", d), f);
  CVXCatFile record;
  Cat().LookupFile(f, record);
  record.Properties().Size = 1234;
  ASSERT_EQ(Cat().UpdateFile(record), VX_OK);
  record.Properties().Folder = 999;
  EXPECT_EQ(Cat().UpdateFile(record), VX_OK);
  EXPECT_TRUE(log_.Has("Updated file without folder"));
  Reopen();
  Cat().LookupFile(f, record);
  EXPECT_EQ(record.Properties().Size, 1234u);
  EXPECT_EQ(record.Properties().Folder, d);
  EXPECT_EQ(Cat().RenameFile(999, "x"), VX_NOT_FOUND);
}

TEST_F(CatalogOps, RemoveFoldersWithAndWithoutChildren) {
  uint32_t a = AddFolder("/a/"), b = AddFolder("/a/b/"), c = AddFolder("/a/b/c/");
  uint32_t f = AddFile(c, "x.jpg");
  AddFile(a, "y.jpg");
  ASSERT_EQ(Cat().RemoveFolder(b, false), VX_OK);
  EXPECT_EQ(Folder(c).ParentFolder(), b) << "children of a plain removal keep a dangling link";
  EXPECT_TRUE(Folder(a).Children().empty());
  ASSERT_EQ(Cat().RemoveFolder(a, true), VX_OK);
  EXPECT_EQ(Cat().NumberOfFolders(), 1u);
  EXPECT_EQ(Cat().NumberOfFiles(), 1u);
  // A formula that names the removed folder is emptied whole, and stored so.
  const uint32_t byC = AddGroup("ByC"), other = AddGroup("Other");
  for (const auto& [oid, text] :
       {std::pair<uint32_t, std::string>{byC, R"("@Unassigned" OR )"
                                              R"("RFolder@file:///a/b/c/<VOL.1234>")"},
        {other, R"("@Unassigned")"}}) {
    CVXGroup g = Group(oid);
    ASSERT_EQ(g.SetExpression(Cat(), text).code, VX_OK);
    Store(g);
  }
  ASSERT_EQ(Cat().RemoveFolder(c, true), VX_OK);
  CVXCatFile gone;
  EXPECT_EQ(Cat().LookupFile(f, gone), VX_NOT_FOUND);
  Reopen();
  EXPECT_EQ(Cat().NumberOfFolders(), 0u);
  EXPECT_EQ(Cat().NumberOfFiles(), 0u);
  EXPECT_TRUE(Group(byC).Infix().empty() && Group(byC).Postfix().empty());
  EXPECT_EQ(Group(other).Postfix().size(), 1u);
}

TEST_F(CatalogOps, RenameFolderMovesTreesAndMerges) {
  uint32_t a = AddFolder("/a/"), b = AddFolder("/a/b/"), c = AddFolder("/a/b/c/");
  uint32_t f = AddFile(c, "x.jpg"), z = AddFolder("/z/");

  // Only the case differs: the new spelling is stored, nothing else moves.
  ASSERT_EQ(Cat().RenameFolder(b, CVXURI("/a/B/", true), "VOL", "1234"), VX_OK);
  EXPECT_EQ(UriOf(b), "file:///a/B/");
  EXPECT_EQ(Folder(b).ParentFolder(), a);

  // A free target below another root: the tree moves with its OIDs.
  ASSERT_EQ(Cat().RenameFolder(b, CVXURI("/z/moved/", true), "VOL", "1234"), VX_OK);
  EXPECT_EQ(UriOf(b), "file:///z/moved/");
  EXPECT_EQ(UriOf(c), "file:///z/moved/c/");
  EXPECT_EQ(Folder(b).ParentFolder(), z);
  EXPECT_TRUE(Folder(a).Children().empty());
  CVXURI uri;
  ASSERT_EQ(Cat().GetFileURI(f, uri), VX_OK);
  EXPECT_EQ(uri.AsString(), "file:///z/moved/c/x.jpg");

  // Onto an existing folder: files move with their OIDs and the source goes.
  uint32_t g = AddFile(a, "y.jpg");
  ASSERT_EQ(Cat().RenameFolder(c, CVXURI("/a/", true), "VOL", "1234"), VX_OK);
  CVXFolder dummy;
  EXPECT_EQ(Cat().LookupFolder(c, dummy), VX_NOT_FOUND);
  EXPECT_EQ(Folder(a).Files(), (std::vector<uint32_t>{g, f}));
  unsigned long folder = 0;
  Cat().GetFileFolder(f, folder);
  EXPECT_EQ(folder, a);
  EXPECT_EQ(Cat().RenameFolder(999, CVXURI("/q/", true), "", ""), VX_NOT_FOUND);
}

TEST_F(CatalogOps, LoadRemapsAFolderWhoseParentDoesNotFitItsPath) {
  uint32_t ca = AddFolder("c:/a/"), da = AddFolder("d:/a/");
  // A folder stored under a parent on another drive, as a move outside the catalog leaves it.
  uint32_t oid = Cat().GenerateFolderOID();
  CVXFolder stray(CVXURI("c:/a/b/", true), oid, da);
  stray.MediaID() = "VOL";
  stray.MediaSerial() = "1234";
  ASSERT_EQ(Cat().AddFolder(stray), VX_OK);
  EXPECT_EQ(Folder(oid).ParentFolder(), da);
  Reopen();
  EXPECT_TRUE(log_.Has("Mapped from"));
  EXPECT_EQ(Folder(oid).ParentFolder(), ca);
  EXPECT_EQ(Folder(ca).Children(), std::vector<uint32_t>{oid});
  EXPECT_TRUE(Folder(da).Children().empty());
}

}  // namespace
