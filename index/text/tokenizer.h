#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

/// How text becomes words: the same way for documents, names, queries and highlighting.
///
/// A word is a run of letters, digits and marks, folded: lower case, compatibility forms and
/// accents taken off ("Résumé" and "RESUME" are one word), at most kMaxWord bytes (longer runs are
/// cut there and the rest skipped). In scripts written without spaces (Han, kana, Thai, Lao, Khmer,
/// Myanmar) every character is a word of its own; a query for several of them is a phrase. Bytes
/// that are not UTF-8 separate words. Positions count from 1.
namespace maru::index {

inline constexpr std::size_t kMaxWord = 64;

/// What an ASCII character is in a word, folded; 0: not a part of words.
inline constexpr std::array<char, 128> kAsciiFold = [] {
  std::array<char, 128> table{};
  for (char c = '0'; c <= '9'; ++c) table[static_cast<unsigned char>(c)] = c;
  for (char c = 'a'; c <= 'z'; ++c) {
    table[static_cast<unsigned char>(c)] = c;
    table[static_cast<unsigned char>(c - 'a' + 'A')] = c;
  }
  return table;
}();

/// The same for any byte: 0 also for those of longer characters.
inline char FoldAscii(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return byte < 0x80 ? kAsciiFold[byte] : '\0';
}

/// Whether a byte may be part of a word: all of longer characters may.
inline bool IsWordByte(char c) {
  return static_cast<unsigned char>(c) >= 0x80 || FoldAscii(c);
}

struct Token {
  /// Folded; valid only during the call that hands it over.
  std::string_view word;
  /// Where it stands in the text, in bytes: [begin, end).
  std::size_t begin;
  std::size_t end;
};

/// Splits `text` and keeps the state (a buffer) from call to call. One thread each.
class Tokenizer {
 public:
  /// Calls `use(const Token&)` for each word in order; a `use` that returns false ends the walk.
  template <class Use>
  void ForEach(std::string_view text, Use&& use) {
    std::size_t at = 0;
    Token token;
    while (Next(text, at, token)) {
      if (!use(static_cast<const Token&>(token))) return;
    }
  }

  /// The next word at or behind the byte `at`, which moves behind it; false at the end.
  bool Next(std::string_view text, std::size_t& at, Token& token);

 private:
  void Take(char32_t c, std::size_t& length);

  char word_[kMaxWord + 32];
};

/// Whether a word is a character of a script without spaces. Two of them side by side are a term of
/// their own in the index of a text: the words of those scripts are mostly two or three long.
bool IsSpacelessWord(std::string_view word);

/// The folded words of a short text.
std::vector<std::string> WordsOf(std::string_view text);

/// The words of a file name, as indexed: its words, and the parts of words that change from letters
/// to digits or from lower to upper case ("IMG2034.jpg": img2034, jpg, img, 2034).
std::vector<std::string> WordsOfName(std::string_view name);

/// One word by the same folding, without splitting; for keywords and exact values.
std::string Fold(std::string_view text);

}  // namespace maru::index
