#include "index/text/tokenizer.h"

#include <gtest/gtest.h>

#include <random>

namespace maru::index {
namespace {

using Words = std::vector<std::string>;

TEST(Tokenizer, FoldsCaseAccentsAndForms) {
  EXPECT_EQ(WordsOf("Résumé RESUME re\u0301sume\u0301"), (Words{"resume", "resume", "resume"}));
  EXPECT_EQ(WordsOf("ﬁle STRASSE straße ΣΊΣΥΦΟΣ"),
            (Words{"file", "strasse", "strasse", "σισυφοσ"}));
  EXPECT_EQ(WordsOf("foo_bar-baz.txt a1b2"), (Words{"foo", "bar", "baz", "txt", "a1b2"}));
  // Vowel signs are letters to their readers.
  EXPECT_NE(WordsOf("कि"), WordsOf("का"));
}

TEST(Tokenizer, SplitsScriptsWithoutSpaces) {
  EXPECT_EQ(WordsOf("日本語 text日本"), (Words{"日", "本", "語", "text", "日", "本"}));
  EXPECT_EQ(WordsOf("がｶ한국"), (Words{"が", "カ", "한국"}));
  EXPECT_EQ(WordsOf("ที่"), (Words{"ที่"})) << "marks stay with their letter";
}

TEST(Tokenizer, PlacesAreThoseOfTheText) {
  const std::string text = "  Über, 日本!";
  std::vector<std::string> pieces;
  Tokenizer().ForEach(text, [&](const Token& token) {
    pieces.push_back(text.substr(token.begin, token.end - token.begin));
    return true;
  });
  EXPECT_EQ(pieces, (Words{"Über", "日", "本"}));
}

TEST(Tokenizer, NamesAreFoundByTheirParts) {
  EXPECT_EQ(WordsOfName("IMG2034.jpg"), (Words{"img2034", "jpg", "img", "2034"}));
  EXPECT_EQ(WordsOfName("holidayPhotos"), (Words{"holidayphotos", "holiday", "photos"}));
}

TEST(Tokenizer, TakesAnyBytes) {
  EXPECT_EQ(WordsOf("a\xff\xfe b\xc3"), (Words{"a", "b"}));
  EXPECT_EQ(WordsOf("\u0301"), Words{}) << "an accent without a letter is no word";
  EXPECT_EQ(WordsOf("\u0301 a"), Words{"a"});
  std::string endless(100'000, 'x');
  endless += " y";
  const Words words = WordsOf(endless);
  ASSERT_EQ(words.size(), 2u);
  EXPECT_EQ(words[0].size(), kMaxWord);

  std::mt19937 random(1);
  const std::string alphabet[] = {"a",      "Z",    "0",        " ", "é", "日",
                                  "\u0301", "\xff", "\xe6\x97", "ที", "ß"};
  for (int round = 0; round < 2000; ++round) {
    std::string text;
    for (unsigned i = random() % 40; i > 0; --i) text += alphabet[random() % std::size(alphabet)];
    std::size_t last = 0;
    Tokenizer().ForEach(text, [&](const Token& token) {
      EXPECT_LE(last, token.begin);
      EXPECT_LT(token.begin, token.end);
      EXPECT_LE(token.end, text.size());
      EXPECT_FALSE(token.word.empty());
      last = token.end;
      return true;
    });
  }
}

}  // namespace
}  // namespace maru::index
