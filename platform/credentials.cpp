#include <errno.h>
#include <grp.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>

#include "platform/account.h"
#include "platform/guard.h"
#include "system/accounts.h"

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
  return Read(now) && now == wanted;
}

bool Lookup(const std::string& user_name, bool groups, ProcessIdentity& identity) {
  const std::optional<maru::Account> account = maru::AccountByName(user_name);
  if (!account) return maru::Fail(errno == 0 ? kErrNotFound : kErrSystem, false);
  std::optional<std::vector<gid_t>> list{{account->gid}};
  if (groups) list = maru::GroupsOf(*account);
  if (!list) return maru::Fail(kErrSystem, false);
  std::sort(list->begin(), list->end());
  identity = {account->uid, account->uid, 0, account->gid, account->gid, 0, std::move(*list)};
  return true;
}

}  // namespace

bool ResetCredentialsByName(const std::string& user_name, bool groups) {
  return maru::Guarded("ResetCredentialsByName", false, [&] {
    ProcessIdentity wanted;
    ProcessIdentity before;
    if (!Lookup(user_name, groups, wanted)) return false;
    if (!Read(before)) return maru::Fail(kErrSystem, false);
    if (before.real_uid != 0 && before.effective_uid != 0 && before.saved_uid != 0) {
      errno = EPERM;
      return maru::Fail(kErrSystem, false);
    }
    if (Become(wanted)) return true;
    const int error = errno;
    if (!Become(before)) {
      MARU_LOG("Neither %s nor the identity before could be taken on", user_name.c_str());
      abort();
    }
    errno = error;
    return maru::Fail(kErrSystem, false);
  });
}
