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

  ShareSettings share_;
  std::mutex turn_;
  Keeper::Settings settings_;
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
  const Identity other{12345, {}, false};
  while (Indexed(other) != OnDisk(true)) std::this_thread::sleep_for(std::chrono::milliseconds(50));
  fs::rename(Share() + "/old", root_ + "/out");
  ExpectCaughtUp("moved out");
  std::ofstream(root_ + "/out/outside.txt") << "no business of the share";
  fs::rename(root_ + "/out", Share() + "/in");
  ExpectCaughtUp("moved in");
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
