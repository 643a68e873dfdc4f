#include "index/search/phrase_finder.h"

#include <algorithm>

#include "index/text/signature.h"

namespace maru::index {

PhraseFinder::PhraseFinder(const std::vector<std::string>& words)
    : finder_({MarkGroup{{}, words, MarkGroup::Kind::kPhrase}}) {
  for (std::size_t i = 1; i < words.size(); ++i) {
    pairs_.push_back(HashPair(HashWord(words[i - 1]), HashWord(words[i])));
  }
}

bool PhraseFinder::MayBegin(const StoredText& text, std::size_t chunk) const {
  for (std::size_t i = 0; i < pairs_.size(); ++i) {
    // Each chunk has a word at least: the pair with number i begins at most i chunks further on.
    const std::size_t end = std::min(text.Chunks(), chunk + i + 1);
    bool may = false;
    for (std::size_t at = chunk; !may && at < end; ++at) may = text.MayHold(at, pairs_[i]);
    if (!may) return false;
  }
  return true;
}

bool PhraseFinder::BeginsIn(StoredText& text, std::size_t chunk) {
  buffer_.clear();
  if (!text.Append(chunk, buffer_)) return false;
  if (finder_.AnyIn(buffer_)) return true;
  const std::size_t end = std::min(text.Chunks(), chunk + pairs_.size() + 1);
  while (++chunk < end && text.Append(chunk, buffer_)) {
    if (finder_.AnyIn(buffer_)) return true;
  }
  return false;
}

bool PhraseFinder::IsIn(StoredText& text) {
  for (std::size_t chunk = 0; chunk < text.Chunks(); ++chunk) {
    if (MayBegin(text, chunk) && BeginsIn(text, chunk)) return true;
  }
  return false;
}

}  // namespace maru::index
