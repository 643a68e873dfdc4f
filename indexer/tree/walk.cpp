#include "indexer/tree/walk.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <sys/vfs.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>

namespace maru::indexer {
namespace {

/// Folders kept open on the way down; those above are opened again on the way up.
constexpr std::size_t kMaxOpen = 64;

constexpr std::array<std::uint32_t, 14> kKernelFileSystems = {
    PROC_SUPER_MAGIC, SYSFS_MAGIC,        DEBUGFS_MAGIC,       TRACEFS_MAGIC,      SECURITYFS_MAGIC,
    SELINUX_MAGIC,    CGROUP_SUPER_MAGIC, CGROUP2_SUPER_MAGIC, DEVPTS_SUPER_MAGIC, BPF_FS_MAGIC,
    PSTOREFS_MAGIC,   EFIVARFS_MAGIC,     BINFMTFS_MAGIC,      NSFS_MAGIC,
};

bool IsKernelFileSystem(int dir_fd) {
  struct statfs status {};
  if (fstatfs(dir_fd, &status) != 0) return false;
  return std::find(kKernelFileSystems.begin(), kKernelFileSystems.end(),
                   static_cast<std::uint32_t>(status.f_type)) != kKernelFileSystems.end();
}

}  // namespace

void Walk::Run(int top, index::DirectoryId id) {
  frames_.clear();
  Enter(UniqueFd(fcntl(top, F_DUPFD_CLOEXEC, 0)), id);
  while (!frames_.empty() && !Stopped()) {
    Frame& frame = frames_.back();
    if (!frame.folder || frame.next == frame.children.size()) {
      Leave();
    } else if (!Descend(frame)) {
      Unreadable(frame.children[frame.next - 1]);
    }
  }
  frames_.clear();
}

std::string Walk::Path() const {
  std::string path;
  for (std::size_t i = 0; i + 1 < frames_.size(); ++i) {
    if (!path.empty()) path += '/';
    path += frames_[i].children[frames_[i].next - 1].name;
  }
  return path;
}

bool Walk::Descend(Frame& frame) {
  const Child& child = frame.children[frame.next++];
  UniqueFd folder = OpenFolder(frame.folder.Get(), child.name.c_str());
  if (!folder) return false;
  if (IdOf(folder.Get()).device != frame.id.device && IsKernelFileSystem(folder.Get())) return true;
  Enter(std::move(folder), child.id);
  return true;
}

void Walk::Enter(UniqueFd folder, index::DirectoryId id) {
  Frame& frame = frames_.emplace_back();
  frame.id = IdOf(folder.Get());
  frame.folder = std::move(folder);
  if (frames_.size() > kMaxOpen) frames_[frames_.size() - kMaxOpen - 1].folder = UniqueFd();
  Visit(frame.folder.Get(), id, frame.children);
}

void Walk::Leave() {
  Frame& frame = frames_.back();
  if (frames_.size() > 1) {
    Frame& above = frames_[frames_.size() - 2];
    // Moved elsewhere meanwhile: then what is left of the folder above is not looked at this time.
    if (!above.folder && frame.folder) {
      above.folder = OpenFolder(frame.folder.Get(), "..");
      if (above.folder && IdOf(above.folder.Get()) != above.id) above.folder = UniqueFd();
    }
  }
  frames_.pop_back();
}

}  // namespace maru::indexer
