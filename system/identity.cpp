#include <algorithm>

#include "system/accounts.h"
#include "system/rights.h"

namespace maru {
namespace {

std::optional<Identity> IdentityOf(const std::optional<Account>& account) {
  if (!account) return std::nullopt;
  std::optional<std::vector<gid_t>> groups = GroupsOf(*account);
  if (!groups) return std::nullopt;
  std::sort(groups->begin(), groups->end());
  const bool unrestricted = account->uid == 0 || account->name == kServiceAccount;
  return Identity{account->uid, std::move(*groups), unrestricted};
}

}  // namespace

bool Identity::InGroup(gid_t gid) const {
  return std::binary_search(groups.begin(), groups.end(), gid);
}

std::optional<Identity> IdentityOfUser(const std::string& user_name) {
  return IdentityOf(AccountByName(user_name));
}

std::optional<Identity> IdentityOfUID(uid_t uid) {
  return IdentityOf(AccountByUID(uid));
}

}  // namespace maru
