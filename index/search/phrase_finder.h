#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "index/store/texts.h"
#include "index/text/word_finder.h"

namespace maru::index {

/// A phrase, looked for in stored texts. One thread.
class PhraseFinder {
 public:
  explicit PhraseFinder(const std::vector<std::string>& words);

  bool IsIn(StoredText& text);
  /// Whether the phrase may begin in the chunk.
  bool MayBegin(const StoredText& text, std::size_t chunk) const;

 private:
  bool BeginsIn(StoredText& text, std::size_t chunk);

  WordFinder finder_;
  std::vector<std::uint64_t> pairs_;
  std::string buffer_;
};

}  // namespace maru::index
