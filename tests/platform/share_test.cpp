#include "platform/share.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/account.h"
#include "platform/acl.h"
#include "platform/file_index.h"
#include "platform/process.h"
#include "system/client_address.h"
#include "system/share_table.h"
#include "tests/support/support.h"

namespace {

using maru::ShareTable;
using testing::ElementsAre;

class Shares : public testing::Test {
 protected:
  void SetUp() override {
    folder_.Write("smb.conf",
                  "[docs]\npath = /mnt/docs\nmaruseeker:deny = read\nvalid users = bob\n"
                  "[homes]\npath = /mnt/homes/%S\n[photo]\npath = /mnt/photo\n"
                  "hide unreadable = yes\nvfs objects = recycle\n");
    Configure(folder_, "samba_config_canonical = yes\n");
    ASSERT_EQ(ShareTable::Current()->Error(), "");
  }
  TempFolder folder_;
};

TEST_F(Shares, AnswerWhatTheSettingsSay) {
  MARUSHARE* share = nullptr;
  EXPECT_EQ(MARUShareGet("Photo", &share), -1);
  EXPECT_EQ(share, nullptr);
  EXPECT_EQ(MLIBCErrGet(), kErrNotFound);
  ASSERT_EQ(MARUShareGet("photo", &share), 0);
  EXPECT_STREQ(share->szPath, "/volume1/photo");
  int value = -1;
  EXPECT_EQ(MLIBShareHideUnreadableGet(share, &value), 0);
  EXPECT_EQ(value, 1);
  EXPECT_EQ(MLIBShareRecycleStatusGet(share, &value), 0);
  EXPECT_EQ(value, 1);
  MARUShareFree(share);
  ASSERT_EQ(MARUShareGet("docs", &share), 0);
  EXPECT_EQ(share->fFTPPriv, 4u);
  MARUShareFree(share);
  MARUShareFree(nullptr);

  MLIBCSzList* names = MLIBCSzListAlloc(BUFSIZ);
  EXPECT_EQ(MLIBShareEnum(&names, [](const MARUSHARE* s) { return s->fFTPPriv ? 1 : 0; }), 2);
  EXPECT_STREQ(MLIBCSzListGet(names, 0), "homes");
  EXPECT_STREQ(MLIBCSzListGet(names, 1), "photo");
  MLIBCSzListFree(names);
}

TEST_F(Shares, AreOpenToTheirAddressesOnly) {
  NEEDS_ACCOUNTS();
  folder_.Write("smb.conf", "[docs]\npath = /mnt/docs\nhosts deny = 192.0.2.0/24\n");
  MARUSHARE* share = nullptr;
  ASSERT_EQ(MARUShareGet("docs", &share), 0);
  for (const auto& [address, privilege] :
       {std::pair("127.0.0.1", kSharePrivReadOnly), std::pair("192.0.2.7", kSharePrivNone),
        std::pair("198.51.100.1", kSharePrivReadOnly), std::pair("unknown", kSharePrivNone)}) {
    maru::WorkFor(maru::ClientAddress(address));
    EXPECT_EQ(MARUShareUserPrivGet("alice", share), privilege) << address;
    EXPECT_EQ(MARUShareUserPrivGet("carol", share) == kSharePrivNone, privilege == kSharePrivNone)
        << "an administrator, too";
    unsigned int bits = 4;
    EXPECT_EQ(MARUACLPermGet("/volume1/docs", &bits) == 0 && bits == 0, privilege == kSharePrivNone)
        << address;
  }
  maru::WorkFor(maru::ClientAddress::OfThisMachine());
  MARUShareFree(share);
}

TEST_F(Shares, AdmitAdministratorsEverywhere) {
  NEEDS_ACCOUNTS();
  MARUSHARE* share = nullptr;
  ASSERT_EQ(MARUShareGet("docs", &share), 0);
  EXPECT_EQ(MARUShareUserPrivGet("carol", share), kSharePrivReadWrite);
  EXPECT_EQ(MARUShareUserPrivGet("bob", share), kSharePrivReadOnly);
  EXPECT_EQ(MARUShareUserPrivGet("alice", share), kSharePrivNone);
  EXPECT_EQ(MARUShareUserPrivGet("no such user", share), kSharePrivNone);
  MARUShareFree(share);
  char path[64];
  ASSERT_EQ(MARUServiceHomePathGet("alice", path, sizeof(path)), 20);
  EXPECT_STREQ(path, "/volume1/homes/alice");
  EXPECT_EQ(MARUServiceHomePathGet("alice", path, 20), -1);
  EXPECT_EQ(MARUServiceHomePathGet("no such user", path, sizeof(path)), -1);
  EXPECT_TRUE(MARUServiceUserHomeIsEnabled(0, "alice"));
}

TEST_F(Shares, FindTheirPaths) {
  char name[16];
  char path[32];
  const auto find = [&](const char* full) {
    return MARUShareNamePathGet(full, name, sizeof(name), path, sizeof(path));
  };
  ASSERT_EQ(find("/volume1/photo/a/b.jpg"), 0);
  EXPECT_STREQ(name, "photo");
  EXPECT_STREQ(path, "/volume1/photo");
  ASSERT_EQ(find("/volume1/photo"), 0);
  for (const char* bad : {"/volume1", "/volume1/", "/volume1/none/a", "/volume2/photo/a", "photo",
                          "", "/volume1/photo/../docs/a", "/volume1/../volume1/photo",
                          "/volume10/photo", "/volume1//photo"}) {
    EXPECT_EQ(find(bad), -1) << bad;
  }
  EXPECT_EQ(MARUShareNamePathGet("/volume1/photo", name, 5, path, sizeof(path)), -1);
  EXPECT_EQ(MARUShareNamePathGet("/volume1/photo", name, 6, path, 14), -1);

  std::string share;
  std::string rest;
  using maruseeker::fileindex::GetShareNamePathByFullPath;
  ASSERT_EQ(GetShareNamePathByFullPath(share, rest, "/volume1/photo/a/b.jpg"), 0);
  EXPECT_EQ(share + " " + rest, "photo /photo/a/b.jpg");
  EXPECT_EQ(GetShareNamePathByFullPath(share, rest, "/volume1/none/b"), -1);
  EXPECT_EQ(share, "none");
  EXPECT_EQ(GetShareNamePathByFullPath(share, rest, "/volume1"), -1);
  EXPECT_EQ(share, "");
}

TEST_F(Shares, KnowTheirIndexes) {
  char path[256];
  ASSERT_EQ(FILEIDXDBPathCompose("/volume1/photo", path, sizeof(path)), 0);
  EXPECT_EQ(path, folder_ / "state/index/fileindex_photo");
  EXPECT_EQ(FILEIDXDBPathCompose("/volume1/photo/a", path, sizeof(path)), -1);
  EXPECT_EQ(FILEIDXQueuePathCompose("/volume1/photo", path, 8), -1);
  EXPECT_EQ(FILEIDXGetIndexID("../x", path, sizeof(path)), -1);
  std::filesystem::create_directories(folder_ / "state/index/fileindex_photo");
  std::filesystem::create_directories(folder_ / "state/index/fileindex_gone");
  folder_.Write("state/index/fileindex_docs", "no folder");
  EXPECT_THAT(maruseeker::fileindex::FolderMgr().GetIndexedShares(), ElementsAre("photo"));
}

TEST_F(Shares, KnowWhatFits) {
  EXPECT_NE(MARUQuotaIsEnough(0, "/tmp", 1, 0), 0);
  EXPECT_EQ(MARUQuotaIsEnough(0, "/tmp", ~0ull, 0), 0);
  EXPECT_EQ(MLIBCErrGet(), kErrNoSpace);
  EXPECT_EQ(MARUQuotaIsEnough(0, "/no/such/path", 1, 0), 0);
  EXPECT_EQ(MLIBCErrGet(), kErrNotFound);
}

}  // namespace
