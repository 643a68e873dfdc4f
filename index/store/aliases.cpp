#include "index/store/aliases.h"

#include <sodium.h>

#include <algorithm>
#include <cstring>
#include <utility>

namespace maru::index {
namespace {

constexpr unsigned kRounds = 8;
constexpr unsigned kHalfBits = 15;
constexpr std::uint32_t kHalf = (1u << kHalfBits) - 1;
constexpr std::uint32_t kMost = 1u << (2 * kHalfBits);

}  // namespace

std::string Aliases::NewKey() {
  static_assert(sizeof(key_) == crypto_shorthash_KEYBYTES);
  std::string key(crypto_shorthash_KEYBYTES, '\0');
  randombytes_buf(key.data(), key.size());
  return key;
}

Aliases::Aliases(std::string_view key) {
  std::copy_n(key.begin(), std::min(key.size(), key_.size()), key_.begin());
}

std::uint32_t Aliases::Mixed(unsigned round, std::uint32_t half) const {
  const std::array<unsigned char, 3> text{static_cast<unsigned char>(round),
                                          static_cast<unsigned char>(half),
                                          static_cast<unsigned char>(half >> 8)};
  std::array<unsigned char, crypto_shorthash_BYTES> hash;
  crypto_shorthash(hash.data(), text.data(), text.size(), key_.data());
  return (hash[0] | std::uint32_t{hash[1]} << 8) & kHalf;
}

std::uint32_t Aliases::Of(DocumentId id) const {
  std::uint32_t left = id >> kHalfBits & kHalf, right = id & kHalf;
  for (unsigned round = 0; round < kRounds; ++round) {
    left = std::exchange(right, left ^ Mixed(round, right));
  }
  return (left << kHalfBits | right) + 1;
}

DocumentId Aliases::DocumentOf(std::uint32_t alias) const {
  if (alias == 0 || alias > kMost) return 0;
  std::uint32_t left = (alias - 1) >> kHalfBits, right = (alias - 1) & kHalf;
  for (unsigned round = kRounds; round-- > 0;) {
    right = std::exchange(left, right ^ Mixed(round, left));
  }
  return left << kHalfBits | right;
}

}  // namespace maru::index
