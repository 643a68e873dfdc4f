#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "common/error.h"

/// Compact records of the index's own: numbers as varints, strings with their length before them.
namespace maru::index {

class Encoder {
 public:
  Encoder& Number(std::uint64_t value) {
    while (value >= 0x80) {
      bytes_ += static_cast<char>(value | 0x80);
      value >>= 7;
    }
    bytes_ += static_cast<char>(value);
    return *this;
  }
  /// Signed, small magnitudes short.
  Encoder& Signed(std::int64_t value) {
    return Number((static_cast<std::uint64_t>(value) << 1) ^
                  static_cast<std::uint64_t>(value >> 63));
  }
  Encoder& String(std::string_view value) {
    Number(value.size());
    bytes_ += value;
    return *this;
  }
  std::string Take() { return std::move(bytes_); }
  std::size_t Size() const { return bytes_.size(); }

 private:
  std::string bytes_;
};

inline maruseeker::Error Damaged() {
  return maruseeker::Error(maruseeker::kErrorStorage, "The index is damaged");
}

/// Reads what Encoder wrote; anything else throws Error (121). Borrows the bytes.
class Decoder {
 public:
  explicit Decoder(std::string_view bytes) : bytes_(bytes) {}

  std::uint64_t Number() {
    std::uint64_t value = 0;
    for (unsigned shift = 0; shift < 64; shift += 7) {
      const auto byte = static_cast<unsigned char>(Bytes(1)[0]);
      value |= static_cast<std::uint64_t>(byte & 0x7f) << shift;
      if (byte < 0x80) return value;
    }
    throw Damaged();
  }
  std::uint32_t Number32() {
    const std::uint64_t value = Number();
    if (value > UINT32_MAX) throw Damaged();
    return static_cast<std::uint32_t>(value);
  }
  std::int64_t Signed() {
    const std::uint64_t value = Number();
    return static_cast<std::int64_t>((value >> 1) ^ (~(value & 1) + 1));
  }
  std::string_view String() { return Bytes(Number()); }
  bool AtEnd() const { return bytes_.empty(); }
  /// Bytes not read yet.
  std::size_t Left() const { return bytes_.size(); }

 private:
  std::string_view Bytes(std::uint64_t count) {
    if (count > bytes_.size()) throw Damaged();
    const std::string_view taken = bytes_.substr(0, count);
    bytes_.remove_prefix(count);
    return taken;
  }

  std::string_view bytes_;
};

/// Numbers whose byte order is their order.
inline std::string BigEndian32(std::uint32_t value) {
  return {static_cast<char>(value >> 24), static_cast<char>(value >> 16),
          static_cast<char>(value >> 8), static_cast<char>(value)};
}

}  // namespace maru::index
