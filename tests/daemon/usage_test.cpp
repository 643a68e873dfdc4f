#include "daemon/core/usage.h"

#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include "common/error.h"
#include "tests/daemon/fixture.h"

namespace maru::daemon::test {
namespace {

class UsageTest : public testing::Test {
 protected:
  UsageTest() { mkdir(folder_.c_str(), 0700); }
  ~UsageTest() override { std::filesystem::remove_all(folder_); }

  std::unique_ptr<UsageStore> Open() {
    return std::make_unique<UsageStore>(folder_ + "/usage.db", [this] { return now_; });
  }

  static double BoostOf(const UsageStore& usage, uid_t uid, index::DocumentId document) {
    for (const OpenedFile& file : usage.OpenedBy(uid, {"i"})) {
      if (file.document == document) return file.boost;
    }
    return 0;
  }

  const std::string folder_ = testing::TempDir() + "usage-test-" + std::to_string(getpid());
  std::int64_t now_ = 1'800'000'000;
};

TEST_F(UsageTest, FadesAndIsEachUsersOwn) {
  const auto usage = Open();
  usage->Record(1, "i", 7, "/a");
  const double once = BoostOf(*usage, 1, 7);
  usage->Record(1, "i", 7, "/a");
  const double twice = BoostOf(*usage, 1, 7);
  EXPECT_DOUBLE_EQ(once, 0.5);
  EXPECT_GT(twice, once);
  EXPECT_LT(twice, 1);
  EXPECT_TRUE(usage->OpenedBy(2, {"i"}).empty());
  now_ += UsageStore::kHalfLife;
  EXPECT_DOUBLE_EQ(BoostOf(*usage, 1, 7), once);
  usage->Record(1, "i", 7, "/a");
  EXPECT_DOUBLE_EQ(BoostOf(*usage, 1, 7), twice) << "half of two, and one";
  EXPECT_TRUE(usage->OpenedBy(1, {"other"}).empty());
}

TEST_F(UsageTest, SurvivesRestartsAndStaysBounded) {
  auto usage = Open();
  for (unsigned i = 1; i <= UsageStore::kMaxFiles + 20; ++i) {
    ++now_;
    usage->Record(1, "i", i, "/" + std::to_string(i));
  }
  usage->Record(1, "i", 220, "/220");
  const double boost = BoostOf(*usage, 1, 220);
  EXPECT_EQ(usage->Size(), UsageStore::kMaxFiles);
  EXPECT_EQ(BoostOf(*usage, 1, 1), 0) << "the weakest made room";
  usage.reset();
  usage = Open();
  EXPECT_EQ(usage->Size(), UsageStore::kMaxFiles);
  EXPECT_DOUBLE_EQ(BoostOf(*usage, 1, 220), boost);
}

TEST_F(UsageTest, ForgetsTheUserWhoWasAwayLongest) {
  const auto usage = Open();
  for (unsigned uid = 0; uid <= UsageStore::kMaxUsers; ++uid) {
    usage->Record(uid, "i", 1, "/a");
    ++now_;
  }
  EXPECT_EQ(usage->Size(), UsageStore::kMaxUsers);
  EXPECT_EQ(BoostOf(*usage, 0, 1), 0);
  EXPECT_GT(BoostOf(*usage, 1, 1), 0.4);
}

TEST_F(UsageTest, SurvivesAKill) {
  const pid_t child = fork();
  if (child == 0) {
    Open()->Record(1, "i", 7, "/a");
    auto usage = Open();
    usage->Record(1, "i", 7, "/a");
    kill(getpid(), SIGKILL);
  }
  waitpid(child, nullptr, 0);
  const auto usage = Open();
  EXPECT_EQ(usage->Size(), 1u);
  EXPECT_GT(BoostOf(*usage, 1, 7), 0.6) << "two openings";
}

TEST_F(UsageTest, ADamagedDatabaseIsLeftAloneAndSearchesGoOn) {
  std::ofstream(folder_ + "/usage.db") << std::string(5000, 'x');
  const auto usage = Open();
  EXPECT_TRUE(usage->OpenedBy(1, {"i"}).empty());
  EXPECT_THROW(usage->Record(1, "i", 1, "/a"), maruseeker::Error);
}

TEST(SameFile, KeepsItsNameOrItsFolder) {
  EXPECT_TRUE(IsSameFile("/a/x", "/a/x"));
  EXPECT_TRUE(IsSameFile("/a/x", "/b/x"));
  EXPECT_TRUE(IsSameFile("/a/x", "/a/y"));
  EXPECT_FALSE(IsSameFile("/a/x", "/b/y"));
  EXPECT_FALSE(IsSameFile("/x", "/b/y"));
  EXPECT_TRUE(IsSameFile("", ""));
}

}  // namespace
}  // namespace maru::daemon::test
