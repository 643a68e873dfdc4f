#include "platform/rights_cache.h"

#include <fcntl.h>
#include <time.h>

namespace maru {

bool RightsCache::Read(int directory, const char* path, FileRights& rights) {
  struct stat status;
  if (fstatat(directory, path, &status, AT_SYMLINK_NOFOLLOW | AT_EMPTY_PATH) != 0) return false;
  const Key key{status.st_dev, status.st_ino, status.st_ctim};
  if (Find(key, rights.acl)) {
    rights.uid = status.st_uid;
    rights.gid = status.st_gid;
    rights.mode = static_cast<std::uint16_t>(status.st_mode & 0777);
    return true;
  }
  const time_t now = time(nullptr);
  if (!ReadFileRights(directory, path, rights)) return false;
  // The path may by now lead to another file, and this one may have changed.
  struct stat after;
  const bool same = fstatat(directory, path, &after, AT_SYMLINK_NOFOLLOW | AT_EMPTY_PATH) == 0 &&
                    key == Key{after.st_dev, after.st_ino, after.st_ctim};
  if (same && status.st_ctim.tv_sec + settled_seconds_ < now) Keep(key, rights.acl);
  return true;
}

bool RightsCache::Find(const Key& key, std::string& acl) {
  const std::lock_guard lock(mutex_);
  const Slot& slot = slots_[key.inode % kSlots];
  if (!(slot.key == key)) return false;
  acl = slot.acl;
  return true;
}

void RightsCache::Keep(const Key& key, const std::string& acl) {
  const std::lock_guard lock(mutex_);
  slots_[key.inode % kSlots] = {key, acl};
}

}  // namespace maru
