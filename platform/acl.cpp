#include "platform/acl.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <string_view>

#include "platform/account.h"
#include "platform/guard.h"
#include "system/accounts.h"
#include "system/share_table.h"
#include "system/unique_fd.h"
#include "system/volume_path.h"

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

}  // namespace

int MARUACLPermGet(const char* path, unsigned int* bits) {
  static_assert(kACLRead == R_OK && kACLWrite == W_OK && kACLExecute == X_OK);
  if (!path || !bits) return -1;
  const int asked = static_cast<int>(*bits) & (kACLRead | kACLWrite | kACLExecute);
  *bits = static_cast<unsigned int>(asked);
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
    maru::VolumePath place;
    std::optional<maru::Identity> who;
    if (maru::SplitVolumePath(path, place) &&
        maru::ShareTable::Current()->Find(std::string(place.share))) {
      who = IdentityWith(user_name, groups);
    }
    if (!who) {
      errno = ENOENT;
      return -1;
    }
    const int walked = Walk(*who, std::string(place.folder), place.rest);
    if (walked < 0) return -1;
    errno = 0;
    *bits = walked;
    return 0;
  });
}
