#include "server/mounts.h"

#include <errno.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <set>

#include "server/kernel/confinement.h"
#include "system/file_id.h"
#include "system/log.h"
#include "system/throw_errno.h"

namespace maru::server {
namespace {

/// Whether the folder at the share's path is the one that is mounted at `target`.
bool IsTheSame(const std::string& path, const std::string& target) {
  struct stat there, here;
  return stat(path.c_str(), &there) == 0 && stat(target.c_str(), &here) == 0 &&
         IdOf(there) == IdOf(here);
}

bool IsMountable(const ShareSettings& share) {
  return share.available && !share.path.empty() && share.path[0] == '/' && !share.name.empty() &&
         share.name[0] != '.' && share.name.find('/') == std::string::npos;
}

}  // namespace

ShareMounts::ShareMounts() {
  EnterMountNamespace();
  CheckErrno(mkdir(kVolume, 0755) == 0 || errno == EEXIST, kVolume);
  CheckErrno(mount("tmpfs", kVolume, "tmpfs", MS_NOSUID | MS_NODEV | MS_NOEXEC,
                   "mode=755,size=1m,nr_inodes=16384") == 0,
             kVolume);
  CheckErrno(mount(nullptr, kVolume, nullptr, MS_SHARED, nullptr) == 0, kVolume);
}

void ShareMounts::Apply(const ShareTable& table) {
  std::set<std::string> wanted;
  for (const ShareSettings& share : table.Shares())
    if (IsMountable(share)) wanted.insert(share.name);
  for (auto it = mounted_.begin(); it != mounted_.end();) {
    const std::string name = (it++)->first;
    if (!wanted.contains(name)) Unmount(name);
  }
  for (const ShareSettings& share : table.Shares())
    if (wanted.contains(share.name)) Mount(share);
}

void ShareMounts::Mount(const ShareSettings& share) {
  const auto found = mounted_.find(share.name);
  const bool failed_before = found != mounted_.end() && found->second.empty();
  if (found != mounted_.end() && !failed_before) {
    if (found->second == share.path && IsTheSame(share.path, share.VolumePath())) return;
    Unmount(share.name);
  }
  const std::string target = share.VolumePath();
  const bool good =
      (mkdir(target.c_str(), 0755) == 0 || errno == EEXIST) &&
      mount(share.path.c_str(), target.c_str(), nullptr, MS_BIND | MS_REC, nullptr) == 0;
  if (!good && !failed_before)
    MARU_LOG("Share %s cannot be mounted from %s", share.name.c_str(), share.path.c_str());
  mounted_[share.name] = good ? share.path : std::string();
}

void ShareMounts::Unmount(const std::string& name) {
  const std::string target = std::string(kVolume) + "/" + name;
  if (!mounted_[name].empty() && umount2(target.c_str(), MNT_DETACH | UMOUNT_NOFOLLOW) < 0)
    MARU_LOG("Share %s cannot be unmounted", name.c_str());
  rmdir(target.c_str());
  mounted_.erase(name);
}

}  // namespace maru::server
