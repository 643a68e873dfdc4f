#include "system/share_table.h"

#include <algorithm>
#include <map>
#include <stdexcept>
#include <string_view>
#include <utility>

#include "system/accounts.h"
#include "system/share_parameters.h"
#include "system/text.h"

namespace maru {
namespace {

constexpr std::string_view kHomesByDefault = "/home";
// "fileindex_" and the name make one file name.
constexpr std::size_t kMaxName = 240;

void Replace(std::string& text, std::string_view what, std::string_view with) {
  for (std::size_t at = 0; (at = text.find(what, at)) != std::string::npos; at += with.size()) {
    text.replace(at, what.size(), with);
  }
}

constexpr uid_t kNobody = 65'534;

/// By the ids that Debian gives people.
bool IsPersons(const Account& account) {
  constexpr uid_t kFirst = 1000;
  return account.uid >= kFirst && account.uid < kNobody;
}

/// Where most people's homes lie.
std::string HomesFolder() {
  std::map<std::string, int> folders;
  for (const Account& account : AllAccounts()) {
    const std::size_t slash = account.home.rfind('/');
    const bool is_deep = slash != 0 && slash != std::string::npos;
    if (is_deep && IsPersons(account)) ++folders[account.home.substr(0, slash)];
  }
  const auto most = std::max_element(folders.begin(), folders.end(),
                                     [](auto& a, auto& b) { return a.second < b.second; });
  return most == folders.end() ? std::string(kHomesByDefault) : most->first;
}

bool IsOwnName(const std::vector<std::string>& list) {
  return list == std::vector<std::string>{"%S"};
}

bool NamesShare(const std::vector<std::string>& list) {
  return std::any_of(list.begin(), list.end(),
                     [](const std::string& name) { return name.find("%S") != std::string::npos; });
}

/// Where a folder of each user's own stands in a path, as one component; npos when it does not.
std::size_t PersonalComponent(const std::string& path, bool homes) {
  for (const std::string_view variable : {"/%U", "/%u", "/%S"}) {
    const std::size_t at = path.find(variable);
    if (at == std::string::npos || (variable == "/%S" && !homes)) continue;
    const std::size_t end = at + variable.size();
    if (end == path.size() || path[end] == '/') return at;
  }
  return std::string::npos;
}

void StripSlashes(std::string& path) {
  while (path.size() > 1 && path.ends_with('/')) path.pop_back();
}

/// The folders of users beside each other, instead of the one user's.
void SettlePersonal(ShareSettings& share, bool homes) {
  if (homes && share.path.empty()) {
    share.personal = {.by_home = true, .own_only = IsOwnName(share.valid_users), .inside = {}};
    share.path = HomesFolder();
    return;
  }
  const std::size_t at = PersonalComponent(share.path, homes);
  if (at == std::string::npos) return;
  constexpr std::size_t kComponent = std::string_view("/%U").size();
  share.personal = {.by_home = false,
                    .own_only = share.path[at + 2] != 'S' || IsOwnName(share.valid_users),
                    .inside = share.path.substr(at + kComponent)};
  StripSlashes(share.personal->inside);
  share.path.resize(std::max<std::size_t>(at, 1));
}

/// Whose folder is whose, and whose rights count in it, must not depend on each other.
void CheckPersonal(const ShareSettings& share) {
  const bool others = !share.force_user.empty() || share.guest_only || !share.admin_users.empty();
  if (share.personal->own_only && others) {
    throw std::runtime_error("everybody has a folder of their own, with another's rights in it");
  }
  if (!share.personal->own_only &&
      (NamesShare(share.valid_users) || NamesShare(share.invalid_users))) {
    throw std::runtime_error("each user's folder admits others");
  }
}

void SettlePath(ShareSettings& share) {
  const bool homes = share.name == kHomesShare;
  SettlePersonal(share, homes);
  if (share.personal) CheckPersonal(share);
  if (!homes) Replace(share.path, "%S", share.name);
  if (share.path.empty()) throw std::runtime_error("it has no path");
  if (share.path.find('%') != std::string::npos ||
      (share.personal && share.personal->inside.find('%') != std::string::npos)) {
    throw std::runtime_error("its path " + share.path + " is another for each client");
  }
  if (!share.path.starts_with('/')) {
    throw std::runtime_error("its path " + share.path + " is not absolute");
  }
  StripSlashes(share.path);
}

/// Samba does not take its guest for a person, nor who is forced to the guest's account for the
/// guest: to them it closes also what the account owns.
void CheckForced(const ShareSettings& share) {
  const std::optional<Account> forced = AccountByName(share.force_user);
  const std::optional<Account> guest = AccountByName(share.guest_account);
  if (forced && (forced->uid == kNobody || (guest && forced->uid == guest->uid))) {
    throw std::runtime_error("its user is forced to nobody's account, " + share.force_user);
  }
  if (share.guest_only && guest && IsPersons(*guest)) {
    throw std::runtime_error("its guests have a person's account, " + share.guest_account);
  }
  if (share.guest_only && !share.force_user.empty()) {
    throw std::runtime_error("its guests are forced to another account");
  }
}

/// With lookups Samba knows a client by its name as well.
void CheckHosts(const ShareSection& section, const HostRules& hosts) {
  hosts.Check();
  if (section.hostname_lookups && !hosts.AdmitAll()) {
    throw std::runtime_error("\"hostname lookups\" let names of hosts decide who enters");
  }
}

void CheckName(std::string_view name) {
  const bool control = std::any_of(name.begin(), name.end(), [](char c) {
    return static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
  });
  if (name.empty() || name.size() > kMaxName || name == "." || name == ".." || control ||
      name.find('/') != name.npos) {
    throw std::runtime_error("it has no name for a share");
  }
}

class Parser {
 public:
  void Parse(std::string_view text) {
    while (!text.empty()) {
      const std::size_t end = std::min(text.find('\n'), text.size());
      const std::string_view line = Trimmed(text.substr(0, end));
      text.remove_prefix(std::min(end + 1, text.size()));
      ++number_;
      AtLine(line, [&] { Take(line); });
    }
    EndSection();
  }

  std::vector<ShareSettings> shares;
  std::vector<WithheldShare> withheld;
  std::string samba_state;

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
    SetShareParameter(section_, Trimmed(line.substr(0, equals)), Trimmed(line.substr(equals + 1)));
  }

  void BeginSection(std::string_view name) {
    section_ = defaults_;
    section_.share.name = SameWord(name, kHomesShare) ? kHomesShare : name;
    section_.global = SameWord(name, "global");
    open_ = true;
  }

  void EndSection() {
    if (!std::exchange(open_, false)) return;
    // What [global] says of shares holds where they say nothing.
    if (section_.global) {
      defaults_ = section_;
      samba_state = section_.samba_state;
    } else if (!section_.printable && !SameWord(section_.share.name, "printers") &&
               !SameWord(section_.share.name, "print$")) {
      AddShare();
    }
  }

  void AddShare() {
    ShareSettings& share = section_.share;
    try {
      CheckName(share.name);
      for (const auto& [parameter, reason] : section_.reasons) throw std::runtime_error(reason);
      SettlePath(share);
      CheckSection();
      shares.push_back(share);
    } catch (const std::runtime_error& error) {
      withheld.push_back({share.name, error.what()});
    }
  }

  void CheckSection() {
    section_.share.server_hosts = defaults_.share.hosts;
    CheckHosts(section_, section_.share.hosts);
    CheckHosts(section_, section_.share.server_hosts);
    if ((section_.preexec_close && !section_.preexec.empty()) ||
        (section_.root_preexec_close && !section_.root_preexec.empty())) {
      throw std::runtime_error("a program of \"preexec\" decides who enters");
    }
    CheckForced(section_.share);
    if (section_.hides_apple_double) section_.share.veto.patterns.emplace_back("._*");
  }

  int number_ = 0;
  bool open_ = false;
  ShareSection defaults_, section_;
};

}  // namespace

std::string ShareSettings::VolumePath() const {
  return std::string(kVolume) + "/" + name;
}

bool ShareSettings::IsOpenTo(const ClientAddress& client) const {
  return hosts.Admit(client) && server_hosts.Admit(client);
}

ShareTable ShareTable::Parse(const std::string& text) {
  Parser parser;
  parser.Parse(text);
  ShareTable table;
  table.shares_ = std::move(parser.shares);
  table.withheld_ = std::move(parser.withheld);
  if (!parser.samba_state.empty()) table.samba_state_ = parser.samba_state;
  std::ranges::sort(table.shares_, {}, &ShareSettings::name);
  std::ranges::sort(table.withheld_, {}, &WithheldShare::name);
  table.WithholdTwins();
  return table;
}

/// Names that differ in capitals only are one to Samba.
void ShareTable::WithholdTwins() {
  std::map<std::string, std::vector<std::string>> names;
  const auto add = [&](const std::string& name) { names[Lowered(name)].push_back(name); };
  for (const ShareSettings& share : shares_) add(share.name);
  for (const WithheldShare& share : withheld_) add(share.name);
  for (const auto& [word, twins] : names) {
    for (const std::string& name : twins) {
      if (twins.size() > 1) Withhold(name, "another section has its name");
    }
  }
}

void ShareTable::Withhold(const std::string& name, const std::string& reason) {
  if (std::erase_if(shares_, [&](const auto& share) { return share.name == name; }) == 0) return;
  withheld_.push_back({name, reason});
  std::ranges::sort(withheld_, {}, &WithheldShare::name);
}

bool ShareTable::IsWithheld(const std::string& name) const {
  return std::ranges::any_of(withheld_,
                             [&](const WithheldShare& share) { return share.name == name; });
}

const ShareSettings* ShareTable::Find(const std::string& name) const {
  const auto at = std::lower_bound(
      shares_.begin(), shares_.end(), name,
      [](const ShareSettings& share, const std::string& wanted) { return share.name < wanted; });
  return at != shares_.end() && at->name == name ? &*at : nullptr;
}

}  // namespace maru
