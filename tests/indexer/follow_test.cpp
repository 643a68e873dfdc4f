#include <sys/mount.h>
#include <sys/stat.h>

#include "fixture.h"
#include "indexer/keeper.h"

namespace maru::indexer::test {
namespace {

class FollowTest : public ShareTest {
 protected:
  void Follow() {
    keeper_ =
        std::make_unique<Keeper>(Target{"share", Share(), IndexFolder(), {}, {}, Selection(share_)},
                                 TheWorkers(), turn_, settings_);
  }

  /// Waits until the index says what the disk says.
  void ExpectCaughtUp(const std::string& what = {}) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (std::chrono::steady_clock::now() < end) {
      if (Matches()) return;
      std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    EXPECT_EQ("", Differences(OnDisk(), Indexed())) << what;
  }

  /// The same of what everybody may read.
  void ExpectRightsCaughtUp(const std::string& what) {
    const Identity other{12345, {}, false};
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (Indexed(other) != OnDisk(true) && std::chrono::steady_clock::now() < end) {
      std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    EXPECT_EQ("", Differences(OnDisk(true), Indexed(other))) << what;
  }

  ShareSettings share_;
  std::mutex turn_;
  Keeper::Settings settings_{.lost_events_gap = std::chrono::seconds(0)};
  std::unique_ptr<Keeper> keeper_;
};

TEST_F(FollowTest, LeavesOutWhatIsVetoed) {
  share_.veto.patterns = {"*.bak"};
  Follow();
  ExpectCaughtUp("first crawl");
  Write("a.bak/b", "vetoed");
  Write("c.bak", "vetoed");
  Write("d", "soon vetoed");
  while (Search("soon").empty()) std::this_thread::sleep_for(std::chrono::milliseconds(50));
  Rename("d", "d.bak");
  while (!Search("soon").empty()) std::this_thread::sleep_for(std::chrono::milliseconds(50));
  Write("e", "last");
  while (Search("last").empty()) std::this_thread::sleep_for(std::chrono::milliseconds(50));
  EXPECT_EQ(Indexed().size(), 1u);
}

TEST_F(FollowTest, FindsEveryKindOfChange) {
  Write("old/file.txt", "before");
  Follow();
  ExpectCaughtUp("first crawl");
  Write("new.txt", "fresh");
  Write("deep/er/and/deeper.txt", "down");
  ExpectCaughtUp("new ones");
  EXPECT_EQ(1u, Search("fresh").size());
  Write("old/file.txt", "afterwards");
  Remove("new.txt");
  ExpectCaughtUp("changed ones");
  EXPECT_TRUE(Search("before").empty());

  const index::DocumentId deeper = DocumentOf("/deep/er/and/deeper.txt");
  const std::uint64_t read = keeper_->Done().bytes;
  Rename("deep/er", "old/moved");
  ExpectCaughtUp("moved folder");
  EXPECT_EQ(deeper, DocumentOf("/old/moved/and/deeper.txt"));
  EXPECT_EQ(read, keeper_->Done().bytes) << "a moved folder is not read again";
  Write("old/moved/and/later.txt", "its folder is still watched");
  ExpectCaughtUp("in the moved folder");

  Chmod("old", 0700);
  ExpectRightsCaughtUp("rights of a folder");
  fs::rename(Share() + "/old", root_ + "/out");
  ExpectCaughtUp("moved out");
  std::ofstream(root_ + "/out/outside.txt") << "no business of the share";
  fs::rename(root_ + "/out", Share() + "/in");
  ExpectCaughtUp("moved in");
}

/// Rights and contents that change where the folder above does not hear of it.
TEST_F(FollowTest, AFileChangesUnderItsOtherNames) {
  const std::string outside = root_ + "/outside.txt";
  Write("a/one.txt", "first words");
  fs::create_hard_link(Share() + "/a/one.txt", outside);
  Follow();
  ExpectCaughtUp("first crawl");
  chmod(outside.c_str(), 0600);
  ExpectRightsCaughtUp("rights by a name outside the share");
  std::ofstream(outside, std::ios::app) << " and the lastword";
  ExpectCaughtUp("content by a name outside the share");
  EXPECT_EQ(1u, Search("lastword").size());
  Write("b/two.txt", "second");
  ExpectCaughtUp();
  fs::create_hard_link(Share() + "/b/two.txt", Share() + "/a/too.txt");
  ExpectCaughtUp("a second name");
  chmod((Share() + "/a/too.txt").c_str(), 0600);
  ExpectRightsCaughtUp("rights by the second name");
}

TEST_F(FollowTest, WhatIsMountedInAShareIsFollowed) {
  Write("disk/below.txt", "hidden by the disk");
  const std::string disk = Share() + "/disk";
  Follow();
  ExpectCaughtUp("first crawl");
  if (mount("none", disk.c_str(), "tmpfs", 0, "mode=755") != 0) GTEST_SKIP() << "needs mounts";
  ExpectCaughtUp("a disk is mounted");
  Write("disk/above.txt", "on the disk");
  ExpectCaughtUp("a file on the disk");
  chmod(disk.c_str(), 0700);
  ExpectRightsCaughtUp("rights of the mount point");
  umount(disk.c_str());
  ExpectCaughtUp("the disk is gone");
  EXPECT_EQ(1u, Search("hidden").size());
}

TEST_F(FollowTest, AChangeIsFoundInAFolderThatMovesBeforeItIsLookedAt) {
  Write("here/deep/file.txt", "before");
  Write("elsewhere/file.txt", "elsewhere");
  Follow();
  ExpectCaughtUp();
  Write("here/deep/file.txt", "afterwards");
  Write("here/deep/other.txt", "another");
  std::this_thread::sleep_for(Pending::kMoment * 2 / 3);
  Rename("here", "elsewhere/there");
  ExpectCaughtUp();
}

TEST_F(FollowTest, AFileThatIsBeingWrittenIsFoundWhenItIsQuiet) {
  Follow();
  Write("x", "");
  ExpectCaughtUp();
  std::ofstream log(Share() + "/log.txt");
  log << "firstline" << std::endl;
  while (Search("firstline").empty()) std::this_thread::sleep_for(std::chrono::milliseconds(50));
  log << "secondline" << std::endl;
  while (Search("secondline").empty()) std::this_thread::sleep_for(std::chrono::milliseconds(50));
}

TEST_F(FollowTest, AnyMixOfChangesIsCaughtUpWith) {
  Follow();
  std::mt19937 random = Random();
  for (int round = 0; round < 12; ++round) {
    const int changes = 1 + static_cast<int>(random() % 60);
    for (int i = 0; i < changes; ++i) Mutate(random);
    ExpectCaughtUp("round " + std::to_string(round));
    if (HasFailure()) return;
  }
  keeper_.reset();
  const Snapshot followed = Indexed();
  Crawl();
  EXPECT_EQ("", Differences(followed, Indexed())) << "a crawl finds nothing that was missed";
}

TEST_F(FollowTest, ChangesFasterThanTheQueueAreFoundByACrawl) {
  settings_.lost_events_gap = std::chrono::seconds(0);
  Follow();
  ExpectCaughtUp();
  for (int i = 0; i < 30'000; ++i) {
    const std::string path = Share() + "/f" + std::to_string(i % 500);
    if (i / 500 % 2 == 0) {
      std::ofstream(path) << i;
    } else {
      unlink(path.c_str());
    }
  }
  Write("last.txt", "last");
  ExpectCaughtUp();
}

TEST_F(FollowTest, SharesCrawlOneAfterAnotherAndEndPromptly) {
  for (int i = 0; i < 500; ++i) Write("f" + std::to_string(i), "x");
  std::unique_lock busy(turn_);
  Follow();
  std::this_thread::sleep_for(std::chrono::milliseconds(100));
  EXPECT_FALSE(library_.Has("fileindex_share"));
  busy.unlock();
  ExpectCaughtUp();
  keeper_.reset();
  Write("f0", "changed while nobody looked");
  Follow();
  ExpectCaughtUp("after a new start");
}

}  // namespace
}  // namespace maru::indexer::test
