#include <netdb.h>

#include <algorithm>
#include <mutex>
#include <optional>
#include <string_view>

#include "system/accounts.h"
#include "system/share_table.h"
#include "system/text.h"

namespace maru {
namespace {

bool InNetgroup(const std::string& group, const std::string& user) {
  static std::mutex mutex;  // the C library keeps one search for all threads
  const std::lock_guard lock(mutex);
  return innetgr(group.c_str(), nullptr, user.c_str(), nullptr) == 1;
}

/// A user before a share.
class Visitor {
 public:
  Visitor(const ShareSettings& share, const std::string& name, const Identity& identity)
      : share_(share), name_(name), identity_(identity) {}

  /// `when_unclear` is the answer of an entry that only a connection could settle.
  bool IsOn(const std::vector<std::string>& list, bool when_unclear) const {
    return std::any_of(list.begin(), list.end(), [&](const std::string& entry) {
      return IsMeant(entry).value_or(when_unclear);
    });
  }

 private:
  /// By one entry: a user's name, or a group's behind + (group), & (netgroup) or @ (netgroup, then
  /// group).
  std::optional<bool> IsMeant(std::string_view entry) const {
    const std::size_t start = std::min(entry.find_first_not_of("@+&"), entry.size());
    const std::string_view kinds = entry.substr(0, start);
    const std::optional<std::string> name = Expanded(entry.substr(start));
    if (!name) return std::nullopt;
    if (kinds.empty()) return SameWord(*name, name_);
    return (kinds.find_first_of("@&") != kinds.npos && InNetgroup(*name, name_)) ||
           (kinds.find_first_of("@+") != kinds.npos && IsInGroup(*name));
  }

  /// Samba's variables in a name. In [homes], where everyone enters through a folder of their own,
  /// %S is the user. Nothing when another variable is left.
  std::optional<std::string> Expanded(std::string_view name) const {
    std::string expanded;
    for (std::size_t i = 0; i < name.size(); ++i) {
      if (name[i] != '%') {
        expanded += name[i];
        continue;
      }
      const char variable = i + 1 < name.size() ? name[++i] : '\0';
      if (variable == 'S') {
        expanded += share_.name == kHomesShare ? name_ : share_.name;
      } else if (variable == 'U' || variable == 'u') {
        expanded += name_;
      } else {
        return std::nullopt;
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

}  // namespace

SharePrivilege PrivilegeOf(const ShareSettings& share, const std::string& user_name,
                           const Identity& identity) {
  const Visitor user(share, user_name, identity);
  if (!share.available || user.IsOn(share.invalid_users, true)) return kSharePrivNone;
  if (!share.valid_users.empty() && !user.IsOn(share.valid_users, false)) return kSharePrivNone;
  if (user.IsOn(share.write_list, false)) return kSharePrivReadWrite;
  if (share.read_only || user.IsOn(share.read_list, true)) return kSharePrivReadOnly;
  return kSharePrivReadWrite;
}

}  // namespace maru
