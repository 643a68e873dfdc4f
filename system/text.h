#pragma once

#include <optional>
#include <string>
#include <string_view>

/// Words of settings files and headers.
namespace maru {

/// Without white space at both ends.
inline std::string_view Trimmed(std::string_view text) {
  constexpr std::string_view kSpace = " \t\r\n\v\f";
  const std::size_t start = text.find_first_not_of(kSpace);
  if (start == std::string_view::npos) return {};
  return text.substr(start, text.find_last_not_of(kSpace) - start + 1);
}

inline char Lowered(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c | 0x20) : c;
}

/// ASCII letters compare without case.
inline bool SameWord(std::string_view a, std::string_view b) {
  if (a.size() != b.size()) return false;
  for (std::size_t i = 0; i < a.size(); ++i) {
    if (Lowered(a[i]) != Lowered(b[i])) return false;
  }
  return true;
}

/// With small ASCII letters.
inline std::string Lowered(std::string_view text) {
  std::string lowered(text);
  for (char& c : lowered) c = Lowered(c);
  return lowered;
}

/// yes, true, on, 1 and their opposites, in any case.
inline std::optional<bool> Truth(std::string_view word) {
  for (const std::string_view yes : {"yes", "true", "on", "1"}) {
    if (SameWord(word, yes)) return true;
  }
  for (const std::string_view no : {"no", "false", "off", "0"}) {
    if (SameWord(word, no)) return false;
  }
  return std::nullopt;
}

}  // namespace maru
