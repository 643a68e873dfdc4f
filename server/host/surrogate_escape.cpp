#include "server/host/surrogate_escape.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <cstdio>
#include <optional>

#include "system/utf8.h"

namespace maru::server {
namespace {

/// Of an escape \uXXXX.
constexpr std::size_t kEscapeLength = 6;

/// The unit of the escape \uXXXX at `at`, or nothing when there is no such escape.
std::optional<unsigned> EscapedUnit(const std::string& text, std::size_t at) {
  unsigned unit = 0;
  if (text.compare(at, 2, "\\u") != 0 || at + kEscapeLength > text.size()) return std::nullopt;
  const char* end = text.data() + at + kEscapeLength;
  if (std::from_chars(text.data() + at + 2, end, unit, 16).ptr != end) return std::nullopt;
  return unit;
}

bool IsWithin(std::optional<unsigned> unit, unsigned first, unsigned last) {
  return unit && *unit >= first && *unit <= last;
}

}  // namespace

std::string EscapeBytes(std::string text) {
  std::string result;
  std::size_t run = 0;  // the start of what is good and not yet in the result
  for (std::size_t at = 0; (at = NextNonASCII(text, at)) < text.size();) {
    const std::size_t length = UTF8Length(text, at);
    if (length > 0) {
      at += length;
      continue;
    }
    char escaped[kEscapeLength + 1];
    snprintf(escaped, sizeof(escaped), "\\udc%02x", static_cast<std::uint8_t>(text[at]));
    result.append(text, run, at - run).append(escaped);
    run = ++at;
  }
  if (run == 0) return text;
  return result.append(text, run);
}

std::string UnescapeBytes(const std::string& text) {
  std::string result;
  result.reserve(text.size());
  std::size_t at = 0;
  while (at < text.size()) {
    const std::size_t escape = std::min(text.find('\\', at), text.size());
    result.append(text, at, escape - at);
    at = escape;
    if (at == text.size()) break;
    const auto unit = EscapedUnit(text, at);
    if (IsWithin(unit, 0xdc80, 0xdcff)) {
      result += static_cast<char>(*unit & 0xff);
      at += kEscapeLength;
      continue;
    }
    const bool pair = IsWithin(unit, 0xd800, 0xdbff) &&
                      IsWithin(EscapedUnit(text, at + kEscapeLength), 0xdc00, 0xdfff);
    const std::size_t length = pair ? 2 * kEscapeLength : unit ? kEscapeLength : 2;
    result.append(text, at, length);
    at += length;
  }
  return result;
}

}  // namespace maru::server
