#pragma once

#include <array>
#include <initializer_list>
#include <optional>
#include <string>
#include <string_view>

/// Several texts of any bytes in one, each behind its length (32 bits, this machine's order).
namespace maru::server {

std::string PackFields(std::initializer_list<std::string_view> fields);

/// Takes one text off the front of `packed`; false when it is cut short.
bool TakeField(std::string_view& packed, std::string_view& field);

/// The texts (views into `packed`), or nothing unless it holds exactly N of them.
template <std::size_t N>
std::optional<std::array<std::string_view, N>> UnpackFields(std::string_view packed) {
  std::array<std::string_view, N> fields;
  for (std::string_view& field : fields)
    if (!TakeField(packed, field)) return std::nullopt;
  if (!packed.empty()) return std::nullopt;
  return fields;
}

/// A decimal number without sign, at most `limit`; nothing for any other text.
std::optional<unsigned long> ParseNumber(std::string_view text, unsigned long limit);

}  // namespace maru::server
