#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>

#include "index/record.h"

namespace maru::index {

/// A bit for each of 64 documents: bit b of word i stands for document 64 i + b.
using Bits = std::uint64_t;

inline std::uint64_t CountBits(Bits bits) {
  return static_cast<std::uint64_t>(std::popcount(bits));
}

/// Calls `use(id)` for each document of the word with this number, ascending.
template <class Use>
void ForEachBit(std::size_t word, Bits bits, Use&& use) {
  for (; bits; bits &= bits - 1) {
    use(static_cast<DocumentId>(word * 64 + static_cast<unsigned>(std::countr_zero(bits))));
  }
}

}  // namespace maru::index
