#include <algorithm>
#include <random>

#include "index/text/tokenizer.h"
#include "index/text/word_finder.h"
#include "tests/index/fixture.h"

namespace maru::index::test {
namespace {

using Random = std::mt19937;

/// Texts in which the same few words meet again and again, in all the spellings that fold alike,
/// and of every length up to a dozen chunks.
class Babble {
 public:
  explicit Babble(unsigned seed) : random_(seed) {}

  std::string Text() {
    std::string text;
    const std::size_t words = Below(Below(4) == 0 ? 20'000 : 60);
    for (std::size_t i = 0; i < words; ++i) text += Word() + Blank();
    return text;
  }
  std::vector<std::string> Words(std::size_t count) {
    std::string text;
    while (WordsOf(text).size() < count) text += Word() + " ";
    std::vector<std::string> words = WordsOf(text);
    words.resize(count);
    return words;
  }
  std::size_t Below(std::size_t end) { return random_() % end; }

 private:
  std::string Word() {
    static const std::vector<std::string> kWords = {"red",
                                                    "bluer",
                                                    "Bluest",
                                                    "Red",
                                                    "RED",
                                                    "r\xc3\xa9"
                                                    "d",
                                                    "re",
                                                    "\xef\xbd\x92"
                                                    "ed",
                                                    "blue",
                                                    "Blue",
                                                    "blue2",
                                                    "2",
                                                    "\xe6\x97\xa5",
                                                    "\xe6\x97\xa5\xe6\x9c\xac",
                                                    "\xe8\xaa\x9e",
                                                    "a",
                                                    "i\xcc\x87",
                                                    "stra\xc3\x9f"
                                                    "e",
                                                    "STRASSE",
                                                    "\xff",
                                                    "\xcc\x81",
                                                    "green\xe6\x97\xa5",
                                                    "\xef\xbe\x8a\xef\xbe\x9f"};
    if (Below(300) == 0) return std::string(70, 'x') + (Below(2) ? "" : "y");
    // A few of them are rare, so that a phrase is not in every text.
    return kWords[Below(8) ? Below(8) : Below(kWords.size())];
  }
  std::string Blank() {
    if (Below(400) == 0) return std::string(9'000, ' ');
    static const std::vector<std::string> kBlanks = {" ",  "\n\t",         "_",
                                                     ", ", "\xe3\x80\x82", "\xc2\xa0"};
    return kBlanks[Below(kBlanks.size())];
  }

  Random random_;
};

bool Holds(const std::vector<std::string>& text, const std::vector<std::string>& phrase) {
  return std::search(text.begin(), text.end(), phrase.begin(), phrase.end()) != text.end();
}

TEST(WordFinderTest, FindsWhatTheTokenizerFinds) {
  Babble babble(1);
  for (int round = 0; round < 300; ++round) {
    std::string text = babble.Text();
    // Pure ASCII is gone through in another way.
    if (round % 2) std::erase_if(text, [](char c) { return c < 0; });
    // Also more words than are looked for together, and words of one beginning.
    std::vector<std::string> words_wanted = babble.Words(1 + babble.Below(12));
    std::sort(words_wanted.begin(), words_wanted.end());
    words_wanted.erase(std::unique(words_wanted.begin(), words_wanted.end()), words_wanted.end());
    using Kind = MarkGroup::Kind;
    const std::vector<MarkGroup> groups = {{"", words_wanted},
                                           {"", babble.Words(2), Kind::kPhrase},
                                           {"", {babble.Words(1)[0].substr(0, 1)}, Kind::kPrefix}};
    std::vector<std::pair<std::size_t, std::size_t>> expected;
    std::vector<Token> tokens;
    std::vector<std::string> words;
    Tokenizer().ForEach(text, [&](const Token& token) {
      tokens.push_back(token);
      words.emplace_back(token.word);
      return true;
    });
    for (std::size_t i = 0; i < tokens.size(); ++i) {
      for (const MarkGroup& group : groups) {
        const bool phrase = group.kind == Kind::kPhrase;
        const bool here = phrase ? i + 1 < words.size() && words[i] == group.words[0] &&
                                       words[i + 1] == group.words[1]
                          : group.kind == Kind::kPrefix
                              ? words[i].starts_with(group.words[0])
                              : std::ranges::count(group.words, words[i]) > 0;
        if (here) expected.emplace_back(tokens[i].begin, tokens[i + phrase].end);
      }
    }
    std::vector<std::pair<std::size_t, std::size_t>> found;
    for (const Match& match : WordFinder(groups).MatchesIn(text)) {
      found.emplace_back(match.begin, match.end);
    }
    std::sort(expected.begin(), expected.end());
    std::sort(found.begin(), found.end());
    ASSERT_EQ(found, expected) << round;
  }
}

TEST_F(IndexTest, PhrasesAreFoundWhereverTheyStandInATextAndNowhereElse) {
  Babble babble(2);
  std::vector<std::vector<std::string>> texts;
  for (int i = 0; i < 300; ++i) {
    const std::string text = babble.Text();
    texts.push_back(WordsOf(text));
    Add(std::to_string(i), text);
  }
  writer_->Commit();
  auto reader = Read();
  std::size_t some = 0;
  for (int round = 0; round < 300; ++round) {
    const std::vector<std::string> phrase = babble.Words(2 + babble.Below(4));
    const auto expected = static_cast<std::uint64_t>(std::count_if(
        texts.begin(), texts.end(), [&](const auto& text) { return Holds(text, phrase); }));
    const SearchResult result = reader->Search(Phrase(phrase), Page());
    ASSERT_EQ(result.total, expected) << testing::PrintToString(phrase);
    some += expected > 0 && expected < texts.size();
    for (const Hit& hit : result.hits) {
      const auto fragments =
          Fragments(*reader, hit.document, Phrase(phrase), {std::string(kText), 60, 2});
      ASSERT_FALSE(fragments.empty()) << hit.path << testing::PrintToString(phrase);
      ASSERT_NE(fragments[0].html.find("<mark>"), std::string::npos);
    }
  }
  EXPECT_GT(some, 100u);
}

TEST_F(IndexTest, NothingBetweenTwoWordsMayBeLongerThanAChunk) {
  const DocumentId id = Add("gap", "front " + std::string(3u << 20, ' ') + "middle, rear");
  writer_->Commit();
  EXPECT_EQ(Read()->Search(Phrase({"front", "middle"}), Page()).total, 1u);
  const auto fragments =
      Fragments(*Read(), id, Phrase({"middle", "rear"}), {std::string(kText), 60, 1});
  ASSERT_EQ(fragments.size(), 1u);
  EXPECT_EQ(fragments[0].html, "<mark>middle, rear</mark>");
}

TEST_F(IndexTest, APhraseOfManyTextsEndsWhenNobodyWaits) {
  for (int i = 0; i < 200; ++i) Add(std::to_string(i), "one two");
  writer_->Commit();
  const auto view = library_.Open({"fileindex_photo"}, kRoot, [] { return true; });
  EXPECT_THROW(view->Search(Phrase({"one", "two"}), Page()), Cancelled);
}

}  // namespace
}  // namespace maru::index::test
