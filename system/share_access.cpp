#include "system/share_access.h"

#include <netdb.h>

#include <algorithm>
#include <charconv>
#include <mutex>
#include <optional>

#include "system/accounts.h"
#include "system/text.h"
#include "system/volume_path.h"

namespace maru {
namespace {

bool InNetgroup(const std::string& group, const std::string& user) {
  static std::mutex mutex;  // the C library keeps one search for all threads
  const std::lock_guard lock(mutex);
  return innetgr(group.c_str(), nullptr, user.c_str(), nullptr) == 1;
}

/// Takes `prefix` off, in whatever case.
bool Strip(std::string_view& text, std::string_view prefix) {
  if (!SameWord(text.substr(0, prefix.size()), prefix)) return false;
  text.remove_prefix(prefix.size());
  return true;
}

/// A user before a share.
class Visitor {
 public:
  Visitor(const ShareSettings& share, const std::string& name, const Identity& identity)
      : share_(share), name_(name), identity_(identity) {}

  bool IsOn(const std::vector<std::string>& list) const {
    return std::any_of(list.begin(), list.end(),
                       [&](const std::string& entry) { return IsMeant(entry); });
  }

 private:
  /// By one entry: a user's name or SID, or a group's name behind + (group), & (netgroup) or @
  /// (netgroup, then group).
  bool IsMeant(std::string_view entry) const {
    const std::size_t start = std::min(entry.find_first_not_of("@+&"), entry.size());
    const std::string_view kinds = entry.substr(0, start);
    const std::string name = Expanded(entry.substr(start));
    std::string_view rest = name;
    if (kinds.empty()) {
      if (Strip(rest, "S-1-22-")) return HasSID(rest);
      return SameWord(WithoutDomain(name, "Unix User\\"), name_);
    }
    return (kinds.find_first_of("@&") != kinds.npos && InNetgroup(name, name_)) ||
           (kinds.find_first_of("@+") != kinds.npos &&
            IsInGroup(std::string(WithoutDomain(name, "Unix Group\\"))));
  }

  /// "1-" and a user's id, or "2-" and a group's.
  bool HasSID(std::string_view ids) const {
    const bool is_user = ids.starts_with("1-");
    if (!is_user && !ids.starts_with("2-")) return false;
    ids.remove_prefix(2);
    unsigned int id = 0;
    const auto [end, error] = std::from_chars(ids.data(), ids.data() + ids.size(), id);
    if (error != std::errc() || end != ids.data() + ids.size()) return false;
    return is_user ? id == identity_.uid : identity_.InGroup(id);
  }

  std::string_view WithoutDomain(std::string_view name, std::string_view domain) const {
    const bool is_ours = !share_.server_name.empty() && Strip(name, share_.server_name + "\\");
    if (!is_ours) Strip(name, domain);
    return name;
  }

  /// Samba's variables in a name. In [homes], where everyone enters through a folder of their own,
  /// %S is the user.
  std::string Expanded(std::string_view name) const {
    std::string expanded;
    for (std::size_t i = 0; i < name.size(); ++i) {
      if (name[i] != '%' || i + 1 == name.size()) {
        expanded += name[i];
      } else if (name[++i] == 'S' && share_.name != kHomesShare) {
        expanded += share_.name;
      } else {
        expanded += name_;
      }
    }
    return expanded;
  }

  bool IsInGroup(const std::string& group) const {
    const std::optional<gid_t> gid = GroupByName(group);
    return gid && identity_.InGroup(*gid);
  }

  const ShareSettings& share_;
  const std::string& name_;
  const Identity& identity_;
};

SharePrivilege PrivilegeOf(const ShareSettings& share, const Visitor& user) {
  if (!share.available || user.IsOn(share.invalid_users)) return kSharePrivNone;
  if (!share.valid_users.empty() && !user.IsOn(share.valid_users)) return kSharePrivNone;
  if (user.IsOn(share.write_list)) return kSharePrivReadWrite;
  if (share.read_only || user.IsOn(share.read_list)) return kSharePrivReadOnly;
  return kSharePrivReadWrite;
}

/// With what rights an account is that was not asked for a password: none but root's are without
/// bounds.
std::optional<Identity> ForcedIdentity(const std::string& account) {
  std::optional<Identity> identity = IdentityOfUser(account);
  if (identity) identity->unrestricted = identity->uid == 0;
  return identity;
}

/// Of a forced user a forced group takes the primary group's place.
void LosePrimaryGroup(const std::string& account, gid_t kept, Identity& identity) {
  const std::optional<Account> forced = AccountByName(account);
  if (forced && forced->gid != kept) std::erase(identity.groups, forced->gid);
}

/// False when there is no such group, or who is forced is to be its member and is not.
bool ForceGroup(const ShareSettings& share, Identity& identity) {
  std::string_view group = share.force_group;
  const bool members_only = group.starts_with('+');
  if (members_only) group.remove_prefix(1);
  const std::optional<gid_t> gid = GroupByName(std::string(group));
  if (!gid) return false;
  if (!share.force_user.empty()) LosePrimaryGroup(share.force_user, *gid, identity);
  if (identity.InGroup(*gid)) return true;
  if (members_only) return share.force_user.empty() && !share.guest_only;
  identity.groups.insert(std::ranges::upper_bound(identity.groups, *gid), *gid);
  return true;
}

std::optional<Identity> IdentityIn(const ShareSettings& share, const Identity& session,
                                   const Visitor& user) {
  std::optional<Identity> identity = session;
  if (share.guest_only) {
    identity = ForcedIdentity(share.guest_account);
  }
  if (!share.force_user.empty()) identity = ForcedIdentity(share.force_user);
  if (!identity) return std::nullopt;
  if (!share.force_group.empty() && !ForceGroup(share, *identity)) return std::nullopt;
  if (user.IsOn(share.admin_users)) {
    identity->uid = 0;
    identity->unrestricted = true;
  }
  return identity;
}

}  // namespace

ShareAccess AccessOf(const ShareSettings& share, const std::string& user_name,
                     const Identity& session) {
  const Visitor user(share, user_name, session);
  const SharePrivilege privilege = PrivilegeOf(share, user);
  if (privilege == kSharePrivNone) return {};
  const std::optional<Identity> identity = IdentityIn(share, session, user);
  return identity ? ShareAccess{privilege, *identity} : ShareAccess{};
}

bool Serves(const ShareSettings& share, const std::string& user_name, std::string_view path) {
  if (share.personal) {
    const std::string folder(TakeComponent(path));
    const std::optional<Account> owner = OwnerOfPersonal(share, folder);
    if (!owner || (share.personal->own_only && owner->name != user_name)) return false;
    std::string_view inside = share.personal->inside;
    for (auto name = TakeComponent(inside); !name.empty(); name = TakeComponent(inside)) {
      if (TakeComponent(path) != name) return false;
    }
  }
  return !share.veto.MatchAny(path);
}

std::string PersonalFolderOf(const ShareSettings& share, const Account& account) {
  if (!share.personal->by_home) return account.name;
  std::string_view home = account.home;
  while (home.ends_with('/')) home.remove_suffix(1);
  if (!home.starts_with(share.path + "/")) return {};
  home.remove_prefix(share.path.size() + 1);
  return home.find('/') == home.npos ? std::string(home) : std::string();
}

std::optional<Account> OwnerOfPersonal(const ShareSettings& share, const std::string& folder) {
  if (folder.empty()) return std::nullopt;
  std::optional<Account> owner = AccountByName(folder);
  if (owner && PersonalFolderOf(share, *owner) == folder) return owner;
  if (!share.personal->by_home) return std::nullopt;
  for (const Account& account : AllAccounts()) {
    if (PersonalFolderOf(share, account) == folder) return account;
  }
  return std::nullopt;
}

}  // namespace maru
