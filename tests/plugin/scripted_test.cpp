#include <gmock/gmock.h>

#include <sstream>

#include "common/common.h"
#include "common/sdk/credentials.h"
#include "common/sdk/permission.h"
#include "common/sdk/share.h"
#include "common/sdk/user.h"
#include "platform/account.h"
#include "platform/acl.h"
#include "platform/process.h"
#include "platform/share.h"

/// The adapters over a platform that says what no real one does on demand, and that counts what it
/// hands out. These functions stand before those of maruplatform, which the linker meets later.
namespace {

struct Platform {
  /// By the function's name: what it returns, and what it writes; 0 unless told otherwise.
  std::map<std::string, int> results, values;
  int last_error = 0;
  bool no_record = false;
  /// "NAME ARGUMENT...", with " locked" where the plug-in held its mutex.
  std::vector<std::string> calls;
};

Platform platform;
char share_name[] = "photo";
char share_path[] = "/scripted/path";
MARUSHARE share_record = {share_name, share_path, 0};
MARUUSER user_record = {"scripted", 7, 8, 9};
auto* const group_list = reinterpret_cast<MLIBCSzList*>(&platform);

template <class... Arguments>
int Play(const char* name, const Arguments&... arguments) {
  const bool locked = !maruseeker::sdk::SDKMutex().TryLock();
  if (!locked) maruseeker::sdk::SDKMutex().Unlock();
  std::ostringstream call;
  call << name;
  ((call << ' ' << arguments), ...);
  platform.calls.push_back(call.str() + (locked ? " locked" : ""));
  return platform.results[name];
}

int Tell(const char* name, const MARUSHARE* share, int* value) {
  *value = platform.values[name];
  return Play(name, share->szName);
}

}  // namespace

int MARUShareGet(const char* name, MARUSHARE** share) {
  *share = platform.no_record ? nullptr : &share_record;
  return Play("MARUShareGet", name);
}
void MARUShareFree(MARUSHARE* share) {
  Play("MARUShareFree", share->szName);
}
int MARUShareUserPrivGet(const char* user_name, const MARUSHARE* share) {
  return Play("MARUShareUserPrivGet", user_name, share->szName);
}
int MLIBShareIsEncryptedGet(const MARUSHARE* share, int* value) {
  return Tell("MLIBShareIsEncryptedGet", share, value);
}
int MLIBShareIsEncryptionGet(const MARUSHARE* share, int* value) {
  return Tell("MLIBShareIsEncryptionGet", share, value);
}
int MLIBShareIsReadOnlyGet(const MARUSHARE* share, int* value) {
  return Tell("MLIBShareIsReadOnlyGet", share, value);
}
int MARUQuotaIsEnough(unsigned int uid, const char* path, std::uint64_t bytes, int flags) {
  return Play("MARUQuotaIsEnough", uid, path, bytes, flags);
}
int MLIBCErrGet() {
  return platform.last_error;
}
MLIBCSzList* MLIBGroupInfoListGet(const char* user_name, bool with_primary) {
  Play("MLIBGroupInfoListGet", user_name, with_primary);
  return group_list;
}
void MLIBCSzListFree(MLIBCSzList* list) {
  Play("MLIBCSzListFree", list == group_list);
}
int MARUACLPermCalc(const char* user_name, const MLIBCSzList* groups, const char* path, int* bits) {
  *bits = kACLRead;
  return Play("MARUACLPermCalc", user_name, groups == group_list, path);
}
int MARUUserGet(const char* name, MARUUSER** user) {
  *user = platform.no_record ? nullptr : &user_record;
  return Play("MARUUserGet", name);
}
int MARUUserGetByUID(uid_t uid, MARUUSER** user) {
  *user = &user_record;
  return Play("MARUUserGetByUID", uid);
}
void MARUUserFree(MARUUSER* user) {
  Play("MARUUserFree", user ? user->szName : "none");
}
int MLIBGroupIsAdminGroupMem(const char* user_name, int reserved) {
  return Play("MLIBGroupIsAdminGroupMem", user_name, reserved);
}
bool ResetCredentialsByName(const std::string& user_name, bool groups) {
  return Play("ResetCredentialsByName", user_name, groups) == 0;
}

namespace {

using maruseeker::Error;
using maruseeker::FilePermission;
using maruseeker::sdk::SDKCredentials;
using maruseeker::sdk::SDKShare;
using maruseeker::sdk::User;
using testing::ElementsAre;

class Scripted : public testing::Test {
 protected:
  void SetUp() override { platform = {}; }
};

TEST_F(Scripted, SpaceOfAShare) {
  const SDKShare share("photo");
  struct Case {
    int result, last_error;
    bool enough;
  };
  for (const Case& one :
       {Case{1, 0, true}, Case{-1, kErrNoSpace, true}, Case{0, kErrNoSpace, false},
        Case{0, kErrOverQuota, false}, Case{0, kErrSystem, true}}) {
    platform.results["MARUQuotaIsEnough"] = one.result;
    platform.last_error = one.last_error;
    EXPECT_EQ(share.IsSpaceEnough(), one.enough) << one.result << " " << one.last_error;
  }
  EXPECT_EQ(platform.calls.back(), "MARUQuotaIsEnough 0 /scripted/path 104857600 0 locked");
}

TEST_F(Scripted, SharesThatCannotBeIndexed) {
  const SDKShare share("photo");
  for (const int encrypted : {0, 1}) {
    platform.values["MLIBShareIsEncryptionGet"] = encrypted;
    EXPECT_EQ(share.IsEncryption(), encrypted == 1);
    for (const int read_only : {0, 1}) {
      platform.values["MLIBShareIsEncryptedGet"] = encrypted;
      platform.values["MLIBShareIsReadOnlyGet"] = read_only;
      EXPECT_EQ(share.CanBeIndexed(), !encrypted && !read_only) << encrypted << read_only;
    }
  }
  platform.values.clear();
  platform.results["MLIBShareIsReadOnlyGet"] = -1;
  EXPECT_THROW(share.CanBeIndexed(), Error);
}

TEST_F(Scripted, PermissionsAreLearnedOnceAndReleased) {
  {
    FilePermission alice("alice");
    for (int i = 0; i < 2; ++i) EXPECT_TRUE(alice.CheckRead("/volume1/photo/a"));
  }
  const std::string privilege = "MARUShareUserPrivGet alice photo";
  EXPECT_THAT(platform.calls,
              ElementsAre("MLIBGroupInfoListGet alice 1", "MARUShareGet photo locked", privilege,
                          "MARUACLPermCalc alice 1 /volume1/photo/a", privilege,
                          "MLIBCSzListFree 1", "MARUShareFree photo locked"));
  platform.no_record = true;
  EXPECT_THROW(SDKShare("photo"), Error);
}

TEST_F(Scripted, UsersAreReleased) {
  EXPECT_EQ(User("alice").gid, 8u);
  EXPECT_THAT(platform.calls,
              ElementsAre("MARUUserGet alice locked", "MARUUserFree scripted locked"));
  platform = {};
  platform.results["MARUUserGet"] = -1;
  EXPECT_THROW(User("alice"), Error);
  EXPECT_EQ(platform.calls.back(), "MARUUserFree scripted locked") << "what a failure leaves, too";
  platform = {};
  platform.no_record = true;
  EXPECT_THROW(User("alice"), Error);
}

TEST_F(Scripted, CredentialsTakeAllGroups) {
  SDKCredentials credentials;
  EXPECT_EQ(platform.calls.back(), "MARUUserFree scripted locked");
  for (const int is_admin : {0, -1, 1}) {
    platform.results["MLIBGroupIsAdminGroupMem"] = is_admin;
    credentials.AsUser("alice");
    EXPECT_EQ(platform.calls.back(), is_admin == 1 ? "ResetCredentialsByName root 1 locked"
                                                   : "ResetCredentialsByName alice 1 locked");
  }
}

}  // namespace
