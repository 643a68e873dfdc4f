// The order and totals that one pass over the postings gives, beside those of the engine's own
// matcher.

#include <random>
#include <utility>

#include "fixture.h"

namespace maru::index::test {
namespace {

constexpr int kWords = 60;
constexpr int kDocuments = 9000;  // three blocks

class Babble {
 public:
  /// Word 0 is in most texts, the last in few.
  std::string Word() {
    std::geometric_distribution<int> rank(0.08);
    return "w" + std::to_string(std::min(rank(random_), kWords - 1));
  }
  std::string Text() {
    std::string text;
    for (int left = Below(20) + 1; left > 0; --left) text += Word() + " ";
    return text;
  }
  int Below(int bound) { return std::uniform_int_distribution<int>(0, bound - 1)(random_); }

  Query Tree(int depth) {
    Query query;
    const int form = depth == 0 ? Below(2) : Below(7);
    if (form < 2) {
      query.kind = form == 0 ? Query::Kind::kWord : Query::Kind::kPrefix;
      query.words = {form == 0 ? Word() : Word().substr(0, 2)};
      query.fields = {{std::string(kText), 1}, {std::string(kName), 2.5}};
      return query;
    }
    constexpr Query::Kind kinds[] = {Query::Kind::kAnd, Query::Kind::kOr, Query::Kind::kOr,
                                     Query::Kind::kAndNot, Query::Kind::kFilter};
    query.kind = kinds[form - 2];
    for (int parts = 2 + Below(2); parts > 0; --parts) query.parts.push_back(Tree(depth - 1));
    return query;
  }

 private:
  std::mt19937 random_{7};
};

/// The same query, in a form that terms alone do not answer.
Query ForTheEngine(const Query& query) {
  Query any_size;
  any_size.kind = Query::Kind::kRange;
  any_size.field = kSize;
  any_size.high = 1e12;
  Query narrowed;
  narrowed.kind = Query::Kind::kFilter;
  narrowed.parts = {query, any_size};
  return narrowed;
}

/// Sums of the same weights differ in their last digits by the order of adding; who comes first of
/// equals is then anybody's guess, also at the borders of a page.
bool IsTied(const std::vector<Hit>& hits, std::size_t hit) {
  if (hit == 0 || hit + 1 == hits.size()) return true;
  return hits[hit - 1].score - hits[hit].score < 1e-9 ||
         hits[hit].score - hits[hit + 1].score < 1e-9;
}

class MatchesTest : public IndexTest {
 protected:
  void Compare(Reader& reader, const Query& query, const SearchOptions& page) {
    const SearchResult ours = reader.Search(query, page);
    const SearchResult theirs = reader.Search(ForTheEngine(query), page);
    most_ = std::max(most_, ours.total);
    ASSERT_EQ(ours.total, theirs.total);
    ASSERT_EQ(ours.hits.size(), theirs.hits.size());
    for (std::size_t hit = 0; hit < ours.hits.size(); ++hit) {
      EXPECT_NEAR(ours.hits[hit].score, theirs.hits[hit].score, 1e-9);
      if (IsTied(ours.hits, hit)) continue;
      EXPECT_EQ(ours.hits[hit].share, theirs.hits[hit].share);
      EXPECT_EQ(ours.hits[hit].document, theirs.hits[hit].document) << "hit " << hit;
      ++compared_;
    }
  }

  std::uint64_t most_ = 0, compared_ = 0;
};

TEST_F(MatchesTest, AndTheirOrderAreTheEngines) {
  Babble babble;
  Writer other(root_ + "/fileindex_other");
  other.AddDirectory(0, "", Rights(0, 0755));
  std::vector<DocumentId> added;
  const auto add = [&](int documents) {
    for (int i = 0; i < documents; ++i) {
      const FileRights rights = Rights(0, babble.Below(4) ? 0644 : 0600);
      Writer& writer = i % 5 ? *writer_ : other;
      const std::string rare = i % 3000 == 1 ? "rare" : "";
      const DocumentId id =
          writer.Add(Prepared(Doc(babble.Word() + ".txt", babble.Text() + rare, rights)));
      if (i % 5) added.push_back(id);
    }
  };
  add(kDocuments);
  Query rare;
  rare.kind = Query::Kind::kWord;
  rare.words = {"rare"};
  rare.fields = {{std::string(kText), 1}};
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
    other.Commit();
    for (const Identity& who : {Identity{0, {}, true}, Identity{60001, {60001}, false}}) {
      auto reader = library_.Open({"fileindex_photo", "fileindex_other"});
      reader->SetEyes(who);
      for (int i = 0; i < 3; ++i) Compare(*reader, rare, Page(30));
      for (int i = 0; i < 70; ++i) {
        SCOPED_TRACE(i);
        const Query query = babble.Tree(i % 4);
        SearchOptions page = Page(30);
        page.from = static_cast<std::uint32_t>(babble.Below(3) * 20);
        for (int boosts = babble.Below(3); boosts > 0; --boosts) {
          page.boosts[{0, added[static_cast<std::size_t>(babble.Below(2000))]}] = 0.5;
        }
        Compare(*reader, query, page);
      }
    }
  }
  EXPECT_GT(most_, 2000u);
  EXPECT_GT(compared_, 2000u);
}

}  // namespace
}  // namespace maru::index::test
