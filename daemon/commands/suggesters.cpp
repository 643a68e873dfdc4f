#include "daemon/commands/suggesters.h"

#include <algorithm>
#include <array>

#include "daemon/core/page_check.h"
#include "daemon/language/query_tree.h"
#include "index/store/fields.h"
#include "index/text/tokenizer.h"

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
std::vector<std::string> Complete(const SuggestRequest& request) {
  std::vector<std::string> texts;
  const std::vector<Word> words = WordsIn(request.text);
  if (!request.view || words.empty() || words.back().end != request.text.size()) return texts;
  // One more: the word as it stands is among its completions.
  for (const std::string& word :
       request.view->Complete("", words.back().folded, request.limit + 1)) {
    if (word != words.back().folded) texts.push_back(Replaced(request.text, words.back(), word));
  }
  return texts;
}

/// Names with all the words, the last of which may be going on.
index::Query NameQuery(const std::vector<Word>& words, bool last_goes_on) {
  std::vector<index::Query> parts;
  for (const Word& typed : words) {
    index::Query& word = parts.emplace_back();
    word.kind = index::Query::Kind::kWord;
    word.words = {typed.folded};
    word.fields = {{std::string(index::kName), 1}};
    word.exact = true;
  }
  if (last_goes_on) parts.back().kind = index::Query::Kind::kPrefix;
  return Join(index::Query::Kind::kAnd, std::move(parts));
}

std::vector<std::string> Names(const SuggestRequest& request) {
  std::vector<std::string> names;
  const std::vector<Word> words = WordsIn(request.text);
  if (!request.view || words.empty()) return names;
  index::SearchOptions options;
  options.size = static_cast<std::uint32_t>(request.limit);
  const bool last_goes_on = words.back().end == request.text.size();
  const auto hits = request.view->Search(NameQuery(words, last_goes_on), options).hits;
  const std::vector<bool> readable = ReadableNow(request.scope, hits);
  for (std::size_t i = 0; i < hits.size(); ++i) {
    if (readable[i]) names.push_back(hits[i].record.name);
  }
  return names;
}

/// One word at a time put right, the last one first.
std::vector<std::string> Spellings(const SuggestRequest& request) {
  std::vector<std::string> texts;
  std::vector<Word> words = WordsIn(request.text);
  if (!request.view) return texts;
  std::reverse(words.begin(), words.end());
  if (words.size() > kMaxWordsCorrected) words.resize(kMaxWordsCorrected);
  for (const Word& typed : words) {
    for (const std::string& word : request.view->Correct(typed.folded, request.limit)) {
      if (word != typed.folded) texts.push_back(Replaced(request.text, typed, word));
    }
    if (texts.size() >= request.limit) break;
  }
  return texts;
}

/// Earlier searches: first those that begin with the text, then those that hold it.
std::vector<std::string> Earlier(const SuggestRequest& request) {
  if (!request.core.history) return {};
  const std::string wanted = index::Fold(request.text);
  std::vector<std::string> begin, hold;
  for (std::string& keyword : request.core.history(request.uid)) {
    const std::string folded = index::Fold(keyword);
    if (folded.empty() || folded == wanted) continue;
    const std::size_t at = folded.find(wanted);
    if (at == std::string::npos) continue;
    (at == 0 ? begin : hold).push_back(std::move(keyword));
  }
  begin.insert(begin.end(), hold.begin(), hold.end());
  if (begin.size() > request.limit) begin.resize(request.limit);
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

}  // namespace maru::daemon
