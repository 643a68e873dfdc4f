#include "system/veto.h"

#include <locale.h>
#include <wctype.h>

#include <algorithm>

#include "system/utf8.h"
#include "system/volume_path.h"

namespace maru {
namespace {

/// Stand for bytes that are no part of UTF-8, which equal only themselves.
constexpr char32_t kLoneByte = 0xdc00;

std::u32string Characters(std::string_view text) {
  std::u32string characters;
  for (std::size_t at = 0; at < text.size();) {
    const auto first = static_cast<unsigned char>(text[at]);
    const std::size_t length = first < 0x80 ? 1 : UTF8Length(text, at);
    char32_t character = length == 1 ? first : length == 0 ? kLoneByte + first : 0;
    if (length > 1) character = first & (0x7fu >> length);
    for (std::size_t i = 1; i < length; ++i) {
      character = character << 6 | (static_cast<unsigned char>(text[at + i]) & 0x3fu);
    }
    characters += character;
    at += std::max<std::size_t>(length, 1);
  }
  return characters;
}

locale_t Unicode() {
  static const locale_t locale = newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr);
  return locale;
}

/// As Samba folds: one character at a time, either way.
bool SameCharacter(char32_t a, char32_t b, bool case_sensitive) {
  if (a == b) return true;
  if (case_sensitive || !Unicode()) return false;
  return towupper_l(a, Unicode()) == towupper_l(b, Unicode()) ||
         towlower_l(a, Unicode()) == towlower_l(b, Unicode());
}

/// "*" stands for any characters, "?" for one. The last "*" met is the only one to come back to.
bool Fits(const std::u32string& pattern, const std::u32string& name, bool case_sensitive) {
  std::size_t in_pattern = 0, in_name = 0;
  std::size_t star = pattern.npos, star_name = 0;
  while (in_name < name.size()) {
    if (in_pattern < pattern.size() && pattern[in_pattern] == U'*') {
      star = in_pattern++;
      star_name = in_name;
    } else if (in_pattern < pattern.size() &&
               (pattern[in_pattern] == U'?' ||
                SameCharacter(pattern[in_pattern], name[in_name], case_sensitive))) {
      ++in_pattern;
      ++in_name;
    } else if (star != pattern.npos) {
      in_pattern = star + 1;
      in_name = ++star_name;
    } else {
      return false;
    }
  }
  return pattern.find_first_not_of(U'*', in_pattern) == pattern.npos;
}

}  // namespace

std::vector<std::string> VetoPatterns::Split(std::string_view value) {
  std::vector<std::string> patterns;
  while (!value.empty()) {
    const std::string_view pattern = value.substr(0, value.find('/'));
    value.remove_prefix(std::min(pattern.size() + 1, value.size()));
    if (!pattern.empty()) patterns.emplace_back(pattern);
  }
  return patterns;
}

bool VetoPatterns::Match(std::string_view name) const {
  if (patterns.empty()) return false;
  const std::u32string characters = Characters(name);
  return std::any_of(patterns.begin(), patterns.end(), [&](const std::string& pattern) {
    return Fits(Characters(pattern), characters, case_sensitive);
  });
}

bool VetoPatterns::MatchAny(std::string_view path) const {
  if (patterns.empty()) return false;
  for (std::string_view name = TakeComponent(path); !name.empty(); name = TakeComponent(path)) {
    if (Match(name)) return true;
  }
  return false;
}

}  // namespace maru
