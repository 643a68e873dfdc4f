#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>

#include "index/search/columns.h"

namespace maru::index {

/// A bit for each of 64 documents: bit b of word i stands for document 64 i + b.
using Bits = std::uint64_t;

inline constexpr std::size_t kBlockWords = kBlockDocuments / 64;

/// Documents of a block, by their number in it.
using BlockSet = std::array<Bits, kBlockWords>;

inline std::uint64_t CountBits(Bits bits) {
  return static_cast<std::uint64_t>(std::popcount(bits));
}

inline std::uint64_t CountBits(const BlockSet& set) {
  std::uint64_t count = 0;
  for (const Bits bits : set) count += CountBits(bits);
  return count;
}

inline bool HasBit(const BlockSet& set, DocumentId offset) {
  return set[offset / 64] >> (offset % 64) & 1;
}

inline void SetBit(BlockSet& set, DocumentId offset) {
  set[offset / 64] |= Bits{1} << (offset % 64);
}

inline void ClearBit(BlockSet& set, DocumentId offset) {
  set[offset / 64] &= ~(Bits{1} << (offset % 64));
}

/// Calls `use(id)` for each document of the word with this number, ascending.
template <class Use>
void ForEachBit(std::size_t word, Bits bits, Use&& use) {
  for (; bits; bits &= bits - 1) {
    use(static_cast<DocumentId>(word * 64 + static_cast<unsigned>(std::countr_zero(bits))));
  }
}

/// The same for a block.
template <class Use>
void ForEachBit(const BlockSet& set, Use&& use) {
  for (std::size_t word = 0; word < set.size(); ++word) ForEachBit(word, set[word], use);
}

}  // namespace maru::index
