#include "index/text/word_finder.h"

#include <algorithm>
#include <cstring>

namespace maru::index {
namespace {

constexpr std::size_t kBlock = 64;
/// So many beginnings are looked for block by block; more are told apart word by word.
constexpr std::size_t kFewProbes = 6;
/// Words that have so many first letters in common are looked for together, as a word's forms are;
/// when that leaves too many, fewer letters will do.
constexpr std::size_t kBeginning = 3;

std::uint64_t LengthBit(std::size_t length) {
  return std::uint64_t{1} << std::min<std::size_t>(length, 63);
}

bool IsAscii(std::string_view text) {
  std::uint64_t all = 0;
  for (; text.size() >= sizeof all; text.remove_prefix(sizeof all)) {
    std::uint64_t eight;
    std::memcpy(&eight, text.data(), sizeof eight);
    all |= eight;
  }
  for (const char c : text) all |= static_cast<unsigned char>(c);
  return (all & 0x8080808080808080u) == 0;
}

/// Marks the bytes of a block where both bytes of a probe stand. Without branches, for the compiler
/// to make it some instructions on whole registers.
void Mark(const char* __restrict block, std::size_t offset, char first, char last,
          unsigned char* __restrict marks) {
  for (std::size_t i = 0; i < kBlock; ++i) {
    marks[i] |= static_cast<unsigned char>((block[i] | 0x20) == first) &
                static_cast<unsigned char>((block[i + offset] | 0x20) == last);
  }
}

/// The end of a phrase whose first word ends at `at`; 0 when it is another text.
std::size_t EndOfPhrase(std::string_view text, std::size_t at,
                        const std::vector<std::string>& behind) {
  Tokenizer tokenizer;
  Token token;
  std::size_t end = at;
  for (const std::string& word : behind) {
    if (!tokenizer.Next(text, at, token) || token.word != word) return 0;
    end = token.end;
  }
  return end;
}

}  // namespace

WordFinder::WordFinder(const std::vector<MarkGroup>& groups) {
  for (std::size_t number = 0; number < groups.size(); ++number) {
    const MarkGroup& group = groups[number];
    if (group.words.empty()) continue;
    if (group.kind == MarkGroup::Kind::kPhrase) {
      AddWord(group.words[0], {number, false, {group.words.begin() + 1, group.words.end()}});
      continue;
    }
    const bool goes_on = group.kind == MarkGroup::Kind::kPrefix;
    for (const std::string& word : group.words) AddWord(word, {number, goes_on});
  }
  // A longer run than the longest word is cut there: its last byte is not the word's.
  if (std::all_of(words_.begin(), words_.end(), [](const auto& row) {
        return !row.first.empty() && row.first.size() < kMaxWord && IsAscii(row.first);
      })) {
    FindProbes(kBeginning);
  }
}

void WordFinder::AddWord(const std::string& word, Wanted wanted) {
  if (!word.empty()) {
    std::uint64_t& lengths = lengths_[static_cast<unsigned char>(word[0])];
    lengths |= LengthBit(word.size());
    if (wanted.goes_on) lengths |= ~(LengthBit(word.size()) - 1);
  }
  if (wanted.goes_on) beginnings_.insert(word.size());
  words_[word].push_back(std::move(wanted));
}

void WordFinder::FindProbes(std::size_t beginning) {
  std::vector<std::string_view> beginnings;
  for (const auto& [word, wanted] : words_) {
    if (!beginnings.empty()) {
      std::string_view& last = beginnings.back();
      const auto common = static_cast<std::size_t>(
          std::mismatch(last.begin(), last.end(), word.begin(), word.end()).first - last.begin());
      if (common >= std::min(last.size(), beginning)) {
        last = last.substr(0, common);
        continue;
      }
    }
    beginnings.push_back(word);
  }
  if (beginnings.size() > kFewProbes) {
    if (beginning > 1) FindProbes(beginning - 1);
    return;
  }
  for (const std::string_view letters : beginnings) {
    probes_.push_back({letters.front(), letters.back(), letters.size() - 1});
  }
}

/// Where in the block one of the words may begin; near the text's end: everywhere.
void WordFinder::MarkBegins(std::string_view text, std::size_t block, unsigned char* marks) const {
  std::fill_n(marks, kBlock, 0);
  for (const Probe& probe : probes_) {
    if (block + kBlock + probe.offset >= text.size()) {
      std::fill_n(marks, std::min(kBlock, text.size() - block), 1);
      return;
    }
    Mark(text.data() + block, probe.offset, probe.first, probe.last, marks);
  }
}

bool WordFinder::MayBe(std::string_view word) const {
  return lengths_[static_cast<unsigned char>(word[0])] & LengthBit(word.size());
}

template <class Use>
bool WordFinder::Take(std::string_view text, const Token& token, Use& use) const {
  if (!MayBe(token.word)) return true;
  for (const std::size_t length : beginnings_) {
    if (length >= token.word.size()) break;
    if (!TakeWord(text, token, length, use)) return false;
  }
  return TakeWord(text, token, token.word.size(), use);
}

/// Takes the token when its first `length` bytes are wanted.
template <class Use>
bool WordFinder::TakeWord(std::string_view text, const Token& token, std::size_t length,
                          Use& use) const {
  const auto found = words_.find(token.word.substr(0, length));
  if (found == words_.end()) return true;
  for (const Wanted& wanted : found->second) {
    if (length < token.word.size() && !wanted.goes_on) continue;
    const std::size_t end =
        wanted.behind.empty() ? token.end : EndOfPhrase(text, token.end, wanted.behind);
    if (end && !use(Match{token.begin, end, wanted.group})) return false;
  }
  return true;
}

template <class Use>
void WordFinder::ForEachPlain(std::string_view text, Use&& use) const {
  char folded[kMaxWord];
  unsigned char marks[kBlock];
  for (std::size_t block = 0; block < text.size(); block += kBlock) {
    MarkBegins(text, block, marks);
    for (std::size_t at = 0; at < kBlock; ++at) {
      const void* mark = std::memchr(marks + at, 1, kBlock - at);
      if (!mark) break;
      at = static_cast<std::size_t>(static_cast<const unsigned char*>(mark) - marks);
      const std::size_t begin = block + at;
      if (!IsWordByte(text[begin]) || (begin > 0 && IsWordByte(text[begin - 1]))) continue;
      std::size_t end = begin + 1;
      while (end < text.size() && IsWordByte(text[end])) ++end;
      const std::size_t length = std::min(end - begin, kMaxWord);
      if (!(lengths_[static_cast<unsigned char>(FoldAscii(text[begin]))] & LengthBit(length))) {
        continue;
      }
      for (std::size_t i = 0; i < length; ++i) folded[i] = FoldAscii(text[begin + i]);
      if (!Take(text, {std::string_view(folded, length), begin, end}, use)) return;
    }
  }
}

template <class Use>
void WordFinder::ForEach(std::string_view text, Use&& use) const {
  if (!probes_.empty() && IsAscii(text)) return ForEachPlain(text, use);
  Tokenizer tokenizer;
  Token token;
  char folded[kMaxWord];
  std::size_t at = 0;
  while (at < text.size()) {
    const std::size_t begin = at;
    auto byte = static_cast<unsigned char>(text[at]);
    if (byte < 0x80 && !kAsciiFold[byte]) {
      ++at;
      continue;
    }
    // Most words are ASCII through and through and none of those looked for: they are passed over
    // without being folded.
    const auto first = static_cast<unsigned char>(kAsciiFold[byte & 0x7f]);
    while (byte < 0x80 && kAsciiFold[byte]) {
      byte = ++at < text.size() ? static_cast<unsigned char>(text[at]) : ' ';
    }
    if (byte >= 0x80) {
      at = begin;
      if (!tokenizer.Next(text, at, token)) return;
      if (!Take(text, token, use)) return;
      continue;
    }
    const std::size_t length = std::min(at - begin, kMaxWord);
    if (!(lengths_[first] & LengthBit(length))) continue;
    for (std::size_t i = 0; i < length; ++i) {
      folded[i] = kAsciiFold[static_cast<unsigned char>(text[begin + i])];
    }
    token = {std::string_view(folded, length), begin, at};
    if (!Take(text, token, use)) return;
  }
}

std::vector<Match> WordFinder::MatchesIn(std::string_view text) const {
  std::vector<Match> matches;
  ForEach(text, [&](const Match& match) {
    matches.push_back(match);
    return true;
  });
  std::stable_sort(matches.begin(), matches.end(), [](const Match& a, const Match& b) {
    return a.begin != b.begin ? a.begin < b.begin : a.end > b.end;
  });
  return matches;
}

bool WordFinder::AnyIn(std::string_view text) const {
  bool any = false;
  ForEach(text, [&](const Match&) { return !(any = true); });
  return any;
}

}  // namespace maru::index
