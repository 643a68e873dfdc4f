#include "daemon/privilege.h"

#include <cap-ng.h>
#include <pwd.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>
#include <system_error>

#include "platform/log.h"

namespace maru::daemon {
namespace {

bool holds_capability = false;

void BecomeAccount(const std::string& account) {
  errno = 0;
  const passwd* user = getpwnam(account.c_str());
  if (!user) throw std::runtime_error("There is no account " + account);
  if (user->pw_uid == 0) throw std::runtime_error("The account " + account + " is root's");
  const auto uid = static_cast<int>(user->pw_uid);
  const auto gid = static_cast<int>(user->pw_gid);
  capng_get_caps_process();
  holds_capability = capng_have_capability(CAPNG_PERMITTED, CAP_DAC_READ_SEARCH);
  capng_clear(CAPNG_SELECT_BOTH);
  if (holds_capability) capng_update(CAPNG_ADD, CAPNG_PERMITTED, CAP_DAC_READ_SEARCH);
  const int result = capng_change_id(
      uid, gid, static_cast<capng_flags_t>(CAPNG_INIT_SUPP_GRP | CAPNG_CLEAR_BOUNDING));
  if (result != 0) {
    throw std::runtime_error("Cannot become " + account + " (" + std::to_string(result) + ")");
  }
  uid_t real, effective, saved;
  if (getresuid(&real, &effective, &saved) != 0 || real != user->pw_uid || effective != real ||
      saved != real || setuid(0) == 0 || setgid(0) == 0) {
    throw std::runtime_error("Rights of root are left after becoming " + account);
  }
}

void SetEffective(bool on) {
  thread_local const bool loaded = capng_get_caps_process() == 0;
  if (!loaded) return;
  capng_update(on ? CAPNG_ADD : CAPNG_DROP, CAPNG_EFFECTIVE, CAP_DAC_READ_SEARCH);
  if (capng_apply(CAPNG_SELECT_CAPS) != 0) MARU_LOG("Failed [capng_apply]");
}

}  // namespace

void DropPrivileges(const std::string& account) {
  if (geteuid() == 0) BecomeAccount(account);
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
    throw std::system_error(errno, std::generic_category(), "Cannot give up new privileges");
  }
}

bool MayExamineAllFiles() {
  return holds_capability || geteuid() == 0;
}

ExamineFiles::ExamineFiles() {
  if (holds_capability) SetEffective(true);
}

ExamineFiles::~ExamineFiles() {
  if (holds_capability) SetEffective(false);
}

}  // namespace maru::daemon
