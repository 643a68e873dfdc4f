#include "indexer/tree/selection.h"

#include "system/share_access.h"
#include "system/volume_path.h"

namespace maru::indexer {
namespace {

std::size_t CountComponents(std::string_view path) {
  std::size_t count = 0;
  while (!TakeComponent(path).empty()) ++count;
  return count;
}

std::string_view Component(std::string_view path, std::size_t number) {
  std::string_view name;
  for (std::size_t i = 0; i <= number; ++i) name = TakeComponent(path);
  return name;
}

}  // namespace

Selection::Selection(const ShareSettings& share) : share_(share) {
  if (share.personal) personal_ = 1 + CountComponents(share.personal->inside);
}

bool Selection::Takes(std::size_t depth, const Found& found) const {
  if (depth == 0) return true;
  return depth <= personal_ ? IsOnWay(depth, found) : !share_.veto.Match(found.name);
}

bool Selection::IsOnWay(std::size_t depth, const Found& found) const {
  if (!found.IsFolder()) return false;
  if (depth > 1) return found.name == Component(share_.personal->inside, depth - 2);
  return OwnerOfPersonal(share_, std::string(found.name)).has_value();
}

/// The same rights for whose folder it is, and none for anybody else. Whom the share admits can
/// change without a crawl: that is judged when somebody asks.
FileRights Selection::RightsOfOwner(const std::string& folder, const FileRights& rights) const {
  const std::optional<Account> owner = OwnerOfPersonal(share_, folder);
  const std::optional<Identity> session = owner ? IdentityOfUser(owner->name) : std::nullopt;
  if (!session) return {};
  ShareSettings open_to_all;
  open_to_all.force_group = share_.force_group;
  const ShareAccess access = AccessOf(open_to_all, owner->name, *session);
  const int bits = access.Admits() ? RightsOf(access.identity, rights) : 0;
  return {.uid = session->uid,
          .gid = static_cast<gid_t>(-1),
          .mode = static_cast<std::uint16_t>(bits << 6),
          .acl = {}};
}

void Selection::Narrow(std::size_t depth, std::string_view name, FileRights& rights) const {
  if (depth > personal_ || personal_ == 0) return;
  if (depth == 1 && share_.personal->own_only) {
    rights = RightsOfOwner(std::string(name), rights);
  }
  if (depth < personal_) WithoutRead(rights);
}

}  // namespace maru::indexer
