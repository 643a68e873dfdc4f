#include "system/acting.h"

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

#include "tests/support/support.h"

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

class Acting : public testing::Test {
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

TEST_F(Acting, LeadsFromOneUserToAnotherAndBack) {
  EXPECT_EQ(StatusOfChild([&] {
              const std::vector<gid_t> many{1, 2, 3};
              ASSERT_EQ(setgroups(many.size(), many.data()), 0);
              ASSERT_TRUE(maru::ActAs("alice"));
              EXPECT_EQ(Now(), kAlice);
              EXPECT_TRUE(MayRead(folder_ / "alices"));
              EXPECT_TRUE(MayRead(folder_ / "family"));
              // From alice to bob there is no way but through root.
              ASSERT_TRUE(maru::ActAs("bob"));
              EXPECT_EQ(Now(), kBob);
              EXPECT_FALSE(MayRead(folder_ / "alices"));
              ASSERT_TRUE(maru::ActAs("alice", false));
              EXPECT_EQ(Now().others, std::vector<gid_t>{60001});
              EXPECT_FALSE(MayRead(folder_ / "family"));
              ASSERT_TRUE(maru::ActAs("root"));
              EXPECT_EQ(Now().users, (std::array<uid_t, 3>{0, 0, 0}));
              EXPECT_EQ(Now().groups, (std::array<gid_t, 3>{0, 0, 0}));
              EXPECT_THAT(Now().others, testing::Contains(0));
              EXPECT_THAT(Now().others, testing::Not(testing::Contains(60001)));
            }),
            0);
}

TEST_F(Acting, WorksWithFewCapabilities) {
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
              ASSERT_TRUE(maru::ActAs("alice"));
              EXPECT_EQ(Now(), kAlice);
              __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
              __user_cap_data_struct sets[2];
              ASSERT_EQ(syscall(SYS_capget, &header, sets), 0);
              EXPECT_EQ(sets[0].effective, 0u);
              ASSERT_TRUE(maru::ActAs("bob"));
              EXPECT_EQ(Now(), kBob);
              ASSERT_TRUE(maru::ActAs("root"));
              EXPECT_EQ(Now().users, (std::array<uid_t, 3>{0, 0, 0}));
            }),
            0);
}

TEST_F(Acting, ChangesNothingWhenItFails) {
  EXPECT_EQ(StatusOfChild([] {
              ASSERT_TRUE(maru::ActAs("alice"));
              EXPECT_FALSE(maru::ActAs("no such user"));
              EXPECT_EQ(errno, 0);
              EXPECT_EQ(Now(), kAlice);
              // Without a saved root there is no way.
              ASSERT_TRUE(maru::ActAs("root"));
              ASSERT_EQ(setgroups(0, nullptr), 0);
              ASSERT_EQ(setresgid(60001, 60001, 60001), 0);
              ASSERT_EQ(setresuid(60001, 60001, 60001), 0);
              const Ids before = Now();
              EXPECT_FALSE(maru::ActAs("bob"));
              EXPECT_FALSE(maru::ActAs("alice"));
              EXPECT_EQ(Now(), before);
            }),
            0);
}

/// The way forth breaks off half-way, for want of the right to set groups.
TEST_F(Acting, IsNeverHalfDone) {
#ifdef __SANITIZE_THREAD__
  GTEST_SKIP() << "the sanitizer has a thread of its own, which keeps its rights";
#endif
  EXPECT_EQ(StatusOfChild([] {
              const Ids before = Now();
              DropAllBut(1u << CAP_SETUID);
              EXPECT_FALSE(maru::ActAs("alice"));
              EXPECT_EQ(Now(), before);
            }),
            0);
  // Here the way back is closed as well: better no process than half a user.
  const int status = StatusOfChild([] {
    signal(SIGABRT, SIG_DFL);
    ASSERT_EQ(setresuid(0, 60001, 60001), 0);
    DropAllBut(0);
    maru::ActAs("bob");
  });
  EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGABRT) << status;
}

}  // namespace
