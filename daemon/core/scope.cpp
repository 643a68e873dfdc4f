#include "daemon/core/scope.h"

#include <algorithm>

#include "daemon/core/arguments.h"
#include "system/accounts.h"
#include "system/index_id.h"

namespace maru::daemon {
namespace {

bool MayUse(const Eyes& eyes, const ShareSettings& share) {
  // Homes are judged by their own rights alone.
  if (eyes.identity.unrestricted || share.name == kHomesShare) return true;
  return PrivilegeOf(share, eyes.user_name, eyes.identity) != kSharePrivNone;
}

Eyes Blind() {
  Eyes eyes;
  eyes.blind = true;
  return eyes;
}

}  // namespace

Eyes EyesOf(const Identity& caller, const std::vector<std::string>& users) {
  if (users.empty()) {
    if (caller.unrestricted) return {caller, {}};
    const std::optional<Account> account = AccountByUID(caller.uid);
    return account ? Eyes{caller, account->name} : Blind();
  }
  const std::string& user = users[0];
  const std::optional<Identity> named = IdentityOfUser(user);
  if (!named || std::ranges::count(users, user) != std::ssize(users)) return Blind();
  if (caller.unrestricted) return {*named, user};
  return named->uid == caller.uid ? Eyes{caller, user} : Blind();
}

std::vector<std::string> Scope::Ids() const {
  std::vector<std::string> ids;
  for (const ShareIndex& index : indices) ids.push_back(index.id);
  return ids;
}

void CheckIndexId(const std::string& id) {
  const bool sound = !id.empty() && id != "." && id != ".." && std::ranges::none_of(id, [](char c) {
    return c == '/' || static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
  });
  if (!sound) throw BadParameter("Malformed index id " + Quoted(id));
}

Scope ScopeOf(const Core& core, Eyes eyes, const std::vector<std::string>& ids) {
  Scope scope{std::move(eyes), {}, core.shares()};
  for (const std::string& id : ids) {
    CheckIndexId(id);
    const ShareSettings* share = scope.table->Find(std::string(ShareOfIndexId(id)));
    if (!share || scope.eyes.blind) continue;
    const bool known = std::ranges::count(scope.indices, id, &ShareIndex::id) > 0;
    if (known || !core.indices.Has(id) || !MayUse(scope.eyes, *share)) continue;
    scope.indices.push_back({id, share});
  }
  return scope;
}

std::unique_ptr<index::View> OpenView(const Core& core, const Scope& scope,
                                      const CancelCheck& cancelled) {
  return core.indices.Open(scope.Ids(), scope.eyes.identity, cancelled);
}

}  // namespace maru::daemon
