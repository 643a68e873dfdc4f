#include "index/text/signature.h"

#include <algorithm>
#include <bit>

namespace maru::index {
namespace {

constexpr std::size_t kLeastBytes = 16;
/// Share of bits set, in percent, up to which a signature is made smaller.
constexpr std::size_t kFull = 40;

bool IsSet(std::string_view signature, std::uint64_t bit) {
  bit &= signature.size() * 8 - 1;
  return static_cast<unsigned char>(signature[bit / 8]) >> (bit % 8) & 1;
}

}  // namespace

std::string SignatureBuilder::Take() {
  std::size_t size = words_.size();
  while (size * 8 > kLeastBytes) {
    const std::size_t half = size / 2;
    std::size_t set = 0;
    for (std::size_t i = 0; i < half; ++i) {
      set += static_cast<std::size_t>(std::popcount(words_[i] | words_[i + half]));
    }
    if (set * 100 > half * 64 * kFull) break;
    for (std::size_t i = 0; i < half; ++i) words_[i] |= words_[i + half];
    size = half;
  }
  std::string signature(reinterpret_cast<const char*>(words_.data()), size * 8);
  std::fill(words_.begin(), words_.end(), 0);
  return signature;
}

bool MayHold(std::string_view signature, std::uint64_t hash) {
  if (signature.empty() || !std::has_single_bit(signature.size())) return true;
  return IsSet(signature, hash) && IsSet(signature, hash >> 32);
}

}  // namespace maru::index
