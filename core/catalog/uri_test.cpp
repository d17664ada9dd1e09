#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "VXURI.h"
#include "vxtest.h"

namespace {

struct Decomposition {
  const char* in;
  bool folder;
  const char* text;
  CVXURI::EType type;
  const char *windows, *uriPath, *server, *path, *fileName, *namePart, *extPart, *lastName;
};

TEST(URI, SetNormalisesAndDecomposes) {
  const Decomposition cases[] = {
      {"c:\\pics\\a.jpg", false, "file://c:/pics/a.jpg", CVXURI::File, "c:\\pics\\a.jpg",
       "file://c:/pics/", "c:", "c:/pics/", "a.jpg", "a", ".jpg", ""},
      {"/photos/a.jpg", false, "file:///photos/a.jpg", CVXURI::File, "\\photos\\a.jpg",
       "file:///photos/", "", "/photos/", "a.jpg", "a", ".jpg", ""},
      {"\\\\srv\\share\\x.jpg", false, "file:////srv/share/x.jpg", CVXURI::File,
       "\\\\srv\\share\\x.jpg", "file:////srv/share/", "//srv/share", "//srv/share/", "x.jpg", "x",
       ".jpg", ""},
      // No slash: no protocol is added, and there is no folder part.
      {"photo.jpg", false, "photo.jpg", CVXURI::File, "photo.jpg", "", "", "", "photo.jpg", "photo",
       ".jpg", ""},
      {"", true, "", CVXURI::File, "", "", "", "", "", "", "", ""},
      // A drive root keeps its slash, also as a last name.
      {"c:/", true, "file://c:/", CVXURI::File, "c:\\", "file://c:/", "c:", "c:/", "", "", "",
       "c:/"},
      {"c:\\pics", true, "file://c:/pics/", CVXURI::File, "c:\\pics\\", "file://c:/pics/",
       "c:", "c:/pics/", "", "", "", "pics"},
      {"pics", true, "pics/", CVXURI::File, "pics\\", "pics/", "", "", "", "", "", "pics"},
      {"HTTP://example.com/dir/a.png", false, "HTTP://example.com/dir/a.png", CVXURI::Http,
       "example.com\\dir\\a.png", "HTTP://example.com/dir/", "example.com", "/dir/", "a.png", "a",
       ".png", ""},
      {"ftp://host", false, "ftp://host", CVXURI::Ftp, "host", "ftp:/", "", "", "host", "", "", ""},
      {"File://D:/X.JPG", false, "File://D:/X.JPG", CVXURI::File, "D:\\X.JPG", "File://D:/",
       "D:", "D:/", "X.JPG", "X", ".JPG", ""},
      // An unknown scheme has no server or path; a name without extension under a dotted
      // folder yields fragments of the whole text.
      {"smb://srv/a.b/readme", false, "smb://srv/a.b/readme", CVXURI::Other, "srv\\a.b\\readme",
       "smb://srv/a.b/", "", "", "readme", "smb://srv/a", ".b/readme", ""},
      // A file text ending in a separator: FileName strips it first.
      {"d:\\x\\", false, "file://d:/x/", CVXURI::File, "d:\\x\\", "file://d:/x/", "d:", "d:/x/",
       "x", "", "", ""},
      {"mailto:x", false, "mailto:x", CVXURI::File, "mailto:x", "", "ma", "", "mailto:x", "", "",
       ""},
  };
  for (const Decomposition& c : cases) {
    SCOPED_TRACE(c.in);
    CVXURI uri(c.in, c.folder);
    EXPECT_EQ(uri.AsString(), c.text);
    EXPECT_EQ(uri.Type(), c.type);
    EXPECT_EQ(uri.IsFolder(), c.folder);
    EXPECT_EQ(uri.NoProtocol(), CVXURI::StripProtocol(c.text));
    EXPECT_EQ(uri.WindowsPath(), c.windows);
    EXPECT_EQ(uri.URIPath(), c.uriPath);
    EXPECT_EQ(uri.Server(), c.server);
    EXPECT_EQ(uri.Path(), c.path);
    EXPECT_EQ(uri.FileName(), c.fileName);
    EXPECT_EQ(uri.NamePart(), c.namePart);
    EXPECT_EQ(uri.ExtPart(), c.extPart);
    EXPECT_EQ(uri.LastName(), c.lastName);
  }
  // Short roots keep their separator.
  EXPECT_EQ(CVXURI::StripTrailer("c:/"), "c:/");
  EXPECT_EQ(CVXURI::StripTrailer("abc\\"), "abc");
  EXPECT_EQ(CVXURI::StripProtocol("a://b://c"), "b://c");
}

TEST(URI, NamesLongerThan255BytesAreCutBeforeTheExtensionIsFound) {
  auto ext = [](size_t n) { return CVXURI("c:/" + std::string(n, 'n') + ".jpg", false); };
  EXPECT_EQ(ext(251).NamePart(), std::string(251, 'n'));  // 255 bytes: whole name
  EXPECT_EQ(ext(251).ExtPart(), ".jpg");
  EXPECT_EQ(ext(252).ExtPart(), ".jp");  // the cut takes the "g"
  EXPECT_EQ(ext(300).NamePart(), "file://c:/" + std::string(300, 'n'));
  EXPECT_EQ(ext(300).ExtPart(), ".jpg");
}

struct Ordering {
  const char* a;
  bool aFolder;
  const char* b;
  bool bFolder, equal, aLess, bLess;
};

TEST(URI, ComparisonIgnoresCaseAndTypeButNotTheFolderFlag) {
  const Ordering cases[] = {
      {"c:/a", false, "C:/A", false, true, false, false},
      {"c:\\x", false, "file://c:/x", false, true, false, false},
      {"Müller.JPG", false, "MÜLLER.jpg", false, true, false, false},
      {"c:/a.jpg", false, "c:/B.jpg", false, false, true, false},
      // Folder against file: never equal, each less than the other.
      {"c:/a/", false, "c:/a/", true, false, true, true},
      {"ftp://x/", false, "FTP://X/", false, true, false, false},
  };
  for (const Ordering& c : cases) {
    SCOPED_TRACE(std::string(c.a) + " / " + c.b);
    CVXURI a(c.a, c.aFolder), b(c.b, c.bFolder);
    EXPECT_EQ(a == b, c.equal);
    EXPECT_EQ(b == a, c.equal);
    EXPECT_EQ(a < b, c.aLess);
    EXPECT_EQ(b < a, c.bLess);
  }
  CVXURI a("c:/a", false);
  EXPECT_TRUE(a < std::string("FILE://C:/B"));
  EXPECT_FALSE(a < std::string("FILE://C:/A"));
}

// Restores the working directory that a test changes.
struct InDirectory {
  explicit InDirectory(const std::filesystem::path& dir) : old(std::filesystem::current_path()) {
    std::filesystem::current_path(dir);
  }
  ~InDirectory() { std::filesystem::current_path(old); }
  std::filesystem::path old;
};

TEST(URI, IsLocalSearchesTheStoredTextProtocolIncluded) {
  vxtest::TempDir dir;
  vxtest::WriteFile(dir / "a.jpg", "x");
  std::filesystem::create_directory(dir / "sub");
  InDirectory in(dir.path());
  EXPECT_TRUE(CVXURI("a.jpg", false).IsLocal());
  EXPECT_TRUE(CVXURI("A.JPG", false).IsLocal());
  EXPECT_TRUE(CVXURI("a", false).IsLocal());  // "a*.*"
  EXPECT_FALSE(CVXURI("b.jpg", false).IsLocal());
  EXPECT_TRUE(CVXURI("sub", true).IsLocal());
  EXPECT_FALSE(CVXURI("nosub", true).IsLocal());
  // With its protocol the text is no path that exists.
  EXPECT_FALSE(CVXURI(dir / "a.jpg", false).IsLocal());
  EXPECT_FALSE(CVXURI("http://localhost/a.jpg", false).IsLocal());
}

}  // namespace
