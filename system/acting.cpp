#include "system/acting.h"

#include <errno.h>
#include <grp.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>

#include "system/accounts.h"
#include "system/log.h"

namespace maru {
namespace {

/// Everything that says who a process is. The file system's ids follow the effective ones.
struct ProcessIdentity {
  uid_t real_uid, effective_uid, saved_uid;
  gid_t real_gid, effective_gid, saved_gid;
  std::vector<gid_t> groups;  // sorted

  friend bool operator==(const ProcessIdentity&, const ProcessIdentity&) = default;
};

bool Read(ProcessIdentity& identity) {
  if (getresuid(&identity.real_uid, &identity.effective_uid, &identity.saved_uid) != 0 ||
      getresgid(&identity.real_gid, &identity.effective_gid, &identity.saved_gid) != 0) {
    return false;
  }
  const int count = getgroups(0, nullptr);
  if (count < 0) return false;
  identity.groups.resize(static_cast<std::size_t>(count));
  if (getgroups(count, identity.groups.data()) != count) return false;
  std::sort(identity.groups.begin(), identity.groups.end());
  return true;
}

/// Asks the kernel only for a change, which may need a right that sameness does not.
bool SetGroups(const std::vector<gid_t>& wanted) {
  ProcessIdentity now;
  return Read(now) && (now.groups == wanted || setgroups(wanted.size(), wanted.data()) == 0);
}

/// Group rights before user rights: once the user is switched, the right to do so is gone.
bool Become(const ProcessIdentity& wanted) {
  if (setresuid(0, 0, 0) != 0 || !SetGroups(wanted.groups) ||
      setresgid(wanted.real_gid, wanted.effective_gid, wanted.saved_gid) != 0 ||
      setresuid(wanted.real_uid, wanted.effective_uid, wanted.saved_uid) != 0) {
    return false;
  }
  ProcessIdentity now;
  if (Read(now) && now == wanted) return true;
  errno = EPERM;
  return false;
}

std::optional<ProcessIdentity> IdentityToTake(const std::string& user_name, bool all_groups) {
  const std::optional<Account> account = AccountByName(user_name);
  if (!account) return std::nullopt;
  std::optional<std::vector<gid_t>> groups{{account->gid}};
  if (all_groups) groups = GroupsOf(*account);
  if (!groups) return std::nullopt;
  std::sort(groups->begin(), groups->end());
  return ProcessIdentity{account->uid,      account->uid, 0, account->gid, account->gid, 0,
                         std::move(*groups)};
}

}  // namespace

RootsEyes::RootsEyes() : before_(geteuid()) {
  const int error = errno;
  if (before_ != 0 && seteuid(0) != 0) errno = error;
}

RootsEyes::~RootsEyes() {
  const int error = errno;
  if (geteuid() != before_ && seteuid(before_) != 0) abort();
  errno = error;
}

bool ActAs(const std::string& user_name, bool all_groups) {
  const std::optional<ProcessIdentity> wanted = IdentityToTake(user_name, all_groups);
  ProcessIdentity before;
  if (!wanted || !Read(before)) return false;
  if (before.real_uid != 0 && before.effective_uid != 0 && before.saved_uid != 0) {
    errno = EPERM;
    return false;
  }
  if (Become(*wanted)) return true;
  const int error = errno;
  if (!Become(before)) {
    MARU_LOG("Neither %s nor the identity before could be taken on", user_name.c_str());
    abort();
  }
  errno = error;
  return false;
}

}  // namespace maru
