#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <random>
#include <thread>

#include "common/error.h"
#include "tests/index/fixture.h"

namespace maru::index::test {
namespace {

using namespace std::string_literals;

TEST_F(IndexTest, FindsWhatWasCommitted) {
  const DocumentId id = Add("report.txt", "The quarterly reports were reported late, 日本語 too.");
  Add("other.txt", "nothing of the kind");
  auto before = Read();
  EXPECT_EQ(before->Search(Word("quarterly"), Page()).total, 0u) << "not before the commit";
  writer_->Commit();

  auto reader = Read();
  const SearchResult found = reader->Search(Word("quarterly"), Page());
  ASSERT_EQ(found.total, 1u);
  ASSERT_EQ(found.hits.size(), 1u);
  EXPECT_EQ(found.hits[0].document, id);
  EXPECT_EQ(found.hits[0].path, "/report.txt");
  EXPECT_EQ(reader->Search(Word("reporting"), Page()).total, 1u) << "by another form of the word";
  EXPECT_EQ(reader->Search(Phrase({"日", "本", "語"}), Page()).total, 1u);
  EXPECT_EQ(reader->Search(Phrase({"日", "語"}), Page()).total, 0u);
  EXPECT_EQ(reader->Search(Word("report", std::string(kName)), Page()).total, 1u);

  Query folders;
  folders.kind = Query::Kind::kValue;
  folders.field = kIsDir;
  folders.text = "1";
  EXPECT_EQ(reader->Search(folders, Page()).hits.at(0).path, "");
}

TEST_F(IndexTest, TotalsPagesAndCountsAreExact) {
  for (int i = 0; i < 300; ++i) {
    Add("f" + std::to_string(i) + (i % 3 ? ".txt" : ".jpg"), "common");
  }
  writer_->Commit();
  auto reader = Read();
  std::set<DocumentId> seen;
  for (std::uint32_t from = 0; from < 300; from += 50) {
    SearchOptions page = Page(50);
    page.from = from;
    const SearchResult result = reader->Search(Word("common"), page);
    EXPECT_EQ(result.total, 300u);
    for (const Hit& hit : result.hits) seen.insert(hit.document);
  }
  EXPECT_EQ(seen.size(), 300u);
  const auto kind = [](const char* name) {
    Query query;
    query.kind = Query::Kind::kValue;
    query.field = kKind;
    query.text = name;
    return query;
  };
  EXPECT_EQ(reader->Count(Word("common"), {kind("image"), kind("document"), kind("audio")}),
            (std::vector<std::uint64_t>{100, 200, 0}));
}

TEST_F(IndexTest, FoldersMoveWithoutTouchingTheirFiles) {
  const FileRights open = Rights(0, 0755);
  const DirectoryId trip = writer_->AddDirectory(Writer::kRoot, "trip", open);
  Document inside = Doc("a.txt", "beach");
  inside.parent = trip;
  writer_->Add(Prepared(inside));
  writer_->Commit();
  EXPECT_EQ(Read()->Search(Word("beach"), Page()).hits.at(0).path, "/trip/a.txt");
  const DirectoryId old = writer_->AddDirectory(Writer::kRoot, "old", open);
  writer_->SetDirectory(trip, old, "2019", open);
  writer_->Commit();
  EXPECT_EQ(Read()->Search(Word("beach"), Page()).hits.at(0).path, "/old/2019/a.txt");
}

TEST_F(IndexTest, ReplacedUpdatedAndRemovedDocumentsKeepTheirIds) {
  const DocumentId id = Add("a.txt", "before");
  writer_->Commit();
  writer_->Replace(id, Prepared(Doc("a.txt", "after")));
  writer_->Commit();
  EXPECT_EQ(Read()->Search(Word("before"), Page()).total, 0u);
  EXPECT_EQ(Read()->Search(Word("after"), Page()).hits.at(0).document, id);

  writer_->Update(id, Doc("renamed.txt", ""));
  writer_->Commit();
  auto reader = Read();
  EXPECT_EQ(reader->Search(Word("after"), Page()).hits.at(0).path, "/renamed.txt");
  EXPECT_EQ(reader->Search(Word("renamed", std::string(kName)), Page()).total, 1u);
  EXPECT_EQ(reader->Search(Word("a", std::string(kName)), Page()).total, 0u);
  EXPECT_EQ(Fragments(*reader, id, Word("after"), {std::string(kText), 100, 1}).size(), 1u)
      << "the text stays";

  writer_->Remove(id);
  writer_->Commit();
  EXPECT_EQ(Read()->Search(Word("after"), Page()).total, 0u);
  EXPECT_FALSE(Read()->Find(0, id));
}

TEST_F(IndexTest, FragmentsMarkMatchesAndEscapeTheRest) {
  std::string text = "<b>start</b> ";
  for (int i = 0; i < 20'000; ++i) text += "filler ";
  text += "\n\tjust & <before> the Needles \"here\" and a red needle there\x01 ";
  for (int i = 0; i < 20'000; ++i) text += "tail ";
  const DocumentId id = Add("long.txt", text);
  writer_->Commit();
  auto reader = Read();
  Query both;
  both.kind = Query::Kind::kAnd;
  both.parts = {Word("needle"), Phrase({"a", "red"})};
  const auto fragments = Fragments(*reader, id, both, {std::string(kText), 100, 3});
  ASSERT_EQ(fragments.size(), 1u);
  EXPECT_NE(fragments[0].html.find("&lt;before&gt; the <mark>Needles</mark> &quot;here&quot; and "
                                   "<mark>a red</mark> <mark>needle</mark> there"),
            std::string::npos)
      << fragments[0].html;
  EXPECT_LT(fragments[0].html.size(), 400u);
  const auto name =
      Fragments(*reader, id, Word("long", std::string(kName)), {std::string(kName), 50, 1});
  ASSERT_EQ(name.size(), 1u);
  EXPECT_EQ(name[0].html, "<mark>long</mark>.txt");
}

TEST_F(IndexTest, FoldersNarrowAndPathsAreFound) {
  const FileRights open = Rights(0, 0755);
  Document folder = Doc("trip", "");
  folder.is_dir = true;
  folder.rights = open;
  const DocumentId folder_id = writer_->Add(Prepared(folder));
  const DirectoryId trip = writer_->AddDirectory(Writer::kRoot, "trip", open);
  Document inside = Doc("a.txt", "beach");
  inside.parent = trip;
  const DocumentId file_id = writer_->Add(Prepared(inside));
  Add("b.txt", "beach");
  writer_->SetEntries(Writer::kRoot, {{"trip", folder_id, trip, {}}});
  writer_->SetEntries(trip, {{"a.txt", file_id, 0, {}}});
  writer_->Commit();
  auto reader = Read();
  Query under;
  under.kind = Query::Kind::kUnder;
  Query query;
  query.kind = Query::Kind::kFilter;
  const std::string photo = "fileindex_photo";
  for (const auto& [index, path, total] :
       {std::tuple(photo, "/trip", 1u), std::tuple(photo, "", 2u), std::tuple(""s, "", 2u),
        std::tuple(photo, "/tri", 0u), std::tuple("fileindex_photos"s, "", 0u),
        std::tuple(photo, "/trip/a.txt", 1u), std::tuple(""s, "/trip", 1u)}) {
    under.field = index;
    under.text = path;
    query.parts = {Word("beach"), under};
    EXPECT_EQ(reader->Search(query, Page()).total, total) << index << path;
  }
  EXPECT_EQ(reader->Find(0, "/trip/a.txt")->document, file_id);
  EXPECT_FALSE(reader->Find(0, "/trip/none"));
  EXPECT_FALSE(reader->Find(0, "/trip/a.txt/deeper"));
}

TEST_F(IndexTest, BoostsSortingAndCancelling) {
  const DocumentId small = Add("small.txt", "word");
  const DocumentId large = Add("large.txt", "word and a good deal of other text behind it");
  writer_->Commit();
  auto reader = Read();
  EXPECT_EQ(reader->Search(Word("word"), Page()).hits.at(0).document, small);
  SearchOptions boosted = Page();
  boosted.boosts[{0, large}] = 1;
  EXPECT_EQ(reader->Search(Word("word"), boosted).hits.at(0).document, large);
  SearchOptions sorted = Page();
  sorted.sort_field = kSize;
  EXPECT_EQ(reader->Search(Word("word"), sorted).hits.at(0).document, large);
  sorted.ascending = true;
  EXPECT_EQ(reader->Search(Word("word"), sorted).hits.at(0).document, small);

  for (int i = 0; i < 5000; ++i) Add("n" + std::to_string(i), "word");
  writer_->Commit();
  const auto cancelled = library_.Open({"fileindex_photo"}, kRoot, [] { return true; });
  EXPECT_THROW(cancelled->Search(Word("word"), Page()), Cancelled);
}

TEST_F(IndexTest, ReadersFollowTheWriterWhileItCommits) {
  for (int i = 0; i < 200; ++i) Add("s" + std::to_string(i), "steady");
  writer_->Commit();
  std::atomic<bool> done = false;
  std::thread searching([&] {
    while (!done) EXPECT_EQ(Read()->Search(Word("steady"), Page(50)).total, 200u);
  });
  for (int round = 0; round < 12; ++round) {
    for (int i = 0; i < 50; ++i) Add("r", "passing round" + std::to_string(round));
    writer_->Commit();
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
  }
  done = true;
  searching.join();
  EXPECT_EQ(Read()->Search(Word("passing"), Page()).total, 600u);
}

TEST_F(IndexTest, AKilledWriterLeavesTheLastCommit) {
  Add("kept.txt", "kept");
  writer_->Commit();
  writer_.reset();
  for (int round = 0; round < 5; ++round) {
    const pid_t child = fork();
    if (child == 0) {
      Writer writer(Path());
      for (int i = 0;; ++i) {
        writer.Add(Prepared(Doc("x", "kept too")));
        writer.Add(Prepared(Doc("y", "kept too")));
        if (i % 20 == 19) writer.Commit();
      }
    }
    usleep(40'000u + 30'000u * static_cast<unsigned>(round));
    kill(child, SIGKILL);
    waitpid(child, nullptr, 0);
    const SearchResult result = Read()->Search(Word("kept"), Page());
    EXPECT_EQ((result.total - 1) % 40, 0u) << "whole commits only";
  }
  Writer again(Path());
  EXPECT_THROW(Writer second(Path()), maruseeker::Error) << "one writer";
}

TEST_F(IndexTest, TextsOfRemovedDocumentsAreGivenBack) {
  std::vector<DocumentId> ids;
  std::mt19937 random(7);
  for (int i = 0; i < 40; ++i) {
    std::string text = "marker" + std::to_string(i) + " ";
    for (int j = 0; j < 5000; ++j) text += std::to_string(random()) + " ";
    ids.push_back(Add("t" + std::to_string(i), text));
  }
  writer_->Commit();
  const auto size = [&] {
    std::uintmax_t sum = 0;
    for (const auto& entry : std::filesystem::directory_iterator(Path())) {
      if (entry.path().filename().string().starts_with("texts.")) sum += entry.file_size();
    }
    return sum;
  };
  const std::uintmax_t before = size();
  for (int i = 0; i < 30; ++i) writer_->Remove(ids[static_cast<std::size_t>(i)]);
  writer_->Commit();
  writer_.reset();
  writer_ = std::make_unique<Writer>(Path());
  EXPECT_LT(size(), before / 2);
  const auto fragments = Fragments(*Read(), ids[35], Word("marker35"), {std::string(kText), 60, 1});
  ASSERT_EQ(fragments.size(), 1u);
  EXPECT_TRUE(fragments[0].html.starts_with("<mark>marker35</mark>"));
}

TEST_F(IndexTest, DamagedAndMissingIndicesAreErrors) {
  EXPECT_THROW(library_.Open({"fileindex_none"}, kRoot), maruseeker::Error);
  EXPECT_THROW(library_.Open({"../etc"}, kRoot), maruseeker::Error);
  Add("a.txt", "word");
  writer_->Commit();
  writer_.reset();
  std::filesystem::remove(Path() + "/texts.1");
  EXPECT_TRUE(Fragments(*Read(), 2, Word("word"), {std::string(kText), 60, 1}).empty());
  for (const auto& entry : std::filesystem::directory_iterator(Path() + "/db")) {
    std::ofstream(entry.path(), std::ios::trunc) << "garbage";
  }
  Library fresh(root_);
  EXPECT_THROW(fresh.Open({"fileindex_photo"}, kRoot)->Search(Word("word"), Page()),
               maruseeker::Error);
}

TEST_F(IndexTest, OversizedQueriesAreRefused) {
  writer_->Commit();
  Query deep = Word("a");
  for (unsigned i = 0; i <= Query::kMaxDepth; ++i) {
    Query outer;
    outer.kind = Query::Kind::kAnd;
    outer.parts = {deep};
    deep = outer;
  }
  EXPECT_THROW(Read()->Search(deep, Page()), maruseeker::Error);
  Query broad;
  broad.kind = Query::Kind::kPrefix;
  broad.words = {"w"};
  broad.fields.assign(Query::kMaxTerms / Query::kWidened + 1, {std::string(kText), 1});
  EXPECT_THROW(Read()->Search(broad, Page()), maruseeker::Error) << "by its form alone";
  broad.fields.pop_back();
  for (int i = 0; i < 150; ++i) Add("n", "w" + std::to_string(i));
  writer_->Commit();
  EXPECT_EQ(Read()->Search(broad, Page()).total, 150u);
  EXPECT_THROW(Read()->Search(Word("a", "NoSuchField"), Page()), maruseeker::Error);
  EXPECT_THROW(Read()->Search(Word("a", std::string(kSize)), Page()), maruseeker::Error);
}

}  // namespace
}  // namespace maru::index::test
