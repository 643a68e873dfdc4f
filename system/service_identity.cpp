#include "system/service_identity.h"

#include <cap-ng.h>
#include <errno.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <stdexcept>

#include "system/accounts.h"
#include "system/throw_errno.h"

namespace maru {

void BecomeForGood(const std::string& account, Keep keep) {
  const std::optional<Account> found = AccountByName(account);
  if (!found) throw std::runtime_error("There is no account " + account);
  const uid_t uid = found->uid;
  const gid_t gid = found->gid;
  if (uid == 0) throw std::runtime_error("The account " + account + " is root's");

  capng_get_caps_process();
  const bool holds = capng_have_capability(CAPNG_PERMITTED, CAP_DAC_READ_SEARCH) == 1;
  capng_clear(CAPNG_SELECT_BOTH);
  if (keep == Keep::kReadSearch && holds) {
    capng_update(CAPNG_ADD, static_cast<capng_type_t>(CAPNG_EFFECTIVE | CAPNG_PERMITTED),
                 CAP_DAC_READ_SEARCH);
  }
  const auto flags = static_cast<capng_flags_t>(CAPNG_DROP_SUPP_GRP | CAPNG_CLEAR_BOUNDING);
  const int result = capng_change_id(static_cast<int>(uid), static_cast<int>(gid), flags);
  if (result != 0) {
    throw std::runtime_error("Cannot become " + account + " (" + std::to_string(result) + ")");
  }
  uid_t real, effective, saved;
  if (getresuid(&real, &effective, &saved) != 0 || real != uid || effective != uid ||
      saved != uid || setuid(0) == 0 || setgid(0) == 0) {
    throw std::runtime_error("Rights of root are left after becoming " + account);
  }
  errno = 0;
  GiveUpNewPrivileges();
}

void GiveUpNewPrivileges() {
  CheckErrno(prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0, "Cannot give up new privileges");
}

void DropPrivileges(const std::string& account, Keep keep) {
  if (geteuid() != 0) return GiveUpNewPrivileges();
  BecomeForGood(account, keep);
}

void RaiseDescriptorLimit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

}  // namespace maru
