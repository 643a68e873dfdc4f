#include "daemon/core/scope.h"

#include <algorithm>

#include "daemon/core/arguments.h"
#include "daemon/core/capability.h"
#include "system/accounts.h"
#include "system/index_id.h"
#include "system/share_access.h"
#include "system/way.h"

namespace maru::daemon {
namespace {

/// Whose rights count in the share; nothing when the eyes may not enter it.
std::optional<Identity> Admitted(const Eyes& eyes, const ShareSettings& share) {
  if (eyes.identity.unrestricted) return eyes.identity;
  ShareAccess access = AccessOf(share, eyes.user_name, eyes.identity);
  if (!access.Admits() || !CanReach(access.identity, share.path)) return std::nullopt;
  return std::move(access.identity);
}

bool IsOfNow(const Core& core, const std::string& id, const ShareSettings& share) {
  return core.indices.Has(id) && core.indices.CrawlTerms(id) == CrawlTermsOf(share);
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

Scope ScopeOf(const Request& request, Eyes eyes, const std::vector<std::string>& ids) {
  const Core& core = request.core;
  Scope scope{std::move(eyes), {}, core.shares()};
  const RaisedReadSearch raised;
  for (const std::string& id : ids) {
    CheckIndexId(id);
    const ShareSettings* share = scope.table->Find(std::string(ShareOfIndexId(id)));
    if (!share || scope.eyes.blind || !share->IsOpenTo(request.client)) continue;
    const bool known = std::ranges::count(scope.indices, id, &ShareIndex::id) > 0;
    if (known || !IsOfNow(core, id, *share)) continue;
    if (auto who = Admitted(scope.eyes, *share)) {
      scope.indices.push_back({id, share, std::move(*who)});
    }
  }
  return scope;
}

std::unique_ptr<index::View> OpenView(const Core& core, const Scope& scope,
                                      const CancelCheck& cancelled) {
  std::vector<index::IndexFor> wanted;
  for (const ShareIndex& index : scope.indices) wanted.push_back({index.id, index.who});
  auto view = core.indices.Open(wanted, cancelled);
  // Terms are withdrawn before an index is changed to others: what was opened is still of these.
  for (const ShareIndex& index : scope.indices) {
    if (IsOfNow(core, index.id, *index.share)) continue;
    throw maruseeker::Error(maruseeker::kErrorStorage, "The index is being made anew");
  }
  return view;
}

}  // namespace maru::daemon
