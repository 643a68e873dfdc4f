#include "platform/account.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "platform/preference.h"
#include "platform/process.h"
#include "system/log.h"
#include "tests/support/support.h"

namespace {

TEST(Accounts, AreFoundByNameAndNumber) {
  MARUUSER* user = nullptr;
  ASSERT_EQ(MARUUserGet("root", &user), 0);
  EXPECT_STREQ(user->szName, "root");
  EXPECT_EQ(user->nUid, 0u);
  MARUUserFree(user);
  ASSERT_EQ(MARUUserGetByUID(0, &user), 0);
  EXPECT_STREQ(user->szName, "root");
  MARUUserFree(user);
  EXPECT_EQ(MARUUserGet("no such user", &user), -1);
  EXPECT_EQ(user, nullptr);
  EXPECT_EQ(MLIBCErrGet(), kErrNotFound);
  EXPECT_EQ(MARUUserGetByUID(4'000'000'000, &user), -1);
  EXPECT_EQ(MARUUserGet("", &user), -1);
  EXPECT_EQ(MARUUserGet(std::string(1 << 20, 'a').c_str(), &user), -1);
}

TEST(Accounts, KnowTheirGroupsAndAdministrators) {
  NEEDS_ACCOUNTS();
  const TempFolder folder;
  folder.Write("smb.conf", "");
  Configure(folder, "samba_config_canonical = yes\n");
  EXPECT_EQ(MLIBGroupIsAdminGroupMem("carol", 0), 1);
  EXPECT_EQ(MLIBGroupIsAdminGroupMem("alice", 0), 0);
  EXPECT_EQ(MLIBGroupIsAdminGroupMem("no such user", 0), -1);
  MLIBCSzList* groups = MLIBGroupInfoListGet("alice", true);
  ASSERT_EQ(MLIBCSzListCount(groups), 2);
  EXPECT_STREQ(MLIBCSzListGet(groups, 0), "60001");
  EXPECT_STREQ(MLIBCSzListGet(groups, 1), "60101");
  EXPECT_EQ(MLIBCSzListGet(groups, 2), nullptr);
  EXPECT_EQ(MLIBCSzListGet(groups, -1), nullptr);
  MLIBCSzListFree(groups);
  EXPECT_EQ(MLIBGroupInfoListGet("no such user", true), nullptr);
}

TEST(Accounts, TellWhyNobodyBecomesThem) {
  NEEDS_ACCOUNTS();
  EXPECT_EQ(StatusOfChild([] {
              ASSERT_TRUE(ResetCredentialsByName("alice", true));
              EXPECT_EQ(geteuid(), 60001u);
              EXPECT_FALSE(ResetCredentialsByName("no such user", true));
              EXPECT_EQ(MLIBCErrGet(), kErrNotFound);
              ASSERT_EQ(setresuid(60001, 60001, 60001), 0);
              EXPECT_FALSE(ResetCredentialsByName("bob", true));
              EXPECT_EQ(MLIBCErrGet(), kErrSystem);
            }),
            0);
}

TEST(Preference, KnowsItsKeysByTheirType) {
  const TempFolder folder;
  Configure(folder);
  const maruseeker::pref::Preference preference(getuid());
  EXPECT_TRUE(preference.Get<bool>("enable_history"));
  EXPECT_EQ(preference.Get<int>("max_history_num"), 100);
  EXPECT_THROW(preference.Get<int>("enable_history"), std::invalid_argument);
  EXPECT_THROW(preference.Get<bool>("max_history_num"), std::invalid_argument);
  EXPECT_THROW(preference.Get<bool>("no such key"), std::invalid_argument);
}

TEST(Fork, KeepsNothingOfTheParentOpen) {
  int ends[2];
  ASSERT_EQ(pipe(ends), 0);
  const pid_t child = MLIBCProcForkEx(1);
  if (child == 0) _exit(fcntl(ends[1], F_GETFD) == -1 && fcntl(2, F_GETFD) != -1 ? 0 : 1);
  int status = -1;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  close(ends[0]);
  close(ends[1]);
}

/// The system log of the sandbox, played by the test.
TEST(Fork, TheChildLogsWhereItsParentDid) {
  NEEDS_ACCOUNTS();
  const int log = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  const sockaddr_un address{AF_UNIX, "/dev/log"};
  if (bind(log, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0) {
    close(log);
    GTEST_SKIP() << "there is a system log already";
  }
  maru::OpenLog("tested", false);
  MARU_LOG("parent");
  const pid_t child = MLIBCProcForkEx(1);
  if (child == 0) {
    // They take the number that the parent's log had, and must not get its lines.
    int pair[2];
    char byte;
    const bool made = socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0, pair) == 0;
    MARU_LOG("child");
    _exit(made && recv(pair[0], &byte, 1, MSG_DONTWAIT) == -1 &&
                  recv(pair[1], &byte, 1, MSG_DONTWAIT) == -1
              ? 0
              : 1);
  }
  int status = -1;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
  for (const char* expected : {"parent", "child"}) {
    char line[512] = "";
    EXPECT_GT(recv(log, line, sizeof(line) - 1, MSG_DONTWAIT), 0);
    EXPECT_THAT(line, testing::AllOf(testing::HasSubstr("tested["), testing::EndsWith(expected)));
  }
  unlink("/dev/log");
  close(log);
}

}  // namespace
