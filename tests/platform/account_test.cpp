#include "platform/account.h"

#include <errno.h>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <linux/capability.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <array>

#include "platform/process.h"
#include "system/log.h"
#include "tests/platform/support.h"

namespace {

struct Ids {
  std::array<uid_t, 3> users;
  std::array<gid_t, 3> groups;
  std::vector<gid_t> others;
  friend bool operator==(const Ids&, const Ids&) = default;
};

Ids Now() {
  Ids ids;
  getresuid(&ids.users[0], &ids.users[1], &ids.users[2]);
  getresgid(&ids.groups[0], &ids.groups[1], &ids.groups[2]);
  ids.others.resize(1000);
  ids.others.resize(static_cast<std::size_t>(getgroups(1000, ids.others.data())));
  std::sort(ids.others.begin(), ids.others.end());
  return ids;
}

const Ids kAlice{{60001, 60001, 0}, {60001, 60001, 0}, {60001, 60101}};
const Ids kBob{{60002, 60002, 0}, {60002, 60002, 0}, {60002, 60102}};

bool MayRead(const std::string& path) {
  const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  close(file);
  return file >= 0;
}

void DropAllBut(std::uint32_t capabilities) {
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  const __user_cap_data_struct sets[2] = {{capabilities, capabilities, 0}, {0, 0, 0}};
  ASSERT_EQ(syscall(SYS_capset, &header, sets), 0);
}

class Credentials : public testing::Test {
 protected:
  void SetUp() override {
    NEEDS_ACCOUNTS();
    // The mode first: afterwards the file may be out of reach.
    chmod(folder_.Write("alices", "").c_str(), 0600);
    chmod(folder_.Write("family", "").c_str(), 0040);
    ASSERT_EQ(chown((folder_ / "alices").c_str(), 60001, 60001), 0);
    ASSERT_EQ(chown((folder_ / "family").c_str(), 60002, 60101), 0);
  }
  TempFolder folder_;
};

TEST_F(Credentials, LeadFromOneUserToAnotherAndBack) {
  EXPECT_EQ(StatusOfChild([&] {
              const std::vector<gid_t> many{1, 2, 3};
              ASSERT_EQ(setgroups(many.size(), many.data()), 0);
              ASSERT_TRUE(ResetCredentialsByName("alice", true));
              EXPECT_EQ(Now(), kAlice);
              EXPECT_TRUE(MayRead(folder_ / "alices"));
              EXPECT_TRUE(MayRead(folder_ / "family"));
              // From alice to bob there is no way but through root.
              ASSERT_TRUE(ResetCredentialsByName("bob", true));
              EXPECT_EQ(Now(), kBob);
              EXPECT_FALSE(MayRead(folder_ / "alices"));
              ASSERT_TRUE(ResetCredentialsByName("alice", false));
              EXPECT_EQ(Now().others, std::vector<gid_t>{60001});
              EXPECT_FALSE(MayRead(folder_ / "family"));
              ASSERT_TRUE(ResetCredentialsByName("root", true));
              EXPECT_EQ(Now().users, (std::array<uid_t, 3>{0, 0, 0}));
              EXPECT_EQ(Now().groups, (std::array<gid_t, 3>{0, 0, 0}));
              EXPECT_THAT(Now().others, testing::Contains(0));
              EXPECT_THAT(Now().others, testing::Not(testing::Contains(60001)));
            }),
            0);
}

TEST_F(Credentials, WorkWithFewCapabilities) {
  EXPECT_EQ(StatusOfChild([] {
              for (int capability = 0; prctl(PR_CAPBSET_READ, capability) >= 0; ++capability) {
                if (capability != CAP_SETUID && capability != CAP_SETGID &&
                    capability != CAP_DAC_READ_SEARCH && capability != CAP_KILL &&
                    capability != CAP_CHOWN) {
                  prctl(PR_CAPBSET_DROP, capability);
                }
              }
              // The bounding set takes hold at the next program; here the permitted set does.
              DropAllBut(1u << CAP_SETUID | 1u << CAP_SETGID | 1u << CAP_DAC_READ_SEARCH |
                         1u << CAP_KILL | 1u << CAP_CHOWN);
              ASSERT_TRUE(ResetCredentialsByName("alice", true));
              EXPECT_EQ(Now(), kAlice);
              __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
              __user_cap_data_struct sets[2];
              ASSERT_EQ(syscall(SYS_capget, &header, sets), 0);
              EXPECT_EQ(sets[0].effective, 0u);
              ASSERT_TRUE(ResetCredentialsByName("bob", true));
              EXPECT_EQ(Now(), kBob);
              ASSERT_TRUE(ResetCredentialsByName("root", true));
              EXPECT_EQ(Now().users, (std::array<uid_t, 3>{0, 0, 0}));
            }),
            0);
}

TEST_F(Credentials, ChangeNothingWhenTheyFail) {
  EXPECT_EQ(StatusOfChild([] {
              ASSERT_TRUE(ResetCredentialsByName("alice", true));
              EXPECT_FALSE(ResetCredentialsByName("no such user", true));
              EXPECT_EQ(MLIBCErrGet(), kErrNotFound);
              EXPECT_EQ(Now(), kAlice);
              // Without a saved root there is no way.
              ASSERT_TRUE(ResetCredentialsByName("root", true));
              ASSERT_EQ(setgroups(0, nullptr), 0);
              ASSERT_EQ(setresgid(60001, 60001, 60001), 0);
              ASSERT_EQ(setresuid(60001, 60001, 60001), 0);
              const Ids before = Now();
              EXPECT_FALSE(ResetCredentialsByName("bob", true));
              EXPECT_FALSE(ResetCredentialsByName("alice", true));
              EXPECT_EQ(Now(), before);
            }),
            0);
}

/// The way forth breaks off half-way, for want of the right to set groups.
TEST_F(Credentials, AreNeverHalfSwitched) {
#ifdef __SANITIZE_THREAD__
  GTEST_SKIP() << "the sanitizer has a thread of its own, which keeps its rights";
#endif
  EXPECT_EQ(StatusOfChild([] {
              const Ids before = Now();
              DropAllBut(1u << CAP_SETUID);
              EXPECT_FALSE(ResetCredentialsByName("alice", true));
              EXPECT_EQ(Now(), before);
            }),
            0);
  // Here the way back is closed as well: better no process than half a user.
  const int status = StatusOfChild([] {
    signal(SIGABRT, SIG_DFL);
    ASSERT_EQ(setresuid(0, 60001, 60001), 0);
    DropAllBut(0);
    ResetCredentialsByName("bob", true);
  });
  EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGABRT) << status;
}

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
  // By primary group too, and no administrators without the group.
  Configure(folder, "admin_group = alice\nsamba_config_canonical = yes\n");
  EXPECT_EQ(MLIBGroupIsAdminGroupMem("alice", 0), 1);
  Configure(folder, "admin_group = no such group\nsamba_config_canonical = yes\n");
  EXPECT_EQ(MLIBGroupIsAdminGroupMem("carol", 0), 0);
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
