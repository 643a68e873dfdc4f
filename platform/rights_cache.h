#pragma once

#include <sys/stat.h>

#include <mutex>
#include <vector>

#include "platform/acl.h"

namespace maru {

/// Access ACLs as they were read last, by inode and change time: whoever gives a file another
/// owner, mode or ACL changes that time. For processes that ask about the same files again and
/// again. Bounded; any thread.
class RightsCache {
 public:
  /// A file that changed less than `settled_seconds` ago is not kept: change times are coarse, and
  /// a second change may bear the same.
  explicit RightsCache(time_t settled_seconds = 3)
      : settled_seconds_(settled_seconds), slots_(kSlots) {}

  /// As ReadFileRights, and as true: owner and mode are read each time, the ACL when the file has
  /// changed.
  bool Read(int directory, const char* path, FileRights& rights);

 private:
  static constexpr std::size_t kSlots = 1u << 12;
  struct Key {
    dev_t device = 0;
    ino_t inode = 0;
    timespec changed{};

    bool operator==(const Key& other) const {
      return device == other.device && inode == other.inode &&
             changed.tv_sec == other.changed.tv_sec && changed.tv_nsec == other.changed.tv_nsec;
    }
  };
  struct Slot {
    Key key;
    std::string acl;
  };

  bool Find(const Key& key, std::string& acl);
  void Keep(const Key& key, const std::string& acl);

  const time_t settled_seconds_;
  std::mutex mutex_;
  /// By inode; a newcomer takes the place of who stands there.
  std::vector<Slot> slots_;
};

}  // namespace maru
