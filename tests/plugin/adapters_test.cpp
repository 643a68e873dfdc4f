#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include "common/common.h"
#include "common/sdk/permission.h"
#include "common/sdk/share.h"
#include "common/sdk/share_path.h"
#include "common/sdk/user.h"
#include "plugin/plugin.h"

namespace {

using maruseeker::Error;
using maruseeker::FilePermission;
using maruseeker::sdk::SDKShare;
using maruseeker::sdk::SharePathMgr;
using maruseeker::sdk::User;
using testing::HasSubstr;

using Adapters = PluginTest;

TEST_F(Adapters, SharePaths) {
  struct Case {
    const char* path;
    bool home;
    const char* expected;
  };
  const Case cases[] = {{"/volume1/photo/trip/a.jpg", true, "/photo/trip/a.jpg"},
                        {"/volume1/photo/trip/a.jpg", false, "/photo/trip/a.jpg"},
                        {"/volume1/photo", true, "/photo"},
                        {"/volume1/homes/alice/docs/x.txt", true, "/home/docs/x.txt"},
                        {"/volume1/homes/alice", true, "/home"},
                        {"/volume1/homes/alice/docs/x.txt", false, "/homes/alice/docs/x.txt"},
                        {"/volume1/homes/bob/x.txt", true, "/homes/bob/x.txt"},
                        {"/volume1/homes/alice2/y", true, "/homes/alice2/y"},
                        {"/volume1/homes", true, "/homes"},
                        {"/volume2/photo/a", true, ""},
                        {"", true, ""}};
  for (const Case& one : cases) {
    const Ran ran = InChild([&] {
      User alice("alice");
      EXPECT_TRUE(alice.home_enabled);
      alice.home_enabled = one.home;
      return Json::Value(SharePathMgr::GetSharePath(one.path, alice));
    });
    EXPECT_EQ(ran.value, one.expected) << one.path;
    EXPECT_EQ(ran.log.empty(), *one.expected != '\0');
  }
  const Ran homeless = InChild([] {
    User user("alice");
    user.name = "nobody of this name";
    return Json::Value(SharePathMgr::GetSharePath("/volume1/homes/alice/x", user));
  });
  EXPECT_EQ(homeless.value, "");
  EXPECT_THAT(homeless.log, HasSubstr("(GetSharePath) MARUServiceHomePathGet failed, "
                                      "user=nobody of this name"));
}

TEST_F(Adapters, Users) {
  EXPECT_EQ(User("bob").uid, 60002u);
  EXPECT_EQ(User(60001).name, "alice");
  EXPECT_EQ(User(60001).gid, 60001u);
  EXPECT_THROW(User("no such user"), Error);
  EXPECT_THROW(User(54321), Error);
  WriteFile("/tmp/given", "");
  EXPECT_TRUE(maruseeker::ChownMaruSeeker("/tmp/given"));
  struct stat status;
  EXPECT_EQ(stat("/tmp/given", &status), 0);
  EXPECT_EQ(status.st_uid, 60000u);
  EXPECT_FALSE(maruseeker::ChownMaruSeeker("/tmp/nothing here"));
}

TEST_F(Adapters, Shares) {
  const SDKShare photo("photo");
  const SDKShare deny("deny");
  const SDKShare hidden("hidden");
  EXPECT_EQ(photo.GetPrivilege("alice"), 1);
  EXPECT_EQ(SDKShare("private").GetPrivilege("alice"), 4);
  EXPECT_EQ(SDKShare("private").GetPrivilege("bob"), 2);
  EXPECT_EQ(photo.GetPrivilege("no such user"), 4);
  EXPECT_EQ(SDKShare("homes").GetPrivilege("alice"), 4);
  EXPECT_EQ(photo.GetFTPPrivilege(), 0u);
  EXPECT_EQ(SDKShare("unlisted").GetFTPPrivilege(), 1u);
  EXPECT_EQ(deny.GetFTPPrivilege(), 4u);
  EXPECT_FALSE(photo.IsHideUnReadable());
  EXPECT_TRUE(hidden.IsHideUnReadable());
  EXPECT_FALSE(photo.IsEnableRecycleBin());
  EXPECT_TRUE(hidden.IsEnableRecycleBin());
  EXPECT_FALSE(photo.IsEncryption());
  EXPECT_TRUE(photo.CanBeIndexed());
  EXPECT_EQ(photo.GetDBName(), "fileindex_photo");
  EXPECT_EQ(photo.GetDBPath(), "/var/lib/maruseeker/index/fileindex_photo");
  EXPECT_EQ(photo.GetQueuePath(), "/var/lib/maruseeker/queue/fileindex_photo");
  EXPECT_EQ(photo.GetDBPath(), "/var/lib/maruseeker/index/fileindex_photo");

  ASSERT_EQ(mount("full", "/volume1/deny", "tmpfs", MS_RDONLY, "size=4096"), 0);
  EXPECT_FALSE(deny.IsSpaceEnough());
  EXPECT_FALSE(deny.CanBeIndexed());
  umount("/volume1/deny");

  const Ran missing = InChild([] {
    try {
      SDKShare share("no such share");
    } catch (const Error& error) {
      return Json::Value(std::to_string(error.Code()) + error.Reason());
    }
    return Json::Value();
  });
  EXPECT_EQ(missing.value, "800no such share");
  EXPECT_THAT(missing.log,
              HasSubstr("(SDKShare) Failed [0 > MARUShareGet(share_name.c_str(), &share_info_) || "
                        "!share_info_], reason: no such share"));

  const Ran names = InChild([] {
    Json::Value all;
    for (const std::string& name : SDKShare::Enum()) all.append(name);
    return all;
  });
  EXPECT_EQ(ToText(names.value), "['deny','docs','hidden','homes','photo','private','unlisted']");
}

TEST_F(Adapters, FolderThatIsGone) {
  const Ran ran = InChild([] {
    EXPECT_EQ(unshare(CLONE_NEWNS), 0);
    EXPECT_EQ(mount("", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
    EXPECT_EQ(umount2("/volume1", MNT_DETACH), 0);
    const SDKShare deny("deny");
    // What cannot be told about the space is no reason to stop.
    EXPECT_TRUE(deny.IsSpaceEnough());
    Json::Value told;
    for (const auto& question : {&SDKShare::CanBeIndexed, &SDKShare::IsEncryption}) {
      try {
        (deny.*question)();
      } catch (const Error& error) {
        told.append(std::to_string(error.Code()) + " " + error.Reason());
      }
    }
    return told;
  });
  EXPECT_EQ(ToText(ran.value),
            "['502 MLIBShareis_encryptedGet failed, share=deny',"
            "'502 MLIBShareIsEncryptionGet failed, share=deny']");
  EXPECT_THAT(ran.log, HasSubstr("(CanBeIndexed) Failed [0 > MLIBShareIsEncryptedGet(share_info_, "
                                 "&is_encrypted)], reason: "));
}

TEST_F(Adapters, PermissionsOnFiles) {
  mkdir("/volume1/hidden/closed", 0755);
  chmod("/volume1/hidden/closed", 0744);
  WriteFile("/volume1/hidden/open.txt", "");
  WriteFile("/volume1/hidden/shut.txt", "", 0600);
  WriteFile("/volume1/photo/primary.txt", "", 0640);
  WriteFile("/volume1/photo/family.txt", "", 0640);
  EXPECT_EQ(chown("/volume1/photo/primary.txt", 0, 60001), 0);
  EXPECT_EQ(chown("/volume1/photo/family.txt", 0, 60101), 0);
  FilePermission alice("alice");
  EXPECT_TRUE(alice.CheckRead("/volume1/photo/trip/a.jpg"));
  EXPECT_FALSE(alice.CheckRead("/volume1/photo/secret.txt"));
  EXPECT_TRUE(alice.CheckRead("/volume1/photo/primary.txt"));
  EXPECT_TRUE(alice.CheckRead("/volume1/photo/family.txt"));
  EXPECT_FALSE(alice.CheckRead("/volume1/deny/d.txt"));
  EXPECT_TRUE(alice.CheckRead("/volume1/unlisted/u.txt"));
  EXPECT_FALSE(alice.CheckRead("/volume1/private"));
  EXPECT_TRUE(alice.CheckRead("/volume1/homes/alice/x.txt")) << "whom the share admits or not";
  EXPECT_FALSE(alice.CheckRead("/volume1/homes/bob/x.txt"));

  EXPECT_TRUE(alice.CheckList("/volume1/photo/secret.txt"));
  EXPECT_TRUE(alice.CheckList("/volume1/deny/d.txt"));
  EXPECT_FALSE(alice.CheckList("/volume1/unlisted/u.txt"));
  EXPECT_TRUE(alice.CheckList("/volume1/hidden/open.txt"));
  EXPECT_FALSE(alice.CheckList("/volume1/hidden/shut.txt"));
  EXPECT_FALSE(alice.CheckList("/volume1/hidden/closed/x"));
  // Neither the privilege on the share nor "homes" matters to listing.
  EXPECT_TRUE(alice.CheckList("/volume1/private/any"));
  EXPECT_FALSE(alice.CheckList("/volume1/homes/bob/x.txt"));

  // What was learned once stays for the life of the object.
  EXPECT_EQ(alice.GetShare("photo"), alice.GetShare("photo"));
  chmod("/volume1/photo/secret.txt", 0644);
  EXPECT_FALSE(alice.CheckRead("/volume1/photo/secret.txt"));
  EXPECT_TRUE(FilePermission("alice").CheckRead("/volume1/photo/secret.txt"));
  chmod("/volume1/photo/secret.txt", 0600);
}

TEST_F(Adapters, PermissionsThatCannotBeTold) {
  const auto fault = [](const char* user, const char* path) {
    return InChild([&] {
      try {
        FilePermission(user).CheckRead(path);
      } catch (const Error& error) {
        return Json::Value(std::to_string(error.Code()) + " " + error.Reason());
      }
      return Json::Value("none");
    });
  };
  const Ran user = fault("no such user", "/volume1/photo");
  EXPECT_EQ(user.value, "502 MLIBGroupInfoListGet failed, user: no such user");
  EXPECT_THAT(user.log, HasSubstr("(FilePermission) Failed [nullptr == (group_info_list_ = "
                                  "MLIBGroupInfoListGet(user_name_.c_str(), TRUE))], reason: "));
  for (const char* path : {"docs", "/volume1", "/", ""}) {
    const Ran malformed = fault("alice", path);
    EXPECT_EQ(malformed.value, std::string("502 Malformed path: ") + path);
    EXPECT_THAT(malformed.log,
                HasSubstr("(ExtractShareName) Failed [string::npos == slash_pos1], reason: "));
  }
  EXPECT_EQ(fault("alice", "/volume1/").value, "800 ");
  const Ran gone = fault("alice", "/volume1/photo/none");
  EXPECT_EQ(gone.value, "502 MARUACLPermCalc failed, user: alice, path: /volume1/photo/none");
  EXPECT_THAT(gone.log, HasSubstr("(GetPathACL) Failed [-1 == MARUACLPermCalc(user_name_.c_str(), "
                                  "group_info_list_, full_path.c_str(), &perm)], reason: "));
}

}  // namespace
