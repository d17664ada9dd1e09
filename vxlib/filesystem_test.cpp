#include "VXFileSystem.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>

namespace {

struct Split {
  std::string drive, dir, name, ext;
  bool operator==(const Split&) const = default;
};

Split SplitOf(const std::string& path) {
  Split s;
  CVXFileSystem::SplitPath(path, &s.drive, &s.dir, &s.name, &s.ext);
  EXPECT_EQ(s.drive + s.dir + s.name + s.ext, path);
  return s;
}

TEST(FileSystem, SplitPathOnWindowsPosixAndUncForms) {
  EXPECT_EQ(SplitOf("c:\\pics\\a.jpg"), (Split{"c:", "\\pics\\", "a", ".jpg"}));
  EXPECT_EQ(SplitOf("/photos/a.jpg"), (Split{"", "/photos/", "a", ".jpg"}));
  EXPECT_EQ(SplitOf("\\\\server\\share\\x"), (Split{"", "\\\\server\\share\\", "x", ""}));
  EXPECT_EQ(SplitOf("C:a.b.tar"), (Split{"C:", "", "a.b", ".tar"}));
  EXPECT_EQ(SplitOf("c:/mixed\\dirs/f"), (Split{"c:", "/mixed\\dirs/", "f", ""}));
  EXPECT_EQ(SplitOf("dir.d/file"), (Split{"", "dir.d/", "file", ""}));
  EXPECT_EQ(SplitOf("/home/u/.profile"), (Split{"", "/home/u/", ".profile", ""}));
  EXPECT_EQ(SplitOf("a."), (Split{"", "", "a", "."}));
  EXPECT_EQ(SplitOf("1:x"), (Split{"", "", "1:x", ""}));
  EXPECT_EQ(SplitOf(""), Split{});
  EXPECT_EQ(SplitOf("c:\\"), (Split{"c:", "\\", "", ""}));

  std::string name;
  CVXFileSystem::SplitPath("/a/b.c", nullptr, nullptr, &name, nullptr);
  EXPECT_EQ(name, "b");
}

TEST(FileSystem, ChangeExtReplacesOnlyTheLastComponentsExtension) {
  EXPECT_EQ(CVXFileSystem::ChangeExt("c:\\db\\photos.vxc", ".vxt"), "c:\\db\\photos.vxt");
  EXPECT_EQ(CVXFileSystem::ChangeExt("/db.d/photos", ".vxc"), "/db.d/photos.vxc");
  EXPECT_EQ(CVXFileSystem::ChangeExt("c:\\db.x\\photos", ".vxp"), "c:\\db.x\\photos.vxp");
  EXPECT_EQ(CVXFileSystem::ChangeExt("a.b.c", ".d"), "a.b.d");
  EXPECT_EQ(CVXFileSystem::ChangeExt("a.jpg", "png"), "a.png");
  EXPECT_EQ(CVXFileSystem::ChangeExt("a.jpg", ""), "a");
  EXPECT_EQ(CVXFileSystem::ChangeExt("/u/.cfg", ".bak"), "/u/.cfg.bak");
  EXPECT_EQ(CVXFileSystem::ChangeExt("", ".vxc"), ".vxc");
}

TEST(FileSystem, FreeDiskSpaceAsksTheNearestExistingDirectory) {
  auto tmp = std::filesystem::temp_directory_path();
  uint64_t direct = 0, below = 0, cwd = 0;
  ASSERT_TRUE(CVXFileSystem::GetFreeDiskSpace(tmp.string(), direct));
  EXPECT_GT(direct, 0u);
  auto missing = tmp / ("vxlib_none_" + std::to_string(::getpid())) / "deeper" / "db.vxc";
  ASSERT_TRUE(CVXFileSystem::GetFreeDiskSpace(missing.string(), below));
  // Same file system, asked moments apart: equal up to what other processes wrote meanwhile.
  EXPECT_NEAR(static_cast<double>(below), static_cast<double>(direct), 64.0 * 1024 * 1024);
  EXPECT_TRUE(CVXFileSystem::GetFreeDiskSpace("", cwd));
  EXPECT_TRUE(CVXFileSystem::GetFreeDiskSpace("c:\\not\\posix.vxc", cwd));
  EXPECT_GT(cwd, 0u);
}

}  // namespace
