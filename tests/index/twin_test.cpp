// Twins: an index, and one without the documents that a user may not read. Whatever the user asks
// of both, the answers are the same to the last bit.

#include <algorithm>
#include <functional>
#include <random>

#include "tests/index/fixture.h"

namespace maru::index::test {
namespace {

const Identity kAlice{60001, {60001}, false};

/// Words that have forms, beginnings and near spellings in common.
const std::vector<std::string> kWords = {
    "sail",  "sails",   "sailing", "sailed", "sailor", "sale", "sales", "salt",   "salty",
    "party", "parties", "part",    "parts",  "partly", "port", "ports", "report", "reports",
    "walk",  "walked",  "walking", "wall",   "walls",  "tide", "tides", "tidy",   "berth"};

class Twins : public testing::Test {
 protected:
  struct File {
    std::size_t folder;
    Document document;
    bool seen;
  };

  ~Twins() override {
    whole_.reset();
    own_.reset();
    std::filesystem::remove_all(root_);
  }

  int Below(int bound) { return std::uniform_int_distribution<int>(0, bound - 1)(random_); }
  std::string Word(bool closed) {
    // Closed documents have words that no other has, too.
    std::string word = kWords[static_cast<std::size_t>(Below(int(kWords.size())))];
    if (Below(closed ? 3 : 12) == 0) word += std::string(1, static_cast<char>('a' + Below(26)));
    if (Below(closed ? 6 : 40) == 0) word.insert(word.size() / 2, closed ? "x" : "e");
    return word;
  }
  std::string Text(bool closed) {
    std::string text;
    const int words = Below(12) ? 3 + Below(40) : 3000;
    for (int i = 0; i < words; ++i) text += Word(closed) + " ";
    return text;
  }

  void Make(int files) {
    for (int i = 0; i < 12; ++i) {
      const auto parent = static_cast<std::size_t>(Below(2) ? Below(i + 1) : 0);
      const bool open = Below(6) > 0;
      folders_.push_back({parent, open, Seen(parent) && open});
    }
    for (int i = 0; i < files; ++i) {
      const auto folder = static_cast<std::size_t>(Below(int(folders_.size()) + 1));
      const bool open = Below(3) > 0;
      File file{folder, {}, Seen(folder) && open};
      file.document.text = Text(!file.seen);
      // Many of one time and one size.
      file.document.name = Word(!file.seen) + " " + std::to_string(i) + ".txt";
      file.document.mtime = 1'700'000'000 + Below(5);
      file.document.size = static_cast<std::uint64_t>(Below(4));
      file.document.rights = {0, 0, static_cast<std::uint16_t>(open ? 0644 : 0600), ""};
      files_.push_back(std::move(file));
    }
    whole_ = Write("fileindex_whole", false);
    own_ = Write("fileindex_own", true);
  }

  /// Everything, or what is seen; each in an order of its own.
  std::unique_ptr<Writer> Write(const std::string& id, bool only_seen) {
    auto writer = std::make_unique<Writer>(root_ + "/" + id);
    std::vector<DirectoryId> ids = {writer->AddDirectory(0, "", {0, 0, 0755, ""})};
    for (std::size_t i = 0; i < folders_.size(); ++i) {
      const auto& [parent, open, seen] = folders_[i];
      ids.push_back(
          only_seen && !seen
              ? 0
              : writer->AddDirectory(ids[parent], "d" + std::to_string(i),
                                     {0, 0, static_cast<std::uint16_t>(open ? 0755 : 0700), ""}));
    }
    std::vector<const File*> order;
    for (const File& file : files_) order.push_back(&file);
    std::shuffle(order.begin(), order.end(), random_);
    std::vector<DocumentId> gone;
    for (const File* file : order) {
      if (only_seen && !file->seen) continue;
      Document document = file->document;
      document.parent = ids[file->folder];
      if (Below(10) == 0) gone.push_back(writer->Add(Prepared(document)));
      writer->Add(Prepared(document));
      if (Below(200) == 0) writer->Commit();
    }
    for (const DocumentId one : gone) writer->Remove(one);
    writer->Commit();
    return writer;
  }

  bool Seen(std::size_t folder) const { return folder == 0 || folders_[folder - 1].seen; }

  Query Tree(int depth) {
    Query query;
    const int form = depth == 0 ? Below(4) : Below(8);
    query.fields = {{std::string(kText), 1}};
    if (Below(2)) query.fields.push_back({std::string(kName), 997.78});
    switch (form) {
      case 0:
      case 1:
        query.kind = Query::Kind::kWord;
        query.words = {Word(Below(2))};
        query.exact = Below(3) == 0;
        return query;
      case 2:
        query.kind = Query::Kind::kPrefix;
        query.words = {Word(Below(2)).substr(0, static_cast<std::size_t>(1 + Below(4)))};
        return query;
      case 3:
        query.kind = Below(3) ? Query::Kind::kPhrase : Query::Kind::kEverything;
        query.words = {Word(false), Word(false)};
        return query;
    }
    constexpr Query::Kind kinds[] = {Query::Kind::kAnd, Query::Kind::kOr, Query::Kind::kAndNot,
                                     Query::Kind::kFilter};
    query.kind = kinds[form - 4];
    for (int parts = 2 + Below(3); parts > 0; --parts) query.parts.push_back(Tree(depth - 1));
    return query;
  }

  /// An answer without document ids, which are the index's own.
  std::string Answer(const std::string& id, const Query& query, const SearchOptions& options) {
    const auto view = library_.Open({id}, kAlice);
    const SearchResult result = view->Search(query, options);
    std::string answer = std::to_string(result.total);
    Highlighter highlighter(*view, query);
    for (const Hit& hit : result.hits) {
      char score[32];
      std::snprintf(score, sizeof(score), "%a", hit.score);
      answer += "\n" + hit.path + " " + score;
      for (const std::string_view field : {kText, kName}) {
        for (const Fragment& fragment : highlighter.FragmentsOf(hit, {std::string(field), 60, 2})) {
          answer += "\n  " + fragment.html;
        }
      }
    }
    for (const std::uint64_t count : view->Count(query, {Query{}})) {
      answer += "\n" + std::to_string(count);
    }
    return answer;
  }
  std::string Suggestions(const std::string& id, const std::string& typed) {
    const auto view = library_.Open({id}, kAlice);
    std::string answer;
    for (const std::string& word : view->Complete("", typed, 5)) answer += word + " ";
    answer += "| ";
    for (const std::string& word : view->Correct(typed, 5)) answer += word + " ";
    return answer;
  }

  static void ExpectSame(const std::string& whole, const std::string& own) {
    const auto at = std::mismatch(whole.begin(), whole.end(), own.begin(), own.end());
    const auto begin = static_cast<std::size_t>(std::max(at.first - whole.begin() - 60, 0l));
    EXPECT_EQ(whole.size(), own.size());
    EXPECT_EQ(whole.substr(begin, 120), own.substr(begin, 120));
  }

  static std::string MakeFolder() {
    char name[] = "/tmp/maru-twins-XXXXXX";
    return mkdtemp(name);
  }

  struct Folder {
    std::size_t parent;
    bool open, seen;
  };
  std::mt19937 random_{3};
  const std::string root_ = MakeFolder();
  std::vector<Folder> folders_;
  std::vector<File> files_;
  Library library_{root_};
  std::unique_ptr<Writer> whole_, own_;
};

TEST_F(Twins, NothingThatIsToldDependsOnWhatIsNotSeen) {
  Make(6000);
  ASSERT_GT(std::ranges::count(files_, true, &File::seen), 1000);
  ASSERT_GT(std::ranges::count(files_, false, &File::seen), 1000);
  std::uint64_t told = 0;
  for (int round = 0; round < 400; ++round) {
    SCOPED_TRACE(round);
    const Query query = Tree(round % 4);
    SearchOptions options;
    options.size = static_cast<std::uint32_t>(Below(4) ? 20 : 0);
    options.from = static_cast<std::uint32_t>(Below(3) ? 0 : 10);
    if (Below(5) == 0) options.sort_field = Below(2) ? kSize : kModTime;
    options.ascending = Below(2);
    const std::string whole = Answer("fileindex_whole", query, options);
    told += whole.size();
    ExpectSame(whole, Answer("fileindex_own", query, options));
    if (HasFailure()) return;
  }
  for (int round = 0; round < 200; ++round) {
    std::string typed = Word(Below(2));
    if (Below(3)) typed.resize(static_cast<std::size_t>(1 + Below(5)));
    const std::string whole = Suggestions("fileindex_whole", typed);
    told += whole.size();
    ASSERT_EQ(whole, Suggestions("fileindex_own", typed)) << typed;
  }
  EXPECT_GT(told, 100'000u);
}

}  // namespace
}  // namespace maru::index::test
