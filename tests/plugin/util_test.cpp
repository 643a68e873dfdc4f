#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "common/common.h"
#include "plugin/plugin.h"

namespace maruseeker {
namespace {

TEST(Util, PathsAsTexts) {
  EXPECT_EQ(Basename("/a/b.c"), "b.c");
  EXPECT_EQ(Basename("b"), "b");
  EXPECT_EQ(Basename("/a/"), "");
  EXPECT_EQ(Dirname("/a/b"), "/a");
  EXPECT_EQ(Dirname("/a"), "");
  EXPECT_EQ(Dirname("a"), "a");
  EXPECT_EQ(GetFileExtension("/a.d/b", false), "");
  EXPECT_EQ(GetFileExtension("/a/B.TAR.GZ", false), "GZ");
  EXPECT_EQ(GetFileExtension("/a/B.TAR.GZ", true), "gz");
  EXPECT_EQ(GetFileExtension(".profile", false), "profile");
  EXPECT_TRUE(StringStartWith("abc", "ab"));
  EXPECT_TRUE(StringStartWith("abc", ""));
  EXPECT_FALSE(StringStartWith("xab", "ab"));
  EXPECT_EQ(LTrim(" \t a "), "a ");
  EXPECT_EQ(RTrim(" a \n"), " a");
  EXPECT_EQ(Trim(" \v "), "");
  EXPECT_EQ(ToLower("AbÄ"), "abÄ");
}

TEST(Util, Files) {
  char folder[] = "/tmp/maru_util.XXXXXX";
  ASSERT_NE(mkdtemp(folder), nullptr);
  ASSERT_EQ(chdir(folder), 0);
  const std::string here = folder;
  WriteFile(here + "/file", "text", 0640);
  mkdir("dir", 0755);
  ASSERT_EQ(symlink("file", "to_file"), 0);
  ASSERT_EQ(symlink((here + "/dir").c_str(), "to_dir"), 0);
  ASSERT_EQ(symlink("../file", "dir/relative"), 0);
  ASSERT_EQ(symlink("dir", "dir/dir"), 0);
  ASSERT_EQ(symlink("loop", "loop"), 0);

  EXPECT_TRUE(IsFileExist("file"));
  EXPECT_FALSE(IsFileExist("to_file"));
  EXPECT_FALSE(IsFileExist("dir"));
  EXPECT_TRUE(IsDirExist("dir", false));
  EXPECT_FALSE(IsDirExist("to_dir", false));
  EXPECT_TRUE(IsDirExist("to_dir", true));
  EXPECT_FALSE(IsDirExist("to_file", true));
  // The text of a link is taken from the current directory.
  EXPECT_TRUE(IsDirExist(here + "/dir/dir", true));
  EXPECT_FALSE(IsDirExist("loop", true));

  dirent entry = {};
  entry.d_type = DT_DIR;
  EXPECT_TRUE(IsDirentDir(&entry, here + "/file"));
  for (const unsigned char type : {DT_REG, DT_LNK, DT_UNKNOWN}) {
    entry.d_type = type;
    EXPECT_FALSE(IsDirentDir(&entry, here + "/dir"));
  }

  EXPECT_EQ(RealPath("dir/../to_file"), RealPath(here) + "/file");
  EXPECT_EQ(RealPath("none"), "");
  EXPECT_TRUE(CheckACLPerm("file", 4));
  EXPECT_TRUE(CheckACLPerm("file", 4 | 1));
  EXPECT_FALSE(CheckACLPerm("file", 1));
  EXPECT_FALSE(CheckACLPerm("none", 7));
  EXPECT_TRUE(IsMountPoint("/"));
  EXPECT_FALSE(IsMountPoint("dir"));
  EXPECT_FALSE(IsMountPoint("none"));

  WriteFile(here + "/old", "old");
  EXPECT_TRUE(CPFile("file", "old"));
  EXPECT_EQ(std::filesystem::file_size("old"), 4u);
  EXPECT_TRUE(MVFile("old", "new"));
  EXPECT_FALSE(IsFileExist("old"));
  EXPECT_FALSE(CPFile("none", "new"));
  EXPECT_TRUE(IsFileExist("new"));
  EXPECT_TRUE(Unlink("new"));
  EXPECT_TRUE(Unlink("new"));
  EXPECT_FALSE(Unlink("dir"));
  EXPECT_EQ(chdir("/"), 0);
  std::filesystem::remove_all(folder);
}

TEST(Util, Locks) {
  Mutex mutex;
  {
    const LockMutex lock(mutex);
    EXPECT_FALSE(mutex.TryLock());
  }
  EXPECT_TRUE(mutex.TryLock());
  EXPECT_TRUE(mutex.Unlock());
  EXPECT_EQ(&sdk::SDKMutex(), &sdk::SDKMutex());
}

}  // namespace
}  // namespace maruseeker
