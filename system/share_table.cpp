#include "system/share_table.h"

#include <algorithm>
#include <functional>
#include <limits>
#include <stdexcept>
#include <string_view>

#include "system/text.h"

namespace maru {
namespace {

constexpr std::string_view kHomesByDefault = "/home";
// "fileindex_" and the name make one file name.
constexpr std::size_t kMaxName = 240;

/// One section while it is read.
struct Section {
  ShareSettings share;
  bool printable = false;
  bool global = false;
};

std::vector<std::string> List(std::string_view text) {
  std::vector<std::string> words;
  std::string word;
  bool quoted = false;
  const auto end_word = [&] {
    if (!word.empty()) words.push_back(std::move(word));
    word.clear();
  };
  for (const char c : text) {
    if (c == '"') {
      quoted = !quoted;
    } else if (!quoted && std::string_view(" \t,;").find(c) != std::string_view::npos) {
      end_word();
    } else {
      word += c;
    }
  }
  end_word();
  return words;
}

bool Flag(std::string_view value) {
  const std::optional<bool> truth = Truth(value);
  if (!truth) throw std::runtime_error("must be yes or no");
  return *truth;
}

unsigned int DenyFlags(std::string_view value) {
  unsigned int flags = 0;
  for (const std::string& word : List(value)) {
    if (word != "list" && word != "read") throw std::runtime_error("must be of: list read");
    flags |= word == "list" ? 1 : 4;
  }
  return flags;
}

bool HasRecycle(std::string_view value) {
  const std::vector<std::string> modules = List(value);
  return std::any_of(modules.begin(), modules.end(), [](const std::string& module) {
    return module == "recycle" || module.starts_with("recycle:");
  });
}

struct Parameter {
  std::string_view name;
  void (*set)(Section& section, std::string_view value);
};

/// The parameters that matter here.
constexpr Parameter kParameters[] = {
    {"path", [](Section& s, std::string_view v) { s.share.path = v; }},
    {"available", [](Section& s, std::string_view v) { s.share.available = Flag(v); }},
    {"printable", [](Section& s, std::string_view v) { s.printable = Flag(v); }},
    {"read only", [](Section& s, std::string_view v) { s.share.read_only = Flag(v); }},
    {"hide unreadable", [](Section& s, std::string_view v) { s.share.hide_unreadable = Flag(v); }},
    {"vfs objects", [](Section& s, std::string_view v) { s.share.recycle = HasRecycle(v); }},
    {"valid users", [](Section& s, std::string_view v) { s.share.valid_users = List(v); }},
    {"invalid users", [](Section& s, std::string_view v) { s.share.invalid_users = List(v); }},
    {"read list", [](Section& s, std::string_view v) { s.share.read_list = List(v); }},
    {"write list", [](Section& s, std::string_view v) { s.share.write_list = List(v); }},
    {"maruseeker:index", [](Section& s, std::string_view v) { s.share.index = Flag(v); }},
    {"maruseeker:deny", [](Section& s, std::string_view v) { s.share.deny = DenyFlags(v); }},
};

void Replace(std::string& text, std::string_view what, std::string_view with) {
  for (std::size_t at = 0; (at = text.find(what, at)) != std::string::npos; at += with.size()) {
    text.replace(at, what.size(), with);
  }
}

/// Home folders lie beside each other, in what stands before the user's own component.
std::string HomesFolder(const std::string& path) {
  if (path.empty()) return std::string(kHomesByDefault);
  const std::size_t variable = path.find('%');
  return variable == std::string::npos ? path : path.substr(0, path.rfind('/', variable));
}

/// Makes the path final. False when the section is no folder of one place.
bool Settle(Section& section) {
  ShareSettings& share = section.share;
  if (section.global || section.printable || SameWord(share.name, "printers") ||
      SameWord(share.name, "print$")) {
    return false;
  }
  if (SameWord(share.name, kHomesShare)) {
    share.name = kHomesShare;
    share.path = HomesFolder(share.path);
  }
  Replace(share.path, "%S", share.name);
  if (share.path.empty() || share.path.find('%') != std::string::npos) return false;
  if (!share.path.starts_with('/')) throw std::runtime_error("its path must be absolute");
  while (share.path.size() > 1 && share.path.ends_with('/')) share.path.pop_back();
  return true;
}

void CheckName(std::string_view name) {
  const bool control = std::any_of(name.begin(), name.end(), [](char c) {
    return static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
  });
  if (name.empty() || name.size() > kMaxName || name == "." || name == ".." || control ||
      name.find('/') != name.npos) {
    throw std::runtime_error("is no name of a share");
  }
}

class Parser {
 public:
  std::vector<ShareSettings> Parse(std::string_view text) {
    while (!text.empty()) {
      const std::size_t end = std::min(text.find('\n'), text.size());
      const std::string_view line = Trimmed(text.substr(0, end));
      text.remove_prefix(std::min(end + 1, text.size()));
      ++number_;
      AtLine(line, [&] { Take(line); });
    }
    AtLine("", [&] { EndSection(); });
    std::sort(shares_.begin(), shares_.end(),
              [](const auto& a, const auto& b) { return a.name < b.name; });
    return std::move(shares_);
  }

 private:
  template <class Work>
  void AtLine(std::string_view line, Work work) {
    try {
      work();
    } catch (const std::runtime_error& error) {
      throw std::runtime_error("line " + std::to_string(number_) + ": \"" +
                               std::string(line.substr(0, 200)) + "\" " + error.what());
    }
  }

  void Take(std::string_view line) {
    if (line.empty() || line.starts_with('#') || line.starts_with(';')) return;
    if (line.starts_with('[')) {
      if (!line.ends_with(']')) throw std::runtime_error("is no section");
      EndSection();
      BeginSection(Trimmed(line.substr(1, line.size() - 2)));
      return;
    }
    const std::size_t equals = line.find('=');
    if (equals == line.npos) throw std::runtime_error("is not of the form name = value");
    if (!open_) throw std::runtime_error("stands before any section");
    const std::string_view name = Trimmed(line.substr(0, equals));
    for (const Parameter& parameter : kParameters) {
      if (SameWord(name, parameter.name)) {
        parameter.set(section_, Trimmed(line.substr(equals + 1)));
      }
    }
  }

  void BeginSection(std::string_view name) {
    CheckName(name);
    section_ = defaults_;
    section_.share.name = name;
    section_.global = SameWord(name, "global");
    open_ = true;
  }

  void EndSection() {
    if (!open_) return;
    open_ = false;
    // What [global] says of shares holds where they say nothing.
    if (section_.global) defaults_ = section_;
    if (!Settle(section_)) return;
    for (const ShareSettings& share : shares_) {
      if (SameWord(share.name, section_.share.name)) {
        throw std::runtime_error("follows a second section [" + share.name + "]");
      }
    }
    shares_.push_back(std::move(section_.share));
  }

  int number_ = 0;
  bool open_ = false;
  Section defaults_, section_;
  std::vector<ShareSettings> shares_;
};

}  // namespace

std::string ShareSettings::VolumePath() const {
  return std::string(kVolume) + "/" + name;
}

ShareTable ShareTable::Parse(const std::string& text) {
  ShareTable table;
  table.shares_ = Parser().Parse(text);
  return table;
}

const ShareSettings* ShareTable::Find(const std::string& name) const {
  const auto at = std::lower_bound(
      shares_.begin(), shares_.end(), name,
      [](const ShareSettings& share, const std::string& wanted) { return share.name < wanted; });
  return at != shares_.end() && at->name == name ? &*at : nullptr;
}

}  // namespace maru
