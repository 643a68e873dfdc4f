#include "index/text/tokenizer.h"

#include <utf8proc.h>

#include <algorithm>
#include <array>

namespace maru::index {
namespace {

bool Between(char32_t c, char32_t first, char32_t last) {
  return c >= first && c <= last;
}

/// Scripts written without spaces.
bool IsSpaceless(char32_t c) {
  return Between(c, 0x3040, 0x30ff) || Between(c, 0x31f0, 0x31ff) || Between(c, 0x3400, 0x4dbf) ||
         Between(c, 0x4e00, 0x9fff) || Between(c, 0xf900, 0xfaff) || Between(c, 0x20000, 0x3ffff) ||
         Between(c, 0x0e00, 0x0eff) || Between(c, 0x1000, 0x109f) || Between(c, 0x1780, 0x17ff) ||
         Between(c, 0xff66, 0xff9f);
}

/// Accents and vowel points that readers leave out when they type; the vowel signs of Indic and
/// South-East Asian scripts are letters to their readers and stay.
bool IsAccent(char32_t c) {
  return Between(c, 0x0300, 0x036f) || Between(c, 0x0591, 0x05c7) || Between(c, 0x064b, 0x065f) ||
         c == 0x0670 || Between(c, 0x1ab0, 0x1aff) || Between(c, 0x1dc0, 0x1dff) ||
         Between(c, 0x20d0, 0x20ff) || Between(c, 0xfe20, 0xfe2f);
}

enum class Class { kSeparator, kLetter, kMark };

Class ClassOf(char32_t c) {
  switch (utf8proc_category(static_cast<utf8proc_int32_t>(c))) {
    case UTF8PROC_CATEGORY_LU:
    case UTF8PROC_CATEGORY_LL:
    case UTF8PROC_CATEGORY_LT:
    case UTF8PROC_CATEGORY_LM:
    case UTF8PROC_CATEGORY_LO:
    case UTF8PROC_CATEGORY_ND:
    case UTF8PROC_CATEGORY_NL:
    case UTF8PROC_CATEGORY_NO:
      return Class::kLetter;
    case UTF8PROC_CATEGORY_MN:
    case UTF8PROC_CATEGORY_MC:
    case UTF8PROC_CATEGORY_ME:
      return Class::kMark;
    default:
      return Class::kSeparator;
  }
}

std::size_t Decode(std::string_view text, std::size_t at, char32_t& c) {
  utf8proc_int32_t decoded = 0;
  const auto size = utf8proc_iterate(reinterpret_cast<const utf8proc_uint8_t*>(text.data()) + at,
                                     static_cast<utf8proc_ssize_t>(text.size() - at), &decoded);
  if (size <= 0) return 0;
  c = static_cast<char32_t>(decoded);
  return static_cast<std::size_t>(size);
}

/// The folded form of one character; some unfold into several.
struct Folded {
  std::array<utf8proc_int32_t, 32> characters;
  std::size_t count = 0;
};

Folded FoldCharacter(char32_t c) {
  Folded folded;
  // Syllables of Hangul and voiced kana stay whole: taken apart they would be other letters.
  if (Between(c, 0xac00, 0xd7a3) || Between(c, 0x3040, 0x30ff)) {
    folded.characters[0] = static_cast<utf8proc_int32_t>(c);
    folded.count = 1;
    return folded;
  }
  int boundary = 0;
  const auto count =
      utf8proc_decompose_char(static_cast<utf8proc_int32_t>(c), folded.characters.data(),
                              static_cast<utf8proc_ssize_t>(folded.characters.size()),
                              static_cast<utf8proc_option_t>(UTF8PROC_DECOMPOSE | UTF8PROC_COMPAT |
                                                             UTF8PROC_CASEFOLD | UTF8PROC_IGNORE),
                              &boundary);
  folded.count = count > 0 && static_cast<std::size_t>(count) <= folded.characters.size()
                     ? static_cast<std::size_t>(count)
                     : 0;
  return folded;
}

}  // namespace

void Tokenizer::Take(char32_t c, std::size_t& length) {
  const Folded folded = FoldCharacter(c);
  for (std::size_t i = 0; i < folded.count; ++i) {
    const auto character = static_cast<char32_t>(folded.characters[i]);
    if (length >= kMaxWord || IsAccent(character) || ClassOf(character) == Class::kSeparator)
      continue;
    const auto size = utf8proc_encode_char(folded.characters[i],
                                           reinterpret_cast<utf8proc_uint8_t*>(word_ + length));
    length += static_cast<std::size_t>(size);
  }
}

bool Tokenizer::Next(std::string_view text, std::size_t& at, Token& token) {
  std::size_t length = 0;
  std::size_t begin = 0;
  bool in_word = false;
  bool alone = false;
  std::size_t end = 0;
  while (at < text.size()) {
    const auto byte = static_cast<unsigned char>(text[at]);
    if (byte < 0x80) {
      const char folded = kAsciiFold[byte];
      if (folded && !alone) {
        if (!in_word) begin = at;
        in_word = true;
        if (length < kMaxWord) word_[length++] = folded;
        end = ++at;
        continue;
      }
      if (length) break;
      in_word = alone = false;
      ++at;
      continue;
    }
    char32_t c = 0;
    const std::size_t size = Decode(text, at, c);
    const Class kind = size ? ClassOf(c) : Class::kSeparator;
    const bool spaceless = size && IsSpaceless(c) && kind != Class::kSeparator;
    const bool joins = kind == Class::kMark;
    if (kind == Class::kSeparator || (in_word && !joins && (alone || spaceless))) {
      if (length) break;
      in_word = alone = false;
      if (kind == Class::kSeparator) at += size ? size : 1;
      continue;
    }
    if (!in_word) {
      begin = at;
      in_word = true;
      alone = spaceless;
    }
    Take(c, length);
    at += size;
    end = at;
  }
  if (!length) return false;
  token = {std::string_view(word_, length), begin, end};
  return true;
}

bool IsSpacelessWord(std::string_view word) {
  char32_t c = 0;
  return !word.empty() && static_cast<unsigned char>(word[0]) >= 0xe0 && Decode(word, 0, c) &&
         IsSpaceless(c);
}

std::vector<std::string> WordsOf(std::string_view text) {
  std::vector<std::string> words;
  Tokenizer().ForEach(text, [&](const Token& token) {
    words.emplace_back(token.word);
    return true;
  });
  return words;
}

std::vector<std::string> WordsOfName(std::string_view name) {
  std::vector<std::string> words;
  std::vector<std::string> parts;
  const auto kind = [](char c) { return c >= '0' && c <= '9' ? 0 : c >= 'A' && c <= 'Z' ? 1 : 2; };
  Tokenizer().ForEach(name, [&](const Token& token) {
    words.emplace_back(token.word);
    std::size_t from = token.begin;
    const auto add = [&](std::size_t to) {
      if (from == token.begin && to == token.end) return;
      for (std::string& part : WordsOf(name.substr(from, to - from)))
        parts.push_back(std::move(part));
      from = to;
    };
    for (std::size_t i = token.begin + 1; i < token.end; ++i) {
      const int before = kind(name[i - 1]);
      const int here = kind(name[i]);
      if ((before == 0) != (here == 0) || (before == 2 && here == 1)) add(i);
    }
    add(token.end);
    return true;
  });
  words.insert(words.end(), parts.begin(), parts.end());
  return words;
}

std::string Fold(std::string_view text) {
  std::string result;
  std::size_t at = 0;
  while (at < text.size()) {
    char32_t c = 0;
    const std::size_t size = Decode(text, at, c);
    if (!size) {
      result += text[at++];
      continue;
    }
    at += size;
    const Folded folded = FoldCharacter(c);
    for (std::size_t i = 0; i < folded.count; ++i) {
      if (IsAccent(static_cast<char32_t>(folded.characters[i]))) continue;
      utf8proc_uint8_t bytes[4];
      const auto count = utf8proc_encode_char(folded.characters[i], bytes);
      result.append(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(count));
    }
  }
  return result;
}

}  // namespace maru::index
