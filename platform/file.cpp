#include "platform/file.h"

#include <errno.h>
#include <fcntl.h>
#include <linux/limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <array>
#include <string>
#include <vector>

#include "platform/guard.h"
#include "system/mounts.h"
#include "system/share_table.h"
#include "system/unique_fd.h"
#include "system/volume_path.h"
#include "system/whole_file.h"

namespace {

constexpr std::size_t kChunk = 1u << 20;

bool CopyByHand(const maru::UniqueFd& from, const maru::UniqueFd& to) {
  std::string buffer(kChunk, '\0');
  for (;;) {
    const ssize_t count = read(from.Get(), buffer.data(), buffer.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return count == 0;
    if (!maru::WriteAll(to, std::string_view(buffer).substr(0, static_cast<std::size_t>(count)))) {
      return false;
    }
  }
}

/// Both descriptors stand at their start, or where the kernel's own copy gave up.
bool CopyContent(const maru::UniqueFd& from, const maru::UniqueFd& to) {
  for (;;) {
    const ssize_t count = copy_file_range(from.Get(), nullptr, to.Get(), nullptr, kChunk, 0);
    if (count > 0 || (count < 0 && errno == EINTR)) continue;
    // Some file systems cannot, and some files claim to be empty until they are read.
    return CopyByHand(from, to);
  }
}

/// Those that may be set; one that the destination or the caller cannot have is left out.
void CopyAttributes(int from, int to) {
  std::vector<char> names(XATTR_LIST_MAX);
  const ssize_t size = flistxattr(from, names.data(), names.size());
  std::vector<char> value(XATTR_SIZE_MAX);
  for (ssize_t at = 0; at < size;) {
    const char* name = names.data() + at;
    const ssize_t length = fgetxattr(from, name, value.data(), value.size());
    if (length >= 0) fsetxattr(to, name, value.data(), static_cast<std::size_t>(length), 0);
    at += static_cast<ssize_t>(strlen(name)) + 1;
  }
}

/// The set-id bits stay behind: they would lend the new owner's rights.
bool CopyStatus(int from, int to) {
  struct stat status;
  if (fstat(from, &status) != 0) return false;
  CopyAttributes(from, to);
  const std::array<timespec, 2> times{status.st_atim, status.st_mtim};
  if (fchmod(to, status.st_mode & 0777) != 0 || futimens(to, times.data()) != 0) return false;
  if (fchown(to, status.st_uid, status.st_gid) != 0 && errno != EPERM) return false;
  errno = 0;
  return true;
}

bool Rename(const char* from, const char* to, bool overwrite) {
  if (!overwrite) return renameat2(AT_FDCWD, from, AT_FDCWD, to, RENAME_NOREPLACE) == 0;
  struct stat status;
  if (lstat(to, &status) == 0 && !S_ISREG(status.st_mode)) {
    errno = EEXIST;
    return false;
  }
  return rename(from, to) == 0;
}

bool Copy(const char* source, const char* destination, bool overwrite) {
  const maru::UniqueFd from(open(source, O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat status;
  if (!from || fstat(from.Get(), &status) != 0) return false;
  if (!S_ISREG(status.st_mode)) {
    errno = EINVAL;
    return false;
  }
  std::string temporary;
  const maru::UniqueFd to = maru::NewFileBeside(destination, 0600, temporary);
  if (!to) return false;
  if (CopyContent(from, to) && CopyStatus(from.Get(), to.Get()) && fsync(to.Get()) == 0 &&
      Rename(temporary.c_str(), destination, overwrite)) {
    return true;
  }
  const int error = errno;
  unlink(temporary.c_str());
  errno = error;
  return false;
}

bool Move(const char* source, const char* destination, bool overwrite) {
  struct stat status;
  if (lstat(source, &status) != 0) return false;
  if (!S_ISREG(status.st_mode)) {
    errno = EINVAL;
    return false;
  }
  if (Rename(source, destination, overwrite)) return true;
  return errno == EXDEV && Copy(source, destination, overwrite) && unlink(source) == 0;
}

}  // namespace

int MARUFSDirIsMntPoint(const char* path) {
  maru::VolumePath place;
  if (path && maru::SplitVolumePath(path, place) && maru::TakeComponent(place.rest).empty()) {
    // That the share is seen here at all is a mount of the web server's.
    return maru::Guarded("MARUFSDirIsMntPoint", -1, [&] {
      const auto table = maru::ShareTable::Current();
      const maru::ShareSettings* share = table->Find(std::string(place.share));
      return share ? int{maru::IsMountPoint(share->path)} : maru::Fail(kErrNotFound, -1);
    });
  }
  struct statx status;
  if (!path || statx(AT_FDCWD, path, AT_SYMLINK_NOFOLLOW, STATX_TYPE, &status) != 0) return -1;
  if (!(status.stx_attributes_mask & STATX_ATTR_MOUNT_ROOT)) {
    errno = ENOTSUP;
    return -1;
  }
  return status.stx_attributes & STATX_ATTR_MOUNT_ROOT ? 1 : 0;
}

int MARUFileCopy(const char* source, const char* destination, const MARUCOPYARG* options, int) {
  if (!source || !destination || !options) {
    errno = EINVAL;
    return -1;
  }
  return maru::Guarded("MARUFileCopy", -1, [&] {
    const auto work = options->fRemoveSource ? Move : Copy;
    return work(source, destination, options->fOverwrite) ? 0 : maru::Fail(kErrSystem, -1);
  });
}
