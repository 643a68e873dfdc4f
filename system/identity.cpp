#include <algorithm>

#include "system/accounts.h"
#include "system/config.h"
#include "system/rights.h"

namespace maru {
namespace {

bool ToIdentity(const std::optional<Account>& account, Identity& identity) {
  if (!account) return false;
  std::optional<std::vector<gid_t>> groups = GroupsOf(*account);
  if (!groups) return false;
  std::sort(groups->begin(), groups->end());
  identity.uid = account->uid;
  identity.groups = std::move(*groups);
  identity.unrestricted = account->uid == 0 || account->name == Config::Get().service_account;
  return true;
}

}  // namespace

bool Identity::InGroup(gid_t gid) const {
  return std::binary_search(groups.begin(), groups.end(), gid);
}

bool IdentityOfUser(const std::string& user_name, Identity& identity) {
  return ToIdentity(AccountByName(user_name), identity);
}

bool IdentityOfUID(uid_t uid, Identity& identity) {
  return ToIdentity(AccountByUID(uid), identity);
}

}  // namespace maru
