#include "platform/acl.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <chrono>
#include <memory>
#include <string_view>

#include "platform/account.h"
#include "platform/guard.h"
#include "system/accounts.h"
#include "system/acting.h"
#include "system/client_address.h"
#include "system/share_access.h"
#include "system/share_table.h"
#include "system/unique_fd.h"
#include "system/volume_path.h"
#include "system/way.h"

namespace {

/// The user with these groups; administrators may all. Nothing when the user is unknown.
std::optional<maru::Identity> IdentityWith(const char* user_name, const MLIBCSzList* groups) {
  const std::optional<maru::Account> account = maru::AccountByName(user_name);
  std::optional<maru::Identity> who = maru::IdentityOfUser(user_name);
  if (!account || !who) return std::nullopt;
  who->groups.clear();
  for (int i = 0; i < MLIBCSzListCount(groups); ++i) {
    const std::string_view text = MLIBCSzListGet(groups, i);
    const char* end = text.data() + text.size();
    if (std::from_chars(text.data(), end, who->groups.emplace_back()).ptr != end) {
      return std::nullopt;
    }
  }
  std::sort(who->groups.begin(), who->groups.end());
  who->unrestricted = who->unrestricted || maru::IsAdministrator(*account);
  return who;
}

/// A user in a share.
struct Standing {
  maru::ShareAccess access;
  /// The rights that count are the user's own.
  bool is_own = true;
  /// Can cross the folders on the way to the share.
  bool can_reach = true;
};

Standing StandingOf(const maru::ShareSettings& share, const std::string& user_name,
                    const maru::Identity& session) {
  Standing standing{maru::AccessOf(share, user_name, session)};
  if (!standing.access.Admits()) standing.access.identity = session;
  standing.is_own = standing.access.identity == session;
  std::optional<maru::RootsEyes> eyes;
  if (!standing.is_own) eyes.emplace();
  standing.can_reach = maru::CanReach(standing.access.identity, share.path);
  return standing;
}

/// That of the process's own user, kept for the moment that an account is: a page asks for each of
/// its hits.
const Standing& OwnStanding(const std::shared_ptr<const maru::ShareTable>& table,
                            const maru::ShareSettings& share, const maru::Account& account) {
  static struct {
    std::shared_ptr<const maru::ShareTable> table;
    const maru::ShareSettings* share;
    uid_t uid;
    std::chrono::steady_clock::time_point until;
    Standing standing;
  } kept;
  const auto now = std::chrono::steady_clock::now();
  if (kept.table != table || kept.share != &share || kept.uid != account.uid || now > kept.until) {
    const auto session =
        maru::IdentityOfUser(account.name).value_or(maru::Identity{account.uid, {}});
    kept = {table, &share, account.uid, now + maru::kNameServiceAge,
            StandingOf(share, account.name, session)};
  }
  return kept.standing;
}

bool IsLink(int descriptor) {
  struct stat status;
  return fstat(descriptor, &status) != 0 || S_ISLNK(status.st_mode);
}

/// The bits of `rest` under the share's folder; -1 with errno.
int Walk(const maru::Identity& who, const std::string& folder, std::string_view rest) {
  maru::UniqueFd at(open(folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  maru::FileRights rights;
  while (at) {
    if (IsLink(at.Get())) return 0;
    if (!maru::ReadFileRights(at.Get(), "", rights)) break;
    const int bits = maru::RightsOf(who, rights);
    const std::string name(maru::TakeComponent(rest));
    if (name.empty()) return bits;
    if (!(bits & kACLExecute)) return 0;
    at = maru::UniqueFd(openat(at.Get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
  }
  return errno == EACCES ? 0 : -1;
}

/// What the share says of the process's user on the path: the bits that are left of those asked
/// for, or nothing, where the kernel is to say.
std::optional<int> BitsByShare(const char* path, int asked) {
  const uid_t uid = geteuid();
  maru::VolumePath place;
  if (!maru::SplitVolumePath(path, place)) return std::nullopt;
  const auto table = maru::ShareTable::Current();
  const maru::ShareSettings* share = table->Find(std::string(place.share));
  if (share && !share->IsOpenTo(maru::PresentClient())) return 0;
  if (uid == 0) return std::nullopt;
  const std::optional<maru::Account> account = maru::AccountByUID(uid);
  if (!share || !account) return std::nullopt;
  const Standing& standing = OwnStanding(table, *share, *account);
  const bool is_in = standing.access.Admits() && standing.can_reach;
  if (!is_in || !maru::Serves(*share, account->name, place.rest)) return 0;
  if (standing.is_own) return std::nullopt;
  const maru::RootsEyes eyes;
  const int bits = Walk(standing.access.identity, std::string(place.folder), place.rest);
  return bits < 0 ? bits : bits & asked;
}

/// Bits of any user; -1 with errno.
int BitsOf(const char* user_name, const MLIBCSzList* groups, const char* path) {
  maru::VolumePath place;
  const auto table = maru::ShareTable::Current();
  const maru::ShareSettings* share = nullptr;
  if (maru::SplitVolumePath(path, place)) share = table->Find(std::string(place.share));
  const auto session = share ? IdentityWith(user_name, groups) : std::nullopt;
  if (!session) {
    errno = ENOENT;
    return -1;
  }
  if (!share->IsOpenTo(maru::PresentClient())) return 0;
  const std::string folder(place.folder);
  if (session->unrestricted) return Walk(*session, folder, place.rest);
  const Standing standing = StandingOf(*share, user_name, *session);
  if (!standing.can_reach || !maru::Serves(*share, user_name, place.rest)) return 0;
  std::optional<maru::RootsEyes> eyes;
  if (!standing.is_own) eyes.emplace();
  return Walk(standing.access.identity, folder, place.rest);
}

}  // namespace

int MARUACLPermGet(const char* path, unsigned int* bits) {
  static_assert(kACLRead == R_OK && kACLWrite == W_OK && kACLExecute == X_OK);
  if (!path || !bits) return -1;
  const int asked = static_cast<int>(*bits) & (kACLRead | kACLWrite | kACLExecute);
  *bits = static_cast<unsigned int>(asked);
  int by_share = 0;
  const bool told = maru::Guarded("MARUACLPermGet", true, [&] {
    const std::optional<int> left = BitsByShare(path, asked);
    by_share = left.value_or(0);
    return left.has_value();
  });
  if (told) {
    *bits = static_cast<unsigned int>(std::max(by_share, 0));
    return by_share < 0 ? -1 : 0;
  }
  {
    // One look, when the user has them all.
    const maru::KeepErrno keep;
    if (faccessat(AT_FDCWD, path, asked, AT_EACCESS) == 0) return 0;
  }
  const maru::UniqueFd file(open(path, O_PATH | O_CLOEXEC));
  if (!file) return -1;
  const maru::KeepErrno keep;
  *bits = 0;
  for (const int bit : {kACLRead, kACLWrite, kACLExecute}) {
    if ((asked & bit) && faccessat(file.Get(), "", bit, AT_EACCESS | AT_EMPTY_PATH) == 0) {
      *bits |= static_cast<unsigned int>(bit);
    }
  }
  return 0;
}

int MARUACLPermCalc(const char* user_name, const MLIBCSzList* groups, const char* path, int* bits) {
  if (!user_name || !path || !bits) {
    errno = EINVAL;
    return -1;
  }
  return maru::Guarded("MARUACLPermCalc", -1, [&] {
    const int walked = BitsOf(user_name, groups, path);
    if (walked < 0) return -1;
    errno = 0;
    *bits = walked;
    return 0;
  });
}
