#include "system/samba_text.h"

#include <algorithm>
#include <optional>
#include <string_view>
#include <utility>

#include "system/text.h"
#include "system/whole_file.h"

namespace maru {
namespace {

constexpr std::size_t kMaxFile = 64u << 20;

/// "name = value" of a line of settings; a name may be spelt with any capitals and spaces.
std::optional<std::pair<std::string, std::string>> Assignment(std::string_view line) {
  const std::size_t equals = line.find('=');
  if (equals == line.npos) return std::nullopt;
  std::string name = Lowered(line.substr(0, equals));
  std::erase_if(name, [](char c) { return c == ' ' || c == '\t'; });
  return std::pair(name, std::string(Trimmed(line.substr(equals + 1))));
}

class Includes {
 public:
  void Read(const std::string& path, int depth = 0) {
    std::string text;
    if (depth > kMaxIncludes || !ReadWholeFile(path, kMaxFile, text, Link::kFollow)) return;
    for (std::string_view rest = text; !rest.empty();) {
      std::string line = TakeLine(rest);
      if (line.starts_with('#') || line.starts_with(';')) continue;
      if (line.starts_with('[')) section_ = Lowered(Trimmed(line.substr(1, line.find(']') - 1)));
      if (const auto set = Assignment(line)) Take(set->first, set->second, depth);
    }
  }

  std::map<std::string, std::string> varying;

 private:
  static constexpr int kMaxIncludes = 100;

  /// The next line, with those that it goes on in.
  static std::string TakeLine(std::string_view& rest) {
    std::string line;
    bool goes_on = true;
    while (goes_on && !rest.empty()) {
      const std::size_t end = std::min(rest.find('\n'), rest.size());
      line += Trimmed(rest.substr(0, end));
      rest.remove_prefix(std::min(end + 1, rest.size()));
      goes_on = line.ends_with('\\');
      if (goes_on) line.pop_back();
    }
    return line;
  }

  void Take(const std::string& name, const std::string& value, int depth) {
    if (name == "copy" && varying.contains(Lowered(value))) {
      varying[section_] = varying[Lowered(value)];
    }
    if (name != "include") return;
    if (value.find('%') != value.npos) {
      varying[section_] = value;
    } else {
      Read(value, depth + 1);
    }
  }

  std::string section_ = "global";
};

}  // namespace

std::map<std::string, std::string> VaryingIncludes(const std::string& path) {
  Includes includes;
  includes.Read(path);
  return std::move(includes.varying);
}

std::string WithIncludes(std::string_view text, const std::map<std::string, std::string>& varying) {
  std::string restored;
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(line.size() + 1, text.size()));
    const std::string_view words = Trimmed(line);
    if (words.starts_with("include =")) continue;
    restored.append(line).append("\n");
    if (!words.starts_with('[') || !words.ends_with(']')) continue;
    const auto include = varying.find(Lowered(words.substr(1, words.size() - 2)));
    if (include != varying.end()) restored.append("\tinclude = " + include->second + "\n");
  }
  return restored;
}

std::vector<SambaSection> SectionsOf(std::string_view text, std::string& global) {
  std::vector<SambaSection> sections;
  bool is_global = true;
  while (!text.empty()) {
    const std::string_view line = text.substr(0, text.find('\n'));
    text.remove_prefix(std::min(line.size() + 1, text.size()));
    const std::string_view words = Trimmed(line);
    if (words.starts_with('[')) {
      const std::string name(Trimmed(words.substr(1, words.find(']') - 1)));
      is_global = SameWord(name, "global");
      if (!is_global) sections.push_back({name, {}});
    }
    (is_global ? global : sections.back().text).append(line).append("\n");
  }
  return sections;
}

}  // namespace maru
