#pragma once

#include <string>
#include <vector>

#include "system/unique_fd.h"

/// What is mounted where, in this process's mount namespace.
namespace maru {

/// Whether something is mounted at exactly this path, which is free of links, "." and "..".
bool IsMountPoint(const std::string& path);

/// The mounts at and below a folder, as they come and go. One thread.
class MountWatch {
 public:
  explicit MountWatch(std::string folder);

  /// Has POLLPRI once whenever a mount came or went anywhere; -1 where the system does not tell.
  int Descriptor() const { return events_.Get(); }
  /// Whether the mounts are others than when this was asked last.
  bool HaveChanged();

 private:
  const std::string folder_;
  const UniqueFd events_;
  std::vector<std::string> mounts_;
};

}  // namespace maru
