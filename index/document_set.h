#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "index/record.h"

namespace maru::index {

/// A set of documents of one database.
class DocumentSet {
 public:
  explicit DocumentSet(DocumentId last) : words_(last / 64 + 1) {}

  void Add(DocumentId id) {
    if (id / 64 < words_.size()) words_[id / 64] |= std::uint64_t{1} << (id % 64);
  }
  bool Has(DocumentId id) const {
    return id / 64 < words_.size() && words_[id / 64] >> (id % 64) & 1;
  }
  std::uint64_t Count() const {
    std::uint64_t count = 0;
    for (const std::uint64_t word : words_) count += CountBits(word);
    return count;
  }
  void Unite(const DocumentSet& other) {
    for (std::size_t i = 0; i < words_.size(); ++i) words_[i] |= other.words_[i];
  }
  /// Calls `use(id)` for each, ascending.
  template <class Use>
  void ForEach(Use&& use) const {
    for (std::size_t i = 0; i < words_.size(); ++i) ForEachBit(i, words_[i], use);
  }
  /// Bit b of word i stands for document 64 i + b.
  const std::vector<std::uint64_t>& Words() const { return words_; }

  static std::uint64_t CountBits(std::uint64_t word) {
    return static_cast<std::uint64_t>(std::popcount(word));
  }
  /// Calls `use(id)` for each document of one word.
  template <class Use>
  static void ForEachBit(std::size_t index, std::uint64_t word, Use&& use) {
    for (; word; word &= word - 1) {
      use(static_cast<DocumentId>(index * 64 + static_cast<unsigned>(std::countr_zero(word))));
    }
  }

 private:
  std::vector<std::uint64_t> words_;
};

}  // namespace maru::index
