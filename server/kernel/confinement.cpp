#include "server/kernel/confinement.h"

#include <cap-ng.h>
#include <dirent.h>
#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <memory>

#include "server/kernel/signals.h"
#include "system/log.h"
#include "system/service_identity.h"
#include "system/throw_errno.h"

namespace maru::server {
namespace {

constexpr time_t kOldSeconds = 24 * 3600;

}  // namespace

void EnterMountNamespace() {
  CheckErrno(unshare(CLONE_NEWNS) == 0, "unshare");
  CheckErrno(mount(nullptr, "/", nullptr, MS_REC | MS_SLAVE, nullptr) == 0, "mount /");
}

void MakePrivateMounts() {
  constexpr unsigned long kFlags = MS_NOSUID | MS_NODEV | MS_NOEXEC;
  EnterMountNamespace();
  if (mount("proc", "/proc", "proc", kFlags, nullptr) < 0)
    MARU_LOG("No /proc of its own: the one of the machine stays in sight");
  CheckErrno(mount("tmpfs", "/tmp", "tmpfs", kFlags, "mode=1777,size=64m,nr_inodes=65536") == 0,
             "mount /tmp");
}

void SweepPrivateTmp() {
  const std::unique_ptr<DIR, int (*)(DIR*)> folder(opendir("/tmp"), closedir);
  if (!folder) return;
  const time_t now = time(nullptr);
  while (const dirent* entry = readdir(folder.get())) {
    struct stat status;
    if (fstatat(dirfd(folder.get()), entry->d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        S_ISREG(status.st_mode) && now - status.st_mtime > kOldSeconds)
      unlinkat(dirfd(folder.get()), entry->d_name, 0);
  }
}

void KeepHostCapabilities() {
  capng_clear(CAPNG_SELECT_BOTH);
  CheckErrno(capng_updatev(
                 CAPNG_ADD,
                 static_cast<capng_type_t>(CAPNG_EFFECTIVE | CAPNG_PERMITTED | CAPNG_BOUNDING_SET),
                 CAP_SETUID, CAP_SETGID, CAP_DAC_READ_SEARCH, CAP_KILL, CAP_CHOWN, -1) == 0,
             "capng_updatev");
  // The bounding set goes while setpcap is still there to cut it.
  CheckErrno(capng_apply(CAPNG_SELECT_BOTH) == 0, "capng_apply");
  GiveUpNewPrivileges();
}

UniqueFd KeepOnly(UniqueFd kept) {
  constexpr int kFirst = STDERR_FILENO + 1;
  UnblockSignals();
  ReopenLog();
  const int fd = kept.Release();
  if (fd != kFirst) dup3(fd, kFirst, O_CLOEXEC);
  close_range(kFirst + 1, ~0u, 0);
  return UniqueFd(kFirst);
}

}  // namespace maru::server
