#include "daemon/commands/suggesters.h"

#include <algorithm>
#include <array>

#include "daemon/core/page_check.h"
#include "index/fields.h"
#include "index/tokenizer.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kMaxWordsCorrected = 8;

struct Word {
  std::string folded;
  std::size_t begin;
  std::size_t end;
};

std::vector<Word> WordsIn(const std::string& text) {
  std::vector<Word> words;
  index::Tokenizer tokenizer;
  tokenizer.ForEach(text, [&](const index::Token& token) {
    words.push_back({std::string(token.word), token.begin, token.end});
    return true;
  });
  return words;
}

/// The text with another word in the typed of one of its own.
std::string Replaced(const std::string& text, const Word& typed, const std::string& word) {
  return text.substr(0, typed.begin) + word + text.substr(typed.end);
}

/// The word being typed: the last one, when the text ends with it.
std::vector<std::string> Complete(const Typing& typing) {
  std::vector<std::string> texts;
  const std::vector<Word> words = WordsIn(typing.text);
  if (!typing.reader || words.empty() || words.back().end != typing.text.size()) return texts;
  // One more: the word as it stands is among its completions.
  for (const std::string& word :
       typing.reader->Complete("", words.back().folded, typing.limit + 1)) {
    if (word != words.back().folded) texts.push_back(Replaced(typing.text, words.back(), word));
  }
  return texts;
}

/// Names with all the words, the last of which may be going on.
index::Query NameQuery(const std::vector<Word>& words, bool last_goes_on) {
  index::Query query;
  query.kind = index::Query::Kind::kAnd;
  for (const Word& typed : words) {
    index::Query word;
    word.kind = last_goes_on && &typed == &words.back() ? index::Query::Kind::kPrefix
                                                        : index::Query::Kind::kWord;
    word.words = {typed.folded};
    word.fields = {{std::string(index::kName), 1}};
    word.exact = true;
    query.parts.push_back(std::move(word));
  }
  return query;
}

std::vector<std::string> Names(const Typing& typing) {
  std::vector<std::string> names;
  const std::vector<Word> words = WordsIn(typing.text);
  if (!typing.reader || words.empty()) return names;
  index::SearchOptions options;
  options.size = static_cast<std::uint32_t>(typing.limit);
  options.cancelled = typing.cancelled;
  const bool last_goes_on = words.back().end == typing.text.size();
  const auto hits = typing.reader->Search(NameQuery(words, last_goes_on), options).hits;
  const std::vector<bool> readable = StillReadable(typing.scope, hits);
  for (std::size_t i = 0; i < hits.size(); ++i) {
    if (readable[i]) names.push_back(hits[i].record.name);
  }
  return names;
}

/// One word at a time put right, the last one first.
std::vector<std::string> Spellings(const Typing& typing) {
  std::vector<std::string> texts;
  std::vector<Word> words = WordsIn(typing.text);
  if (!typing.reader) return texts;
  std::reverse(words.begin(), words.end());
  if (words.size() > kMaxWordsCorrected) words.resize(kMaxWordsCorrected);
  for (const Word& typed : words) {
    for (const std::string& word : typing.reader->Correct(typed.folded, typing.limit)) {
      if (word != typed.folded) texts.push_back(Replaced(typing.text, typed, word));
    }
    if (texts.size() >= typing.limit) break;
  }
  return texts;
}

/// Earlier searches: first those that begin with the text, then those that hold it.
std::vector<std::string> Earlier(const Typing& typing) {
  if (!typing.core.history) return {};
  const std::string wanted = index::Fold(typing.text);
  std::vector<std::string> begin, hold;
  for (std::string& keyword : typing.core.history(typing.uid)) {
    const std::string folded = index::Fold(keyword);
    if (folded.empty() || folded == wanted) continue;
    const std::size_t at = folded.find(wanted);
    if (at == std::string::npos) continue;
    (at == 0 ? begin : hold).push_back(std::move(keyword));
  }
  begin.insert(begin.end(), hold.begin(), hold.end());
  if (begin.size() > typing.limit) begin.resize(typing.limit);
  return begin;
}

constexpr std::array kSuggesters = {
    Suggester{"history", "The user's own earlier searches", true, Earlier},
    Suggester{"completion", "Words of files that complete the word being typed", true, Complete},
    Suggester{"name", "Names of files and folders with the words typed", true, Names},
    Suggester{"spelling", "Words of files that are spelt nearly like a word typed", false,
              Spellings},
};

}  // namespace

std::span<const Suggester> Suggesters() {
  return kSuggesters;
}

const Suggester* FindSuggester(std::string_view name) {
  const auto found = std::find_if(kSuggesters.begin(), kSuggesters.end(),
                                  [&](const Suggester& row) { return row.name == name; });
  return found == kSuggesters.end() ? nullptr : &*found;
}

}  // namespace maru::daemon
