#include <netdb.h>

#include <algorithm>
#include <mutex>
#include <string_view>

#include "system/accounts.h"
#include "system/share_table.h"
#include "system/text.h"

namespace maru {
namespace {

struct Caller {
  const std::string& name;
  const Identity& identity;
};

bool InNetgroup(const std::string& group, const std::string& user) {
  static std::mutex mutex;  // the C library keeps one search for all threads
  const std::lock_guard lock(mutex);
  return innetgr(group.c_str(), nullptr, user.c_str(), nullptr) == 1;
}

bool InGroup(const std::string& group, const Identity& identity) {
  const std::optional<gid_t> gid = GroupByName(group);
  return gid && identity.InGroup(*gid);
}

/// Samba's variables in a name. In [homes], where everyone enters through a folder of their own, %S
/// is the user. False when a variable is left that only a connection could tell.
bool Expand(std::string& name, const ShareSettings& share, const std::string& user) {
  std::string expanded;
  for (std::size_t i = 0; i < name.size(); ++i) {
    if (name[i] != '%') {
      expanded += name[i];
      continue;
    }
    const char variable = i + 1 < name.size() ? name[++i] : '\0';
    if (variable == 'S') {
      expanded += share.name == kHomesShare ? user : share.name;
    } else if (variable == 'U' || variable == 'u') {
      expanded += user;
    } else {
      return false;
    }
  }
  name = std::move(expanded);
  return true;
}

/// One entry: a user's name, or a group's behind + (group), & (netgroup) or @ (netgroup, then
/// group). An entry that cannot be told counts as `unclear`.
bool Fits(const std::string& entry, const ShareSettings& share, const Caller& caller,
          bool unclear) {
  const std::size_t start = std::min(entry.find_first_not_of("@+&"), entry.size());
  const std::string_view kinds = std::string_view(entry).substr(0, start);
  std::string name = entry.substr(start);
  if (!Expand(name, share, caller.name)) return unclear;
  if (kinds.empty()) return SameWord(name, caller.name);
  return (kinds.find_first_of("@&") != kinds.npos && InNetgroup(name, caller.name)) ||
         (kinds.find_first_of("@+") != kinds.npos && InGroup(name, caller.identity));
}

bool Listed(const std::vector<std::string>& list, const ShareSettings& share, const Caller& caller,
            bool unclear) {
  return std::any_of(list.begin(), list.end(),
                     [&](const std::string& entry) { return Fits(entry, share, caller, unclear); });
}

}  // namespace

int PrivilegeOf(const ShareSettings& share, const std::string& user_name,
                const Identity& identity) {
  const Caller caller{user_name, identity};
  if (!share.available || Listed(share.invalid_users, share, caller, true)) return kSharePrivNone;
  if (!share.valid_users.empty() && !Listed(share.valid_users, share, caller, false)) {
    return kSharePrivNone;
  }
  if (Listed(share.write_list, share, caller, false)) return kSharePrivReadWrite;
  if (share.read_only || Listed(share.read_list, share, caller, true)) return kSharePrivReadOnly;
  return kSharePrivReadWrite;
}

}  // namespace maru
