// The small things that are done millions of times.
#include <benchmark/benchmark.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "daemon/language/keyword.h"
#include "index/search/library.h"
#include "index/store/fields.h"
#include "index/store/writer.h"
#include "index/text/fragments.h"
#include "index/text/signature.h"
#include "index/text/tokenizer.h"
#include "system/json.h"

namespace {

using namespace maru::index;
using maru::FileRights;
using maru::Identity;

/// About eight kilobytes of prose-like code, the same each time.
const std::string& Text() {
  static const std::string text = [] {
    std::string made;
    for (unsigned i = 0; made.size() < 8000; ++i) {
      made +=
          "static int harbour_" + std::to_string(i % 37) +
          "(struct ship *ship, unsigned int berth)\n{\n\treturn ship->berth[berth] ? 0 : -EBUSY; "
          "/* the tide is out */\n}\n";
    }
    return made;
  }();
  return text;
}

void Bytes(benchmark::State& state) {
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * Text().size()));
}

void Tokenize(benchmark::State& state) {
  for (auto _ : state) {
    std::uint64_t sum = 0;
    Tokenizer().ForEach(Text(), [&](const Token& token) {
      sum += token.word.size();
      return true;
    });
    benchmark::DoNotOptimize(sum);
  }
  Bytes(state);
}
BENCHMARK(Tokenize);

void PrepareDocument(benchmark::State& state) {
  for (auto _ : state) {
    Document document;
    document.name = "harbour.c";
    document.text = Text();
    benchmark::DoNotOptimize(Prepared(std::move(document)).Size());
  }
  Bytes(state);
}
BENCHMARK(PrepareDocument);

void MatchWords(benchmark::State& state) {
  const WordFinder finder(
      {{"", {"berth", "berths"}}, {"", {"tide", "is", "out"}, MarkGroup::Kind::kPhrase}});
  for (auto _ : state) benchmark::DoNotOptimize(finder.MatchesIn(Text()));
  Bytes(state);
}
BENCHMARK(MatchWords);

void BestFragments(benchmark::State& state) {
  const WordFinder finder({{"", {"berth"}}, {"", {"tide"}}});
  const std::vector<Match> matches = finder.MatchesIn(Text());
  for (auto _ : state) {
    for (const Window& window : BestWindows(Text(), matches, {"", 100, 3})) {
      benchmark::DoNotOptimize(RenderWindow(Text(), window, matches));
    }
  }
}
BENCHMARK(BestFragments);

void ParseAndWriteJson(benchmark::State& state) {
  std::string hit = R"({"MARUMDPath":"/volume1/photo/trip/harbour.jpg","MARUMDFSSize":123456,)"
                    R"("MARUMDFSName":"harbour.jpg","MARUMDIsDir":false,"score":12.5})";
  std::string text = "[";
  for (int i = 0; i < 50; ++i) text += (i ? "," : "") + hit;
  text += "]";
  for (auto _ : state) {
    Json::Value value;
    if (!maru::json::FromString(text, value)) state.SkipWithError("not JSON");
    benchmark::DoNotOptimize(maru::json::ToString(value));
  }
}
BENCHMARK(ParseAndWriteJson);

void ReadKeyword(benchmark::State& state) {
  const std::vector<FieldWeight> fields{{std::string(kName), 3}, {std::string(kText), 1}};
  for (auto _ : state) {
    benchmark::DoNotOptimize(
        maru::daemon::ParseKeyword("harbour (berth OR \"low tide\") -storm ship*", fields));
  }
}
BENCHMARK(ReadKeyword);

void JudgeRights(benchmark::State& state) {
  const Identity who{1000, {100, 1000, 2000}, false};
  const FileRights rights{0, 2000, 0640, ""};
  for (auto _ : state) benchmark::DoNotOptimize(maru::RightsOf(who, rights));
}
BENCHMARK(JudgeRights);

/// An index of a few thousand documents in a folder of its own.
class SmallIndex : public benchmark::Fixture {
 public:
  void SetUp(const benchmark::State&) override {
    char name[] = "/tmp/maru-bench-XXXXXX";
    root_ = mkdtemp(name);
    Writer writer(root_ + "/fileindex_bench");
    const FileRights open{0, 0, 0755, ""};
    writer.AddDirectory(0, "", open);
    for (int i = 0; i < 3000; ++i) {
      Document document;
      document.name = "harbour" + std::to_string(i) + ".c";
      document.parent = Writer::kRoot;
      document.rights = {0, 0, 0644, ""};
      document.text = Text().substr(static_cast<std::size_t>(i) % 500, 2000);
      writer.Add(Prepared(std::move(document)));
    }
    writer.Commit();
    library_ = std::make_unique<Library>(root_);
  }
  void TearDown(const benchmark::State&) override {
    library_.reset();
    std::filesystem::remove_all(root_);
  }

 protected:
  static Query QueryOf(Query::Kind kind, std::vector<std::string> words) {
    Query query;
    query.kind = kind;
    query.words = std::move(words);
    query.fields = {{std::string(kText), 1}};
    return query;
  }

  void Search(benchmark::State& state, const Query& query, const Identity& who) {
    SearchOptions options;
    options.size = 50;
    for (auto _ : state) {
      const SearchResult result = library_->Open({"fileindex_bench"}, who)->Search(query, options);
      if (result.total == 0) state.SkipWithError("nothing found");
    }
  }

  std::string root_;
  std::unique_ptr<Library> library_;
};

const Identity kRoot{0, {}, true};
const Identity kSomebody{1000, {1000}, false};

BENCHMARK_F(SmallIndex, SearchWord)(benchmark::State& state) {
  Search(state, QueryOf(Query::Kind::kWord, {"berth"}), kRoot);
}
BENCHMARK_F(SmallIndex, SearchWordAsSomebody)(benchmark::State& state) {
  Search(state, QueryOf(Query::Kind::kWord, {"berth"}), kSomebody);
}
BENCHMARK_F(SmallIndex, SearchPhrase)(benchmark::State& state) {
  Search(state, QueryOf(Query::Kind::kPhrase, {"tide", "is"}), kRoot);
}
BENCHMARK_F(SmallIndex, StoredFragments)(benchmark::State& state) {
  const Query query = QueryOf(Query::Kind::kWord, {"berth"});
  const FragmentOptions options{std::string(kText), 100, 3};
  const auto view = library_->Open({"fileindex_bench"}, kSomebody);
  const auto hit = view->Find(0, DocumentId{1000});
  Highlighter highlighter(*view, query);
  for (auto _ : state) {
    if (highlighter.FragmentsOf(*hit, options).empty()) state.SkipWithError("no fragment");
  }
}

}  // namespace

BENCHMARK_MAIN();
