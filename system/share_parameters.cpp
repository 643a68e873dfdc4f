#include "system/share_parameters.h"

#include <algorithm>
#include <array>
#include <stdexcept>

#include "system/text.h"

namespace maru {
namespace {

using Section = ShareSection;
using Value = std::string_view;

std::vector<std::string> List(Value text) {
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
    } else if (!quoted && Value(" \t,;").find(c) != Value::npos) {
      end_word();
    } else {
      word += c;
    }
  }
  end_word();
  return words;
}

bool Flag(Value value) {
  const std::optional<bool> truth = Truth(value);
  if (!truth) throw std::runtime_error("must be yes or no");
  return *truth;
}

/// A variable that is not %S, %U or %u, of which nothing is known here.
bool HasForeignVariable(Value text) {
  for (std::size_t at = text.find('%'); at != text.npos; at = text.find('%', at + 2)) {
    if (at + 1 == text.size() || Value("SUu").find(text[at + 1]) == Value::npos) return true;
  }
  return false;
}

/// A list of users and groups, each in a spelling that can be told.
std::vector<std::string> Names(Value value) {
  std::vector<std::string> names = List(value);
  for (const std::string& name : names) {
    const Value bare = Value(name).substr(std::min(name.find_first_not_of("@+&"), name.size()));
    if (HasForeignVariable(bare)) throw std::runtime_error("names somebody by a variable");
    const bool is_sid = bare.starts_with("S-1-") || bare.starts_with("s-1-");
    const bool is_known = bare.size() > 6 && SameWord(bare.substr(0, 6), "S-1-22");
    if ((is_sid && !is_known) || bare.starts_with("BUILTIN\\")) {
      throw std::runtime_error("names somebody who is no account of this machine");
    }
  }
  return names;
}

std::string PlainName(Value value) {
  if (value.find_first_of("%\\") != value.npos) {
    throw std::runtime_error("does not name an account of this machine plainly");
  }
  return std::string(value.size() > 1 && value.front() == '"' && value.back() == '"'
                         ? value.substr(1, value.size() - 2)
                         : value);
}

unsigned int DenyFlags(Value value) {
  unsigned int flags = 0;
  for (const std::string& word : List(value)) {
    if (word != "list" && word != "read") throw std::runtime_error("must be of: list read");
    flags |= word == "list" ? 1 : 4;
  }
  return flags;
}

/// Modules that leave everybody's rights and everybody's names as the file system has them.
constexpr std::array<Value, 19> kHarmless = {
    "recycle",   "audit",         "extd_audit",   "full_audit", "fruit",
    "readahead", "streams_xattr", "shadow_copy2", "btrfs",      "snapper",
    "io_uring",  "aio_pthread",   "aio_fork",     "dirsort",    "default_quota",
    "fileid",    "time_audit",    "syncops",      "preopen",
};

void SetModules(Section& section, Value value) {
  section.share.recycle = section.hides_apple_double = false;
  for (const std::string& module : List(value)) {
    const std::string name = module.substr(0, module.find(':'));
    section.share.recycle |= name == "recycle";
    section.hides_apple_double |= name == "fruit";
    if (std::ranges::find(kHarmless, name) == kHarmless.end()) {
      throw std::runtime_error("has " + name + ", whose rights on files are not judged");
    }
  }
}

void SetVeto(Section& section, Value value) {
  section.share.veto.patterns = VetoPatterns::Split(value);
  if (value.find('%') != value.npos) throw std::runtime_error("is another for each user");
  if (value.find_first_of("<>\"") != value.npos) throw std::runtime_error("has <, > or \"");
}

void SetInclude(Section&, Value value) {
  if (value.find('%') != value.npos) throw std::runtime_error("is another for each client");
}

/// Samba knows no %S here.
void SetAdminUsers(Section& section, Value value) {
  section.share.admin_users = Names(value);
  std::erase_if(section.share.admin_users,
                [](const std::string& name) { return name.find("%S") != name.npos; });
}

void SetRefused(Section&, Value) {
  throw std::runtime_error("is all there is of it");
}

void SetHiddenWhileNew(Section&, Value value) {
  if (value != "0") throw std::runtime_error("hides files for a time");
}

void SetRoot(Section&, Value value) {
  if (!value.empty() && value != "/") throw std::runtime_error("moves all paths");
}

constexpr ShareParameter kParameters[] = {
    {"path",
     "a fixed path; `%S`; or `%U`, `%u` (in `[homes]` also `%S`) as one component: each "
     "user's own folder",
     [](Section& s, Value v) { s.share.path = v; }},
    {"available", "`no`: nobody enters", [](Section& s, Value v) { s.share.available = Flag(v); }},
    {"valid users", "who enters; users, groups, the server's name and SIDs of Unix accounts",
     [](Section& s, Value v) { s.share.valid_users = Names(v); }},
    {"invalid users", "who does not, whatever else is said",
     [](Section& s, Value v) { s.share.invalid_users = Names(v); }},
    {"read list", "who only reads", [](Section& s, Value v) { s.share.read_list = Names(v); }},
    {"write list", "who also writes", [](Section& s, Value v) { s.share.write_list = Names(v); }},
    {"read only", "whether the others write",
     [](Section& s, Value v) { s.share.read_only = Flag(v); }},
    {"admin users", "who has root's rights on files", SetAdminUsers},
    {"force user", "whose rights on files count",
     [](Section& s, Value v) { s.share.force_user = PlainName(v); }},
    {"force group", "a further group; with `+` only for its members",
     [](Section& s, Value v) { s.share.force_group = PlainName(v); }},
    {"guest only", "everybody has the guest account's rights on files",
     [](Section& s, Value v) { s.share.guest_only = Flag(v); }},
    {"guest account", "that account",
     [](Section& s, Value v) { s.share.guest_account = PlainName(v); }},
    {"veto files",
     "entries that nobody finds, with all below them; withheld with variables, and "
     "with `<`, `>` or quotes",
     SetVeto},
    {"case sensitive", "`yes`: veto patterns tell capitals",
     [](Section& s, Value v) { s.share.veto.case_sensitive = !SameWord(v, "auto") && Flag(v); }},
    {"hide unreadable", "as Samba says, where folders are listed",
     [](Section& s, Value v) { s.share.hide_unreadable = Flag(v); }},
    {"vfs objects",
     "`recycle` and others that leave rights alone; withheld with any other, such as "
     "`acl_xattr`",
     SetModules},
    {"hosts allow",
     "from which addresses one enters: `ALL`, addresses, `192.168.`, networks, `EXCEPT`; withheld "
     "with names",
     [](Section& s, Value v) { s.share.hosts.allow = List(v); }},
    {"hosts deny", "from which one does not; the same",
     [](Section& s, Value v) { s.share.hosts.deny = List(v); }},
    {"hostname lookups", "`yes`: withheld with any host named in the two",
     [](Section& s, Value v) { s.hostname_lookups = Flag(v); }},
    {"preexec", "withheld with `preexec close`", [](Section& s, Value v) { s.preexec = v; }},
    {"preexec close", "the same", [](Section& s, Value v) { s.preexec_close = Flag(v); }},
    {"root preexec", "withheld with `root preexec close`",
     [](Section& s, Value v) { s.root_preexec = v; }},
    {"root preexec close", "the same", [](Section& s, Value v) { s.root_preexec_close = Flag(v); }},
    {"include", "withheld with variables; in `[global]` every share", SetInclude},
    {"hide new files timeout", "withheld unless 0", SetHiddenWhileNew},
    {"root directory", "every share withheld unless empty", SetRoot},
    {"netbios name", "what accounts may be called by before a backslash",
     [](Section& s, Value v) { s.share.server_name = v; }},
    {"state directory", "where `share_info.tdb` lies: a share with an ACL of its own is withheld",
     [](Section& s, Value v) { s.samba_state = v; }},
    {"printable", "no share with files", [](Section& s, Value v) { s.printable = Flag(v); }},
    {"maruseeker:refused", "set by MaruSeeker where testparm refuses the section: withheld",
     SetRefused},
    {"maruseeker:index", "`no`: the share is not indexed",
     [](Section& s, Value v) { s.share.index = Flag(v); }},
    {"maruseeker:deny", "`list read`: listing, or reading, through the web is forbidden",
     [](Section& s, Value v) { s.share.deny = DenyFlags(v); }},
};

}  // namespace

std::span<const ShareParameter> ShareParameters() {
  return kParameters;
}

void SetShareParameter(ShareSection& section, std::string_view name, std::string_view value) {
  for (const ShareParameter& parameter : kParameters) {
    if (!SameWord(name, parameter.name)) continue;
    section.reasons.erase(parameter.name);
    try {
      parameter.set(section, value);
    } catch (const std::runtime_error& error) {
      section.reasons[parameter.name] = "\"" + std::string(parameter.name) + " = " +
                                        std::string(value.substr(0, 200)) + "\" " + error.what();
    }
  }
}

}  // namespace maru
