#pragma once

#include <time.h>

#include <mutex>
#include <unordered_map>

#include "system/rights.h"

namespace maru {

/// Access ACLs as they were read last, by inode and change time: whoever gives a file another
/// owner, mode or ACL changes that time. For processes that ask about the same files again and
/// again. Bounded; any thread.
class RightsCache {
 public:
  /// A file that changed less than `settled_seconds` ago is not kept: change times are coarse, and
  /// a second change may bear the same.
  explicit RightsCache(time_t settled_seconds = 3) : settled_seconds_(settled_seconds) {}

  /// As ReadFileRights, and as true: owner and mode are read each time, the ACL when the file has
  /// changed. `status` is the file's.
  bool Read(int directory, const char* path, FileRights& rights, struct stat& status);

 private:
  /// About 2 MB.
  static constexpr std::size_t kMost = 1u << 14;
  struct Known {
    dev_t device = 0;
    timespec changed{};
    std::string acl;
  };

  bool Find(const struct stat& status, std::string& acl);
  void Keep(const struct stat& status, const std::string& acl);

  const time_t settled_seconds_;
  std::mutex mutex_;
  /// By inode.
  std::unordered_map<ino_t, Known> known_;
};

}  // namespace maru
