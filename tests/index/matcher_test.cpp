// What one pass over the postings finds, beside what the engine's own matcher does; and what is
// kept from commit to commit, beside what is read anew.

#include <deque>
#include <random>
#include <utility>

#include "tests/index/fixture.h"
#include "tests/index/oracle.h"

namespace maru::index::test {
namespace {

constexpr int kWords = 60;
constexpr int kDocuments = 9000;  // three blocks

const std::vector<std::string> kIds = {"fileindex_photo", "fileindex_other"};
const Identity kAlice{60001, {60001}, false};

class Babble {
 public:
  explicit Babble(unsigned seed) : random_(seed) {}

  /// Word 0 is in most texts, the last in few.
  std::string Word() {
    std::geometric_distribution<int> rank(0.08);
    return "w" + std::to_string(std::min(rank(random_), kWords - 1));
  }
  std::string Text() {
    std::string text;
    for (int left = Below(80) + 1; left > 0; --left) text += Word() + " ";
    return text;
  }
  int Below(int bound) { return std::uniform_int_distribution<int>(0, bound - 1)(random_); }

  Query Tree(int depth) {
    Query query;
    const int form = depth == 0 ? Below(4) : Below(9);
    if (form == 0) {
      query.kind = Query::Kind::kRange;
      query.field = kSize;
      query.low = Below(60);
      query.high = query.low + Below(60);
      return query;
    }
    if (form < 4) {
      constexpr Query::Kind kinds[] = {Query::Kind::kWord, Query::Kind::kPrefix,
                                       Query::Kind::kPhrase};
      query.kind = kinds[form - 1];
      query.fields = {{std::string(kText), 1}, {std::string(kName), 2.5}};
      query.words = {form == 2 ? Word().substr(0, 2) : Word()};
      // The engine knows no words that are weighed as one.
      if (form == 2) query.fields[0].weight = query.fields[1].weight = 0;
      if (form == 3) query.fields = {{std::string(kName), 1}};
      if (form == 3) query.words.push_back(Below(2) ? "txt" : Word());
      return query;
    }
    constexpr Query::Kind kinds[] = {Query::Kind::kAnd, Query::Kind::kOr, Query::Kind::kOr,
                                     Query::Kind::kAndNot, Query::Kind::kFilter};
    query.kind = kinds[form - 4];
    for (int parts = 2 + Below(2); parts > 0; --parts) query.parts.push_back(Tree(depth - 1));
    return query;
  }

 private:
  std::mt19937 random_;
};

/// Sums of the same weights differ in their last digits by the order of adding; who comes first of
/// equals is then anybody's guess, also at the borders of a page.
bool IsTied(const std::vector<Hit>& hits, std::size_t hit) {
  if (hit == 0 || hit + 1 == hits.size()) return true;
  return std::abs(hits[hit - 1].score - hits[hit].score) < 1e-6 ||
         std::abs(hits[hit].score - hits[hit + 1].score) < 1e-6;
}

class MatcherTest : public IndexTest {
 protected:
  MatcherTest() : other_(root_ + "/fileindex_other") {
    other_.AddDirectory(0, "", Rights(0, 0755));
  }

  void Compare(View& view, Oracle& oracle, const Query& query, const SearchOptions& page) {
    const SearchResult ours = view.Search(query, page);
    const auto [theirs, total] = oracle.Search(query, page);
    most_ = std::max(most_, ours.total);
    ASSERT_EQ(ours.total, total);
    ASSERT_EQ(ours.hits.size(), theirs.size());
    for (std::size_t hit = 0; hit < ours.hits.size(); ++hit) {
      if (page.sort_field.empty()) {
        EXPECT_NEAR(ours.hits[hit].score, theirs[hit].weight, 1e-6);
      }
      if (IsTied(ours.hits, hit)) continue;
      EXPECT_EQ(ours.hits[hit].share, theirs[hit].share);
      EXPECT_EQ(ours.hits[hit].document, theirs[hit].document) << "hit " << hit;
      ++compared_;
    }
  }

  Writer other_;
  std::uint64_t most_ = 0, compared_ = 0;
};

TEST_F(MatcherTest, AnswersWhatTheEngineDoes) {
  Babble babble(7);
  std::vector<DocumentId> added;
  const auto add = [&](int documents) {
    for (int i = 0; i < documents; ++i) {
      const FileRights rights = Rights(0, babble.Below(4) ? 0644 : 0600);
      Writer& writer = i % 5 ? *writer_ : other_;
      const std::string rare = i % 3000 == 1 ? "rare" : "";
      const DocumentId id =
          writer.Add(Prepared(Doc(babble.Word() + ".txt", babble.Text() + rare, rights)));
      if (i % 5) added.push_back(id);
    }
  };
  add(kDocuments);
  // What is kept of one state must not be seen in the next.
  for (int state = 0; state < 3; ++state) {
    for (std::size_t i = static_cast<std::size_t>(state); i < added.size(); i += 5) {
      writer_->Remove(std::exchange(added[i], 0));
    }
    std::erase(added, 0);
    std::string often;
    for (int i = 0; i < 70'000; ++i) often += "w7 ";
    writer_->Add(Prepared(Doc("often.txt", often, Rights(0, 0644))));
    add(500);
    writer_->Commit();
    other_.Commit();
    for (const Identity& who : {kRoot, kAlice}) {
      const auto view = library_.Open(kIds, who);
      Oracle oracle(root_, kIds, who);
      for (int i = 0; i < 3; ++i) Compare(*view, oracle, Word("rare"), Page(30));
      for (int i = 0; i < 100; ++i) {
        SCOPED_TRACE(i);
        const Query query = babble.Tree(i % 4);
        SearchOptions page = Page(30);
        page.from = static_cast<std::uint32_t>(babble.Below(3) * 20);
        for (int boosts = babble.Below(3); boosts > 0; --boosts) {
          page.boosts[{0, added[static_cast<std::size_t>(babble.Below(2000))]}] = 0.5;
        }
        if (i % 7 == 6) page.sort_field = kSize;
        page.ascending = i % 2;
        Compare(*view, oracle, query, page);
      }
    }
  }
  EXPECT_GT(most_, 2000u);
  EXPECT_GT(compared_, 1000u);
}

/// Files and folders come, go, change, move, and change their rights, a few in each commit, while
/// one library follows: it answers what a library does that sees the indices for the first time.
TEST_F(MatcherTest, WhatIsKeptIsSetRightByEachCommit) {
  Babble babble(11);
  std::vector<DirectoryId> folders = {Writer::kRoot};
  std::vector<std::pair<DocumentId, Document>> files;
  const auto any = [&](auto& list) {
    return static_cast<std::size_t>(babble.Below(int(list.size())));
  };
  const auto folder_rights = [&] { return Rights(0, babble.Below(3) ? 0755 : 0700); };
  const auto file_rights = [&] { return Rights(0, babble.Below(3) ? 0644 : 0600); };
  const auto new_document = [&] {
    Document document = Doc(babble.Word() + ".txt", babble.Text(), file_rights());
    document.parent = folders[any(folders)];
    return document;
  };
  const auto change = [&](int what) {
    const std::size_t file = any(files);
    auto& [id, document] = files[file];
    switch (what) {
      case 0:
        document = new_document();
        files.emplace_back(writer_->Add(Prepared(document)), document);
        break;
      case 1:
        writer_->Remove(id);
        files.erase(files.begin() + static_cast<std::ptrdiff_t>(file));
        break;
      case 2:
        document.text = babble.Text() + (babble.Below(4) ? "" : "fresh");
        writer_->Replace(id, Prepared(document));
        break;
      case 3:
        document.name = babble.Word() + "new.txt";
        writer_->Update(id, document);
        break;
      case 4:
        document.rights = file_rights();
        document.parent = folders[any(folders)];
        document.size = static_cast<std::uint64_t>(babble.Below(100));
        writer_->Update(id, document);
        break;
      case 5:
        folders.push_back(writer_->AddDirectory(folders[any(folders)], "d", folder_rights()));
        break;
      default:
        if (const std::size_t folder = any(folders); folder > 0) {
          writer_->SetDirectory(folders[folder], folders[any(folders) % folder], "e",
                                folder_rights());
        }
    }
  };
  for (int i = 0; i < 20; ++i) {
    folders.push_back(writer_->AddDirectory(Writer::kRoot, "d", folder_rights()));
  }
  for (int i = 0; i < kDocuments; ++i) {
    Document document = new_document();
    const DocumentId id = writer_->Add(Prepared(document));
    files.emplace_back(id, std::move(document));
  }
  writer_->Commit();
  std::vector<Query> queries = {Word("fresh"), Word("w1"), Word("w1", std::string(kName))};
  for (int i = 0; i < 12; ++i) queries.push_back(babble.Tree(i % 3));
  for (int commit = 0; commit < 40; ++commit) {
    SCOPED_TRACE(commit);
    for (int changes = babble.Below(commit % 10 == 9 ? 2500 : 6); changes >= 0; --changes) {
      change(commit % 4 == 3 ? 6 : babble.Below(7));
    }
    writer_->Commit();
    Library fresh(root_);
    for (const Identity& who : {kRoot, kAlice}) {
      const auto kept = library_.Open({kIds[0]}, who);
      const auto read = fresh.Open({kIds[0]}, who);
      for (const Query& query : queries) {
        SearchOptions page = Page(20);
        if (commit % 2) page.sort_field = kSize;
        const SearchResult ours = kept->Search(query, page);
        const SearchResult theirs = read->Search(query, page);
        ASSERT_EQ(ours.total, theirs.total);
        for (std::size_t i = 0; i < theirs.hits.size(); ++i) {
          ASSERT_NEAR(ours.hits[i].score, theirs.hits[i].score, 1e-6);
          if (IsTied(theirs.hits, i)) continue;
          ASSERT_EQ(ours.hits[i].document, theirs.hits[i].document);
        }
      }
    }
  }
  EXPECT_GT(library_.Cached().found, 10 * library_.Cached().missed);
}

}  // namespace
}  // namespace maru::index::test
