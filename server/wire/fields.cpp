#include "server/wire/fields.h"

#include <charconv>
#include <cstdint>
#include <cstring>

namespace maru::server {

std::string PackFields(std::initializer_list<std::string_view> fields) {
  std::string packed;
  for (const std::string_view field : fields) {
    const auto size = static_cast<std::uint32_t>(field.size());
    packed.append(reinterpret_cast<const char*>(&size), sizeof(size));
    packed.append(field);
  }
  return packed;
}

bool TakeField(std::string_view& packed, std::string_view& field) {
  std::uint32_t size;
  if (packed.size() < sizeof(size)) return false;
  memcpy(&size, packed.data(), sizeof(size));
  packed.remove_prefix(sizeof(size));
  if (packed.size() < size) return false;
  field = packed.substr(0, size);
  packed.remove_prefix(size);
  return true;
}

std::optional<unsigned long> ParseNumber(std::string_view text, unsigned long limit) {
  unsigned long number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size() || number > limit)
    return std::nullopt;
  return number;
}

}  // namespace maru::server
