#include "platform/file.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/xattr.h>

#include "tests/support/support.h"

namespace {

int Copy(const std::string& from, const std::string& to, bool overwrite, bool move) {
  const MARUCOPYARG options{overwrite, move};
  errno = 0;
  return MARUFileCopy(from.c_str(), to.c_str(), &options, 1);
}

TEST(FileCopy, TakesContentAndStatus) {
  const TempFolder folder;
  const std::string content(3'000'000, 'c');
  const std::string source = folder.Write("source", content);
  chmod(source.c_str(), 04640);
  const bool attributes = setxattr(source.c_str(), "user.note", "n", 1, 0) == 0;
  const timespec times[] = {{1000, 0}, {2000, 0}};
  utimensat(AT_FDCWD, source.c_str(), times, 0);
  ASSERT_EQ(Copy(source, folder / "copy", true, false), 0);
  struct stat status;
  ASSERT_EQ(stat((folder / "copy").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0640u);
  EXPECT_EQ(status.st_mtime, 2000);
  EXPECT_TRUE(FileText(folder / "copy") == content);
  char note = 0;
  EXPECT_EQ(getxattr((folder / "copy").c_str(), "user.note", &note, 1), attributes ? 1 : -1);
  // Files that say they are empty until they are read.
  ASSERT_EQ(Copy("/proc/self/status", folder / "status", true, false), 0);
  EXPECT_NE(FileText(folder / "status"), "");
}

TEST(FileCopy, ReplacesOnlyWhenTold) {
  const TempFolder folder;
  const std::string source = folder.Write("source", "new");
  const std::string target = folder.Write("target", "old");
  for (const bool move : {false, true}) {
    EXPECT_EQ(Copy(source, target, false, move), -1);
    EXPECT_EQ(errno, EEXIST);
    EXPECT_EQ(FileText(target), "old");
  }
  mkdir((folder / "folder").c_str(), 0755);
  EXPECT_EQ(Copy(source, folder / "folder", true, false), -1);
  EXPECT_EQ(Copy(folder / "folder", target, true, false), -1);
  EXPECT_EQ(Copy(folder / "folder", folder / "x", true, true), -1);
  EXPECT_EQ(Copy(folder / "none", target, true, false), -1);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(FileText(target), "old");
  ASSERT_EQ(Copy(source, target, true, true), 0);
  EXPECT_EQ(FileText(target), "new");
  EXPECT_FALSE(std::filesystem::exists(source));
  // Nothing else was left behind.
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(folder / ""), {}), 2);
}

TEST(FileCopy, MovesFromOneFileSystemToAnother) {
  const TempFolder folder;
  const TempFolder other;
  if (unshare(CLONE_NEWNS) != 0 || mount("", "/", "", MS_REC | MS_PRIVATE, nullptr) != 0 ||
      mount("test", (other / "").c_str(), "tmpfs", 0, "") != 0) {
    GTEST_SKIP() << "needs a mount namespace";
  }
  const std::string source = folder.Write("source", "text");
  EXPECT_EQ(Copy(source, other / "target", false, true), 0);
  EXPECT_EQ(FileText(other / "target"), "text");
  EXPECT_FALSE(std::filesystem::exists(source));

  // A bind mount within one file system is a mount point too.
  mkdir((folder / "a").c_str(), 0755);
  mkdir((folder / "b").c_str(), 0755);
  EXPECT_EQ(symlink((folder / "a").c_str(), (folder / "link").c_str()), 0);
  EXPECT_EQ(MARUFSDirIsMntPoint((folder / "a").c_str()), 0);
  ASSERT_EQ(mount((folder / "b").c_str(), (folder / "a").c_str(), "", MS_BIND, nullptr), 0);
  EXPECT_EQ(MARUFSDirIsMntPoint((folder / "a").c_str()), 1);
  EXPECT_EQ(MARUFSDirIsMntPoint((folder / "link").c_str()), 0);
  EXPECT_EQ(MARUFSDirIsMntPoint((folder / "none").c_str()), -1);
  umount((folder / "a").c_str());
  umount((other / "").c_str());
}

}  // namespace
