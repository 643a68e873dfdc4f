#pragma once

#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

/// Which words and neighbours a piece of a text may hold, in a few hundred bytes: a Bloom filter.
/// It says "maybe" for about one in six of those that are not there, and never "no" for one that
/// is.
namespace maru::index {

/// Stored with the texts: the same on every machine and in every version of the format.
inline std::uint64_t Mix(std::uint64_t value) {
  value ^= value >> 32;
  value *= 0xd6e8feb86659fd93u;
  value ^= value >> 32;
  value *= 0xd6e8feb86659fd93u;
  return value ^ value >> 32;
}

inline std::uint64_t HashWord(std::string_view word) {
  std::uint64_t hash = word.size();
  while (word.size() >= 8) {
    std::uint64_t eight;
    std::memcpy(&eight, word.data(), 8);
    hash = Mix(hash ^ eight);
    word.remove_prefix(8);
  }
  std::uint64_t rest = 0;
  if (!word.empty()) std::memcpy(&rest, word.data(), word.size());
  return Mix(hash ^ rest);
}

/// A word right behind another.
inline std::uint64_t HashPair(std::uint64_t first, std::uint64_t second) {
  return Mix(first * 31 + second);
}

class SignatureBuilder {
 public:
  void Add(std::uint64_t hash) {
    Set(hash);
    Set(hash >> 32);
  }
  /// The signature of what was added since the last call.
  std::string Take();

 private:
  static constexpr std::size_t kBits = 1u << 14;

  void Set(std::uint64_t bit) { words_[bit % kBits / 64] |= std::uint64_t{1} << (bit % 64); }

  std::vector<std::uint64_t> words_ = std::vector<std::uint64_t>(kBits / 64);
};

/// `signature` as Take gave it; of another size than those: maybe.
bool MayHold(std::string_view signature, std::uint64_t hash);

}  // namespace maru::index
