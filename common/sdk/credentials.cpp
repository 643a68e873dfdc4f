#include "common/sdk/credentials.h"

#include <unistd.h>

#include <exception>
#include <string>

#include "common/common.h"
#include "platform/account.h"
#include "platform/process.h"

namespace maruseeker::sdk {

SDKCredentials::SDKCredentials()
    : euid_(geteuid()), egid_(getegid()), exceptions_(std::uncaught_exceptions()) {
  // Without a name there would be no way back.
  LockMutex lock(SDKMutex());
  MARUUSER* user_info = nullptr;
  if (0 > MARUUserGetByUID(euid_, &user_info) || !user_info) {
    const int error = MLIBCErrGet();
    const std::string reason = "MARUUserGetByUID failed, err=" + std::to_string(error);
    MARU_FAIL_AS("0 > MARUUserGetByUID(euid_, &user_info) || !user_info", kErrorSwitchUser, reason);
  }
  username_ = user_info->szName;
  MARUUserFree(user_info);
}

SDKCredentials::SDKCredentials(const std::string& name)
    : euid_(geteuid()), egid_(getegid()), username_(name), exceptions_(std::uncaught_exceptions()) {
  AsUser(name);
}

SDKCredentials::~SDKCredentials() noexcept(false) {
  LockMutex lock(SDKMutex());
  if (geteuid() == euid_ && getegid() == egid_) return;
  if (ResetCredentialsByName(username_, true)) return;
  // While another exception is on its way, a second one would end the process.
  const Error error(kErrorSwitchUser);
  MARU_LOG("Failed [%s], reason: %s", "!ResetCredentialsByName(username_)", error.what());
  if (std::uncaught_exceptions() == exceptions_) throw error;
}

void SDKCredentials::AsUser(const std::string& name) {
  LockMutex lock(SDKMutex());
  // An administrator sees every file, which takes the rights of root.
  std::string target_username = name;
  if (MLIBGroupIsAdminGroupMem(name.c_str(), 0) == 1) {
    target_username = "root";
  }

  const bool switched = ResetCredentialsByName(target_username, true);
  if (!switched) {
    MARU_FAIL_AS("!ResetCredentialsByName(target_username)", kErrorSwitchUser);
  }
}

}  // namespace maruseeker::sdk
