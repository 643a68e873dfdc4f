#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "fixture.h"
#include "index/store/fields.h"
#include "system/indexed_shares.h"

namespace maru::indexer::test {
namespace {

class CrawlTest : public ShareTest {};

TEST_F(CrawlTest, IndexesFilesAndFoldersOnceAndThenLeavesThemAlone) {
  Write("a/hello.txt", "hello w\xC3\xB6rld");
  Write("a/b/page.html",
        "<title>Sunset</title><meta name=author content='Ann Bee'>over the harbour");
  Write("latin.txt",
        "Stra\xDF"
        "e und M\xFC"
        "nchen im fr\xFC"
        "hen Nebel");
  Write("picture.jpg", "hello, but nobody looks inside");
  Write("binary", std::string("hello\0there", 11));
  Write("script.run", "#!/bin/sh\nselfextract\n" + std::string(5000, 'x') + '\0' + "\xff\xfe junk");
  Write(
      "bad\xff"
      "name\n.txt",
      "bytes");
  Write(".hidden/x", "hidden");
  Write("empty", "");
  const Outcome outcome = Crawl();
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
  EXPECT_EQ(13u, outcome.added) << "with the share's own folder";
  EXPECT_EQ(0u, outcome.failed);
  EXPECT_EQ(std::set<std::string>{"/a/hello.txt"}, Search("hello"));
  EXPECT_EQ(std::set<std::string>{"/a/b/page.html"}, Search("harbour"));
  EXPECT_EQ(std::set<std::string>{"/a/b/page.html"}, Search("sunset", index::kTitle));
  EXPECT_EQ(std::set<std::string>{"/a/b/page.html"}, Search("bee", index::kAuthors));
  EXPECT_EQ(std::set<std::string>{"/latin.txt"}, Search("munchen"));
  EXPECT_EQ(std::set<std::string>{"/script.run"}, Search("selfextract"));
  EXPECT_EQ(std::set<std::string>{"/bad\xff"
                                  "name\n.txt"},
            Search("bytes"));
  EXPECT_EQ(std::set<std::string>{"/picture.jpg"}, Search("picture", index::kName));
  ExpectNothingToDo();
}

/// A crawl by the lines of a share's settings; whether it is done by their terms.
class TermsTest : public ShareTest {
 protected:
  bool CrawlBy(const std::string& lines) {
    const ShareTable table = ShareTable::Parse("[share]\npath = " + Share() + "\n" + lines);
    const ShareSettings& share = table.Shares().at(0);
    const Target target{share.name, share.path,          IndexFolder(),
                        {},         CrawlTermsOf(share), Selection(share)};
    PrepareIndex(target);
    Counts counts;
    Tree tree(IndexFolder(), counts, nullptr);
    Updater updater(tree, target.selection, TheWorkers(), stop_);
    CrawlByTerms(updater, target, OpenTop(Share()).Get());
    return RecordedCrawlTerms(IndexFolder()) == target.terms;
  }

  std::set<std::string> Paths(const Identity& who = {0, {}, true}) {
    std::set<std::string> paths;
    const auto reader = Read(who);
    for (const index::Hit& hit : All(*reader, {})) paths.insert(hit.path);
    return paths;
  }
};

TEST_F(TermsTest, WhatIsVetoedIsNotIndexed) {
  using Set = std::set<std::string>;
  Write("a/Secret/x", "deep");
  Write("b.bak", "copy");
  EXPECT_TRUE(CrawlBy("veto files = /secret/*.BAK/"));
  EXPECT_EQ(Paths(), (Set{"", "/a"}));
  stop_ = true;
  EXPECT_FALSE(CrawlBy("")) << "cut off, it is of no terms";
  stop_ = false;
  EXPECT_TRUE(CrawlBy(""));
  EXPECT_EQ(Paths(), (Set{"", "/a", "/a/Secret", "/a/Secret/x", "/b.bak"}));
  EXPECT_TRUE(CrawlBy("veto files = /secret/*.BAK/\ncase sensitive = yes"));
  EXPECT_EQ(Paths(), (Set{"", "/a", "/a/Secret", "/a/Secret/x", "/b.bak"}));
}

TEST_F(TermsTest, PersonalFoldersAreTheirOwnersAlone) {
  using Set = std::set<std::string>;
  Write("bin/in/a", "own");
  Write("bin/b", "beside");
  Write("games/in/c", "own");
  Write("nobody here/in/d", "stray");
  Write("e", "stray");
  const Identity bin = IdentityOfUser("bin").value();
  EXPECT_TRUE(CrawlBy("path = " + Share() + "/%U"));
  EXPECT_EQ(Paths(bin), (Set{"/bin", "/bin/b", "/bin/in", "/bin/in/a"}));
  EXPECT_EQ(Paths(), (Set{"", "/bin", "/bin/b", "/bin/in", "/bin/in/a", "/games", "/games/in",
                          "/games/in/c"}));
  EXPECT_TRUE(CrawlBy("path = " + Share() + "/%u/in"));
  EXPECT_EQ(Paths(bin), (Set{"/bin/in", "/bin/in/a"}));
  EXPECT_TRUE(CrawlBy(""));
  EXPECT_EQ(Paths(bin).size(), 12u);
}

TEST_F(CrawlTest, NeverOpensOrFollowsWhatIsNoFileOrFolder) {
  Write("real/file", "real");
  fs::create_symlink("real/file", Share() + "/link");
  fs::create_directory_symlink("..", Share() + "/real/loop");
  fs::create_directory_symlink("/etc", Share() + "/etc");
  ASSERT_EQ(0, mkfifo((Share() + "/pipe.txt").c_str(), 0666));
  const int listener = socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  (Share() + "/socket.txt").copy(address.sun_path, sizeof address.sun_path - 1);
  ASSERT_EQ(0, bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address));
  Write("#recycle/old.txt", "thrown away");
  Write("real/lost+found/x", "recovered");
  Crawl();
  const Snapshot indexed = Indexed();
  EXPECT_EQ(2u, indexed.size());
  EXPECT_TRUE(indexed.contains("/real"));
  EXPECT_TRUE(indexed.contains("/real/file"));
  close(listener);
}

TEST_F(CrawlTest, WhatChangedCostsNoMoreThanItMust) {
  Write("rights.txt", "rights");
  Write("content.txt", "before");
  Write("name.txt", "name");
  Write("gone.txt", "gone");
  Write("tree/sub/leaf.txt", "leaf");
  Write("swap", "file");
  Write("pawn/x", "folder");
  Crawl();
  const index::DocumentId name = DocumentOf("/name.txt");
  const index::DocumentId leaf = DocumentOf("/tree/sub/leaf.txt");

  Chmod("rights.txt", 0600);
  Rename("name.txt", "other.txt");
  Outcome outcome = Crawl();
  EXPECT_EQ(0u, outcome.bytes) << "rights and names are no reason to read";
  EXPECT_EQ(0u, outcome.added + outcome.removed);
  EXPECT_EQ(name, DocumentOf("/other.txt"));
  EXPECT_FALSE(Indexed({12345, {}, false}).contains("/rights.txt"));

  Write("content.txt", "afterwards");
  Remove("gone.txt");
  Remove("swap");
  Write("swap/inside", "now a folder");
  Remove("pawn");
  Write("pawn", "now a file");
  outcome = Crawl();
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
  EXPECT_TRUE(Search("before").empty());
  EXPECT_EQ(1u, Search("afterwards").size());

  // Folders keep their documents when they move: to an earlier place, a later one, into a new one,
  // with another name.
  for (const auto& [from, to] : {std::pair{"tree/sub", "asub"}, {"asub", "zsub"}}) {
    Rename(from, to);
    outcome = Crawl();
    EXPECT_EQ(0u, outcome.added + outcome.removed + outcome.bytes) << to;
    EXPECT_EQ(leaf, DocumentOf(std::string("/") + to + "/leaf.txt"));
  }
  fs::create_directory(Share() + "/new");
  Rename("zsub", "new/sub");
  outcome = Crawl();
  EXPECT_EQ(0u, outcome.bytes);
  EXPECT_EQ(leaf, DocumentOf("/new/sub/leaf.txt"));
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
  ExpectNothingToDo();
}

TEST_F(CrawlTest, AnyMixOfChangesEndsAsIfCrawledAnew) {
  std::mt19937 random = Random();
  for (int round = 0; round < 120; ++round) {
    const int changes = 1 + static_cast<int>(random() % 12);
    for (int i = 0; i < changes; ++i) Mutate(random);
    Crawl();
    ASSERT_EQ("", Differences(OnDisk(), Indexed())) << "round " << round;
    ASSERT_EQ("", Differences(OnDisk(true), Indexed({12345, {}, false}))) << "round " << round;
  }
  ExpectNothingToDo();
}

TEST_F(CrawlTest, TreesDeeperThanAnyPathAreCrawledAndRemoved) {
  constexpr int kDepth = 5'000;
  UniqueFd place(open(Share().c_str(), O_RDONLY | O_DIRECTORY));
  for (int depth = 0; depth < kDepth; ++depth) {
    ASSERT_EQ(0, mkdirat(place.Get(), "d", 0755));
    // A second way to go at some depths, to be found on the way up.
    if (depth % 500 == 0) {
      ASSERT_EQ(0, mkdirat(place.Get(), "e", 0755));
    }
    place = UniqueFd(openat(place.Get(), "d", O_RDONLY | O_DIRECTORY));
  }
  UniqueFd file(openat(place.Get(), "bottom.txt", O_WRONLY | O_CREAT, 0644));
  ASSERT_EQ(6, write(file.Get(), "bottom", 6));
  EXPECT_EQ(kDepth + kDepth / 500 + 2u, Crawl().added);
  EXPECT_EQ(1u, Search("bottom").size());
  ExpectNothingToDo();
  ASSERT_EQ(0, std::system(("rm -rf " + Share() + "/d").c_str()));
  EXPECT_EQ(kDepth + kDepth / 500u, Crawl().removed);
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
}

TEST_F(CrawlTest, AManyThousandFilesLargeFolderIsNoProblem) {
  for (int i = 0; i < 5'000; ++i) Write("f" + std::to_string(i) + ".txt", "common");
  EXPECT_EQ(5'001u, Crawl().added);
  ExpectNothingToDo();
  for (int i = 0; i < 5'000; i += 2) Remove("f" + std::to_string(i) + ".txt");
  EXPECT_EQ(2'500u, Crawl().removed);
  EXPECT_EQ(2'500u, Search("common").size());
}

TEST_F(CrawlTest, FilesThatChangeMeanwhileAreNoError) {
  std::mt19937 setup(1);
  for (int i = 0; i < 300; ++i) Mutate(setup);
  std::atomic<bool> done{false};
  std::thread changer([&] {
    std::mt19937 random(2);
    while (!done) Mutate(random);
  });
  for (int i = 0; i < 10; ++i) Crawl();
  done = true;
  changer.join();
  Crawl();
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
  ExpectNothingToDo();
}

TEST_F(CrawlTest, AStoppedCrawlGoesOnWhereItWas) {
  for (int i = 0; i < 2'000; ++i)
    Write("d" + std::to_string(i % 50) + "/f" + std::to_string(i), "x");
  std::thread stopper([&] {
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    stop_ = true;
  });
  const std::uint64_t first = Crawl().added;
  stopper.join();
  stop_ = false;
  EXPECT_EQ(2'051u, first + Crawl().added);
  EXPECT_EQ("", Differences(OnDisk(), Indexed()));
}

TEST_F(CrawlTest, AnEmptyFolderInPlaceOfTheShareIsADiskThatIsNotThere) {
  Write("a.txt", "precious");
  Crawl();
  fs::rename(Share(), root_ + "/elsewhere");
  fs::create_directory(Share());
  Crawl();
  EXPECT_FALSE(compared_);
  EXPECT_EQ(1u, Search("precious").size());
  fs::remove(Share());
  fs::rename(root_ + "/elsewhere", Share());
  EXPECT_EQ(0u, Crawl().bytes) << "back again, nothing is read";
  Remove("a.txt");
  Crawl();
  EXPECT_TRUE(compared_);
  EXPECT_TRUE(Search("precious").empty());
}

}  // namespace
}  // namespace maru::indexer::test
