#include "platform/acl.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include "platform/account.h"
#include "system/share_table.h"
#include "tests/support/support.h"

namespace {

/// A share of the sandbox at its place for users: /volume1/NAME in this process's own namespace.
class Volume : public testing::Test {
 protected:
  void SetUp() override {
    NEEDS_ACCOUNTS();
    if (unshare(CLONE_NEWNS) != 0 || mount("", "/", "", MS_REC | MS_PRIVATE, nullptr) != 0) {
      GTEST_SKIP() << "needs a mount namespace";
    }
    mkdir("/volume1", 0755);
    ASSERT_EQ(mount("test", "/volume1", "tmpfs", 0, "mode=0700"), 0);
    mkdir("/volume1/photo", 0755);
    mkdir((folder_ / "bobs").c_str(), 0700);
    EXPECT_EQ(chown((folder_ / "bobs").c_str(), 60002, 60002), 0);
    folder_.Write("smb.conf",
                  "[photo]\n\tpath = /srv\n[gone]\n\tpath = /gone\n[forced]\n\tpath = " +
                      (folder_ / "bobs/in") +
                      "\n\tforce user = bob\n\tveto files = /*.bak/\n[closed]\n\tpath = " +
                      (folder_ / "bobs/in") + "\n[bobs]\n\tpath = /srv\n\tvalid users = bob\n");
    for (const std::string share : {"forced", "closed", "bobs", "bobs/a"}) {
      mkdir(("/volume1/" + share).c_str(), 0755);
    }
    Configure(folder_, "samba_config_canonical = yes\n");
  }
  void TearDown() override { umount("/volume1"); }

  /// Bits, or -errno.
  static int Bits(const char* user, const std::string& path) {
    MLIBCSzList* groups = MLIBGroupInfoListGet(user, true);
    int bits = -1;
    errno = 0;
    if (MARUACLPermCalc(user, groups, path.c_str(), &bits) != 0) bits = -errno;
    MLIBCSzListFree(groups);
    return bits;
  }

  TempFolder folder_;
};

TEST_F(Volume, EveryFolderOnTheWayCounts) {
  // The volume itself is closed to all, which does not matter: the way begins at the share.
  mkdir("/volume1/photo/a", 0755);
  mkdir("/volume1/photo/a/b", 0750);
  std::ofstream("/volume1/photo/a/b/c.jpg") << "x";
  chmod("/volume1/photo/a/b/c.jpg", 0644);
  ASSERT_EQ(chown("/volume1/photo/a/b", 0, 60101), 0);
  EXPECT_EQ(Bits("alice", "/volume1/photo/a/b/c.jpg"), 4);
  EXPECT_EQ(Bits("bob", "/volume1/photo/a/b/c.jpg"), 0);
  EXPECT_EQ(Bits("bob", "/volume1/photo/a/b"), 0);
  EXPECT_EQ(Bits("bob", "/volume1/photo//a/./"), 5);
  EXPECT_EQ(Bits("carol", "/volume1/photo/a/b/c.jpg"), 7);  // an administrator
  chmod("/volume1/photo", 0700);
  EXPECT_EQ(Bits("alice", "/volume1/photo/a/b/c.jpg"), 0);
  EXPECT_EQ(Bits("alice", "/volume1/photo"), 0);
}

TEST_F(Volume, ShareRulesPutOthersInTheUsersPlace) {
  for (const std::string file : {"a.txt", "a.bak"}) {
    std::ofstream("/volume1/forced/" + file) << "x";
    ASSERT_EQ(chown(("/volume1/forced/" + file).c_str(), 60002, 60002), 0);
    chmod(("/volume1/forced/" + file).c_str(), 0640);
  }
  chmod("/volume1", 0755);
  const auto expect_all = [] {
    EXPECT_EQ(Bits("alice", "/volume1/forced/a.txt"), 6);
    EXPECT_EQ(Bits("alice", "/volume1/forced/a.bak"), 0);
    EXPECT_EQ(Bits("alice", "/volume1/forced/none"), -ENOENT);
    EXPECT_EQ(Bits("alice", "/volume1/closed"), 0);  // behind a folder that is bob's alone
    EXPECT_EQ(Bits("alice", "/volume1/bobs/a"), 5);  // whom the share admits is asked elsewhere
  };
  expect_all();
  EXPECT_EQ(
      StatusOfChild([&] {
        maru::ShareTable::Current();
        ASSERT_TRUE(ResetCredentialsByName("alice", true));
        expect_all();
        const std::pair<const char*, unsigned int> had[] = {
            {"forced/a.txt", 6}, {"forced/a.bak", 0}, {"closed", 0}, {"bobs/a", 0}, {"photo", 5}};
        for (const auto& [path, expected] : had) {
          unsigned int bits = 7;
          EXPECT_EQ(MARUACLPermGet((std::string("/volume1/") + path).c_str(), &bits), 0);
          EXPECT_EQ(bits, expected) << path;
        }
        EXPECT_EQ(geteuid(), 60001u);
      }),
      0);
}

TEST_F(Volume, NothingLeadsOutOfTheShare) {
  EXPECT_EQ(symlink("/etc", "/volume1/photo/out"), 0);
  EXPECT_EQ(symlink("/etc/passwd", "/volume1/photo/file"), 0);
  EXPECT_EQ(Bits("alice", "/volume1/photo/file"), 0);
  EXPECT_EQ(Bits("alice", "/volume1/photo/out/passwd"), 0);
  EXPECT_EQ(Bits("alice", "/volume1/photo/../../etc/passwd"), -ENOENT);
  EXPECT_EQ(Bits("alice", "/etc/passwd"), -ENOENT);
  EXPECT_EQ(Bits("alice", "/volume1"), -ENOENT);
  EXPECT_EQ(Bits("alice", "/volume1/unknown/x"), -ENOENT);
  EXPECT_EQ(Bits("alice", "/volume1/gone"), -ENOENT);
  EXPECT_EQ(Bits("alice", "/volume1/photo/none"), -ENOENT);
  EXPECT_EQ(Bits("nobody at all", "/volume1/photo"), -ENOENT);
}

TEST_F(Volume, WhatTheCallerCannotReachHasNoBits) {
  mkdir("/volume1/photo/bobs", 0700);
  mkdir("/volume1/photo/bobs/deep", 0755);
  ASSERT_EQ(chown("/volume1/photo/bobs", 60002, 60002), 0);
  chmod("/volume1", 0755);
  EXPECT_EQ(Bits("bob", "/volume1/photo/bobs/deep"), 5);
  EXPECT_EQ(StatusOfChild([] {
              maru::ShareTable::Current();
              ASSERT_TRUE(ResetCredentialsByName("alice", true));
              EXPECT_EQ(Bits("bob", "/volume1/photo/bobs/deep"), 0);
              EXPECT_EQ(Bits("alice", "/volume1/photo"), 5);
              unsigned int bits = 7;
              EXPECT_EQ(MARUACLPermGet("/volume1/photo/bobs/deep", &bits), -1);
              EXPECT_EQ(errno, EACCES);
              errno = 0;
              EXPECT_EQ(MARUACLPermGet("/volume1/photo/bobs", &bits), 0);
              EXPECT_EQ(bits, 0u);
              const std::pair<unsigned int, unsigned int> asked_and_had[] = {
                  {7, 5}, {5, 5}, {3, 1}, {2, 0}};
              for (const auto& [asked, had] : asked_and_had) {
                bits = asked;
                EXPECT_EQ(MARUACLPermGet("/volume1/photo", &bits), 0);
                EXPECT_EQ(bits, had);
              }
              EXPECT_EQ(errno, 0);
            }),
            0);
}

}  // namespace
