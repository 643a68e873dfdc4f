// Users, as this machine's name service and PAM see them.

#include <gtest/gtest.h>
#include <pwd.h>
#include <unistd.h>

#include "server/host/user.h"

namespace maru::server {
namespace {

class UserTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (geteuid() != 0 || !getpwnam("alice") || access("/etc/pam.d/maruseeker", R_OK) != 0)
      GTEST_SKIP() << "needs the account alice and the PAM service: run it in tools/sandbox";
  }
};

TEST_F(UserTest, IsFoundWithAStampOfItsPassword) {
  const auto alice = FindUser("alice");
  ASSERT_TRUE(alice);
  EXPECT_EQ(alice->uid, 60001u);
  EXPECT_FALSE(alice->stamp.empty());
  EXPECT_EQ(FindUser("alice")->stamp, alice->stamp);
  EXPECT_NE(FindUser("bob")->stamp, alice->stamp);
  EXPECT_FALSE(FindUser("nobody-here"));
  EXPECT_FALSE(FindUser(""));
}

TEST_F(UserTest, PamAdmitsWhomItKnows) {
  EXPECT_TRUE(IsAdmitted("alice"));
  EXPECT_FALSE(IsAdmitted("nobody-here"));
  const auto alice = SignIn("alice", "alice", "::1");
  ASSERT_TRUE(alice);
  EXPECT_EQ(alice->name, "alice");
}

}  // namespace
}  // namespace maru::server
