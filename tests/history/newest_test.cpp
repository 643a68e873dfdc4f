#include "history/newest.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "history/journal.h"
#include "history/taking.h"
#include "tests/support/support.h"

namespace {

using maru::history::Journal;
using testing::ElementsAre;

void Search(uid_t uid, const std::string& keyword, std::int64_t time) {
  bool long_enough = false;
  ASSERT_TRUE(Journal::OfService().Add({uid, keyword, time, 0}, long_enough));
}

/// In a child, which opens the database that the test's own folder has.
TEST(NewestSearches, AreThoseOfJournalAndTable) {
  const TempFolder folder;
  Configure(folder);
  EXPECT_EQ(StatusOfChild([] {
              Search(60001, "first", 1);
              Search(60002, "another's", 2);
              Search(60001, "second", 3);
              EXPECT_THAT(maru::history::NewestSearches(60001), ElementsAre("second", "first"));
              std::string error;
              ASSERT_TRUE(maru::history::TakeJournal(error)) << error;
              Search(60001, "third", 4);
              EXPECT_THAT(maru::history::NewestSearches(60001),
                          ElementsAre("third", "second", "first"));
              EXPECT_THAT(maru::history::NewestSearches(60003), ElementsAre());
            }),
            0);
  unlink((folder / "state/history.db-wal").c_str());
  folder.Write("state/history.db", std::string(8192, 'g'));
  EXPECT_EQ(StatusOfChild(
                [] { EXPECT_THAT(maru::history::NewestSearches(60001), ElementsAre("third")); }),
            0);
}

}  // namespace
