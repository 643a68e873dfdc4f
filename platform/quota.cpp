#include <errno.h>
#include <fcntl.h>
#include <sys/quota.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/syscall.h>
#include <unistd.h>

#include "platform/guard.h"
#include "platform/share.h"
#include "system/unique_fd.h"

namespace {

/// Whether a quota of the file system that holds `file` forbids `bytes` more. False also where
/// there is no such quota, or the caller may not ask.
bool OverQuota(int file, int type, unsigned int id, std::uint64_t bytes) {
  const maru::KeepErrno keep;
  struct dqblk quota {};
  if (syscall(SYS_quotactl_fd, file, QCMD(Q_GETQUOTA, type), id, &quota) != 0) return false;
  const std::uint64_t limit = quota.dqb_bhardlimit * QIF_DQBLKSIZE;
  return limit != 0 && (quota.dqb_curspace > limit || limit - quota.dqb_curspace < bytes);
}

}  // namespace

int MARUQuotaIsEnough(unsigned int uid, const char* path, std::uint64_t bytes, int) {
  if (!path) return maru::Fail(kErrBadParameter, 0);
  const maru::UniqueFd file(open(path, O_PATH | O_CLOEXEC));
  struct stat status;
  struct statvfs space;
  if (!file || fstat(file.Get(), &status) != 0 || fstatvfs(file.Get(), &space) != 0) {
    return maru::Fail(errno == ENOENT ? kErrNotFound : kErrSystem, 0);
  }
  if (OverQuota(file.Get(), USRQUOTA, uid == 0 ? status.st_uid : uid, bytes) ||
      OverQuota(file.Get(), GRPQUOTA, status.st_gid, bytes)) {
    return maru::Fail(kErrOverQuota, 0);
  }
  // In blocks, so that no number of bytes overflows.
  const std::uint64_t blocks = bytes / space.f_frsize + (bytes % space.f_frsize != 0);
  return space.f_bavail >= blocks ? 1 : maru::Fail(kErrNoSpace, 0);
}
