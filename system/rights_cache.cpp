#include "system/rights_cache.h"

#include <fcntl.h>
#include <time.h>

namespace maru {

bool RightsCache::Read(int directory, const char* path, FileRights& rights, struct stat& status) {
  if (fstatat(directory, path, &status, AT_SYMLINK_NOFOLLOW | AT_EMPTY_PATH) != 0) return false;
  if (Find(status, rights.acl)) {
    rights.TakeMode(status);
    return true;
  }
  const time_t now = time(nullptr);
  if (!ReadFileRights(directory, path, rights, &status)) return false;
  if (status.st_ctim.tv_sec + settled_seconds_ < now) Keep(status, rights.acl);
  return true;
}

bool RightsCache::Find(const struct stat& status, std::string& acl) {
  const std::lock_guard lock(mutex_);
  const auto found = known_.find(status.st_ino);
  if (found == known_.end()) return false;
  const Known& known = found->second;
  if (known.device != status.st_dev || known.changed.tv_sec != status.st_ctim.tv_sec ||
      known.changed.tv_nsec != status.st_ctim.tv_nsec) {
    return false;
  }
  acl = known.acl;
  return true;
}

void RightsCache::Keep(const struct stat& status, const std::string& acl) {
  const std::lock_guard lock(mutex_);
  if (known_.size() >= kMost) known_.clear();
  known_[status.st_ino] = {status.st_dev, status.st_ctim, acl};
}

}  // namespace maru
