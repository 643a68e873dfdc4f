#include "system/mounts.h"

#include <fcntl.h>

#include <algorithm>
#include <fstream>
#include <sstream>

namespace maru {
namespace {

constexpr const char* kMounts = "/proc/self/mountinfo";

struct Mount {
  /// Given out once.
  std::string id;
  std::string point;
};

bool IsOctal(char c) {
  return c >= '0' && c <= '7';
}

/// Blanks and backslashes in paths are written as \ooo.
std::string Unescaped(const std::string& text) {
  std::string path;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\\' && i + 3 < text.size() && IsOctal(text[i + 1]) && IsOctal(text[i + 2]) &&
        IsOctal(text[i + 3])) {
      path += static_cast<char>((text[i + 1] - '0') << 6 | (text[i + 2] - '0') << 3 |
                                (text[i + 3] - '0'));
      i += 3;
    } else {
      path += text[i];
    }
  }
  return path;
}

std::vector<Mount> Mounts() {
  std::vector<Mount> mounts;
  std::ifstream file(kMounts);
  for (std::string line; std::getline(file, line);) {
    // ID, the parent's, the device's number, its root, the mount point.
    std::istringstream fields(line);
    std::string id, skipped, point;
    if (fields >> id >> skipped >> skipped >> skipped >> point) {
      mounts.push_back({id, Unescaped(point)});
    }
  }
  return mounts;
}

bool LiesIn(const std::string& path, const std::string& folder) {
  return path.starts_with(folder) &&
         (folder.ends_with('/') || path.size() == folder.size() || path[folder.size()] == '/');
}

std::vector<std::string> MountsIn(const std::string& folder) {
  std::vector<std::string> ids;
  for (Mount& mount : Mounts()) {
    if (LiesIn(mount.point, folder)) ids.push_back(std::move(mount.id));
  }
  return ids;
}

}  // namespace

bool IsMountPoint(const std::string& path) {
  return std::ranges::count(Mounts(), path, &Mount::point) > 0;
}

MountWatch::MountWatch(std::string folder)
    : folder_(std::move(folder)),
      events_(open(kMounts, O_RDONLY | O_CLOEXEC)),
      mounts_(MountsIn(folder_)) {}

bool MountWatch::HaveChanged() {
  std::vector<std::string> now = MountsIn(folder_);
  std::swap(mounts_, now);
  return mounts_ != now;
}

}  // namespace maru
