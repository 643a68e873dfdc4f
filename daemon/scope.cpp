#include "daemon/scope.h"

#include <algorithm>

#include "system/accounts.h"
#include "system/index_id.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kMaxFilters = 256;
constexpr std::size_t kMaxFilterData = 4096;

std::string NameOfUser(uid_t uid) {
  const std::optional<Account> account = AccountByUID(uid);
  return account ? account->name : std::string();
}

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

Filters ReadFilters(const Arguments& arguments) {
  Filters filters;
  for (const Json::Value& item : arguments.Array("filters", kMaxFilters)) {
    const Arguments filter(item, arguments.NameOf("filters"), {"name", "data"});
    const std::string name = filter.String("name", kMaxFilterData);
    if (name != "permission" && name != "file_type") {
      throw BadParameter("Unknown filter " + Quoted(name));
    }
    if (!filter.Has("data")) filter.Refuse("data", "is missing");
    auto& list = name == "permission" ? filters.users : filters.types;
    list.push_back(filter.String("data", kMaxFilterData));
  }
  return filters;
}

Eyes EyesOf(const Identity& caller, const std::vector<std::string>& users) {
  Eyes eyes{caller, {}};
  if (users.empty()) {
    if (caller.unrestricted) return eyes;
    eyes.user_name = NameOfUser(caller.uid);
    eyes.blind = eyes.user_name.empty();
    return eyes;
  }
  const std::string& user = users[0];
  for (const std::string& other : users) {
    if (other != user) return Blind();
  }
  const auto named = IdentityOfUser(user);
  if (!named) return Blind();
  if (caller.unrestricted) {
    eyes.identity = *named;
  } else if (named->uid != caller.uid) {
    return Blind();
  }
  eyes.user_name = user;
  return eyes;
}

std::vector<std::string> Scope::Ids() const {
  std::vector<std::string> ids;
  for (const Place& place : places) ids.push_back(place.id);
  return ids;
}

std::optional<std::string> ShareOfIndex(const std::string& id) {
  const bool sound =
      !id.empty() && id != "." && id != ".." && std::none_of(id.begin(), id.end(), [](char c) {
        return c == '/' || static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
      });
  if (!sound) throw BadParameter("Malformed index id " + Quoted(id));
  if (!id.starts_with(kIndexPrefix)) return std::nullopt;
  return id.substr(kIndexPrefix.size());
}

Scope ScopeOf(const Core& core, Eyes eyes, const std::vector<std::string>& ids) {
  Scope scope{std::move(eyes), {}, core.shares()};
  for (const std::string& id : ids) {
    const std::optional<std::string> name = ShareOfIndex(id);
    if (!name || scope.eyes.blind) continue;
    const ShareSettings* share = scope.table->Find(*name);
    const bool known = std::any_of(scope.places.begin(), scope.places.end(),
                                   [&](const Place& place) { return place.id == id; });
    if (!share || known || !core.indices.Has(id) || !MayUse(scope.eyes, *share)) continue;
    scope.places.push_back({id, share});
  }
  return scope;
}

Scope WholeScope(const Core& core, Eyes eyes) {
  return ScopeOf(core, std::move(eyes), core.indices.Ids());
}

std::unique_ptr<index::Reader> OpenReader(const Core& core, const Scope& scope) {
  auto reader = core.indices.Open(scope.Ids());
  reader->SetEyes(scope.eyes.identity);
  return reader;
}

std::string FullPath(const Place& place, const std::string& path) {
  return place.share->VolumePath() + path;
}

}  // namespace maru::daemon
