#include "fixture.h"
#include "indexer/crawl/progress.h"
#include "indexer/follow/pending.h"
#include "indexer/update/compare.h"

namespace maru::indexer::test {
namespace {

using std::chrono::milliseconds;

TEST(PendingTest, AFileComesToRestButNotForEver) {
  Pending pending;
  const Pending::Clock::time_point start{};
  EXPECT_EQ(Pending::Clock::time_point::max(), pending.NextDue());
  pending.Add(1, "log", false, start);
  EXPECT_EQ(start + Pending::kQuiet, pending.NextDue());
  // Written all the time: due at the latest after kQuietAtMost.
  for (milliseconds at{0}; at < Pending::kQuietAtMost; at += milliseconds(500)) {
    EXPECT_TRUE(pending.TakeDue(start + at, 10).empty());
    pending.Add(1, "log", false, start + at);
  }
  EXPECT_EQ(start + Pending::kQuietAtMost, pending.NextDue());
  // Closed: a moment.
  pending.Add(2, "b", true, start);
  pending.Add(2, "a", true, start);
  EXPECT_EQ((NamesByFolder{{2, {"a", "b"}}}), pending.TakeDue(start + Pending::kMoment, 10));
}

TEST(PendingTest, TooManyAreForACrawlToFind) {
  Pending pending;
  const auto now = Pending::Clock::now();
  for (std::size_t i = 0; i < Pending::kMaxNames; ++i) {
    ASSERT_TRUE(pending.Add(1, std::to_string(i), true, now));
  }
  EXPECT_FALSE(pending.Add(1, "one more", true, now));
  EXPECT_EQ(Pending::Clock::time_point::max(), pending.NextDue());
}

TEST(ProgressTest, TellsRatesAndTheTimeLeftOnceItCan) {
  Counts counts;
  counts.added = 5'000;
  counts.bytes = 20'000'000;
  EXPECT_EQ("photo: 5000 files, 500 files/s, 2.0 MB/s", Progress::Line("photo", counts, 10));
  counts.expected = 65'000;
  EXPECT_EQ("photo: 5000 files, 500 files/s, 2.0 MB/s, 2:00 min left",
            Progress::Line("photo", counts, 10));
  counts.unreadable = 2;
  counts.failed = 1;
  EXPECT_EQ("ph?[31moto: 5000 new, 0 changed, 0 unchanged, 0 removed, 3 failed, 10.0 s",
            Progress::Summary("ph\033[31moto", counts, 10));
}

TEST(Compare, AnInodeThatIsGivenOutAgainIsAnotherFile) {
  index::Entry entry;
  entry.stamp = {1, 2, 3, 4, 5};
  Found found;
  found.type = FileType::kFile;
  found.stamp = entry.stamp;
  found.stamp.ctime_ns = 7;
  EXPECT_TRUE(SameContent(entry, found));
  found.stamp.born_ns = 6;
  EXPECT_FALSE(SameContent(entry, found));
}

}  // namespace
}  // namespace maru::indexer::test
