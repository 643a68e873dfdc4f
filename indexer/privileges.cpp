#include "indexer/privileges.h"

#include <cap-ng.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <stdexcept>
#include <string>

#include "system/accounts.h"
#include "system/config.h"
#include "system/indexed_shares.h"
#include "system/service_identity.h"
#include "system/throw_errno.h"

namespace maru::indexer {
namespace {

Account ServiceAccount() {
  const std::optional<Account> account = AccountByName(kServiceAccount);
  if (!account) throw std::runtime_error(std::string("There is no account ") + kServiceAccount);
  return *account;
}

/// Others may pass through, to ask whether a share has an index, but not look around.
constexpr mode_t kFolderMode = 0711;

void MakeFolder(const std::string& path, const Account* owner) {
  const bool made = mkdir(path.c_str(), kFolderMode) == 0;
  if (!made && errno != EEXIST) ThrowErrno("Cannot make " + path);
  const bool good = !made || (chmod(path.c_str(), kFolderMode) == 0 &&
                              (!owner || chown(path.c_str(), owner->uid, owner->gid) == 0));
  if (!good) ThrowErrno("Cannot set up " + path);
}

void MakeFolders(const Account* owner) {
  MakeFolder(Config::Get().state_dir, owner);
  MakeFolder(IndexHome(), owner);
}

bool ReadsEverything() {
  return capng_get_caps_process() == 0 &&
         capng_have_capability(CAPNG_EFFECTIVE, CAP_DAC_READ_SEARCH) == 1;
}

}  // namespace

Sight BecomeIndexer() {
  if (geteuid() == 0) {
    const Account account = ServiceAccount();
    MakeFolders(&account);
  } else {
    MakeFolders(nullptr);
  }
  DropPrivileges(kServiceAccount, Keep::kReadSearch);
  return ReadsEverything() ? Sight::kAll : Sight::kOwn;
}

}  // namespace maru::indexer
