#include "indexer/watcher.h"

#include <sys/inotify.h>

#include <cerrno>
#include <cstdio>
#include <utility>

#include "indexer/listing.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;

constexpr std::uint32_t kWatched = IN_CREATE | IN_CLOSE_WRITE | IN_MODIFY | IN_ATTRIB | IN_DELETE |
                                   IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF |
                                   IN_ONLYDIR | IN_EXCL_UNLINK;

/// A way up longer than this is a ring.
constexpr unsigned kMaxDepth = 100'000;
/// Buffers taken in one go.
constexpr unsigned kMaxParts = 16;

}  // namespace

Watcher::Watcher() : inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  if (inotify_) return;
  complete_ = false;
  MARU_LOG("Cannot follow changes, only crawls find them");
}

void Watcher::Place(DirectoryId id, DirectoryId parent, const std::string& name) {
  if (id >= spots_.size()) spots_.resize(id + 1);
  spots_[id].parent = parent;
  if (spots_[id].name != name) spots_[id].name = name;
}

void Watcher::Watch(int folder, DirectoryId id) {
  if (id >= spots_.size()) spots_.resize(id + 1);
  if (!inotify_) return;
  char path[32];
  std::snprintf(path, sizeof path, "/proc/self/fd/%d", folder);
  // Asked for each time: the watch may be on a folder that is gone and whose inode lives anew.
  const int watch = inotify_add_watch(inotify_.Get(), path, kWatched);
  spots_[id].inode = IdOf(folder).inode;
  if (watch >= 0) {
    if (watch == spots_[id].watch) return;
    Unlink(id);
    spots_[id].watch = watch;
    ids_.emplace(watch, id);
    return;
  }
  if (!std::exchange(noted_limit_, true)) {
    MARU_LOG(
        "Only %zu folders of this share are watched (sysctl fs.inotify.max_user_watches): "
        "changes elsewhere wait for a crawl",
        ids_.size());
  }
  complete_ = false;
}

void Watcher::Unlink(DirectoryId id) {
  const int watch = std::exchange(spots_[id].watch, -1);
  const auto [first, last] = ids_.equal_range(watch);
  for (auto place = first; place != last; ++place) {
    if (place->second != id) continue;
    ids_.erase(place);
    if (!ids_.contains(watch)) inotify_rm_watch(inotify_.Get(), watch);
    return;
  }
}

void Watcher::Forget(DirectoryId id) {
  if (id >= spots_.size()) return;
  Unlink(id);
  spots_[id] = {};
}

std::string Watcher::Path(DirectoryId id) const {
  std::vector<const std::string*> names;
  for (; Parent(id) != 0 && names.size() < kMaxDepth; id = Parent(id)) {
    names.push_back(&spots_[id].name);
  }
  std::string path;
  for (auto name = names.rbegin(); name != names.rend(); ++name) {
    if (!path.empty()) path += '/';
    path += **name;
  }
  return path;
}

DirectoryId Watcher::Parent(DirectoryId id) const {
  return id < spots_.size() ? spots_[id].parent : 0;
}

std::uint64_t Watcher::Inode(DirectoryId id) const {
  return id < spots_.size() ? spots_[id].inode : 0;
}

std::string Watcher::Name(DirectoryId id) const {
  return id < spots_.size() ? spots_[id].name : std::string();
}

void Watcher::Read(std::vector<Event>& events) {
  alignas(inotify_event) char buffer[64u << 10];
  for (unsigned part = 0; inotify_ && part < kMaxParts; ++part) {
    const ssize_t got = read(inotify_.Get(), buffer, sizeof buffer);
    if (got <= 0) return;
    for (ssize_t at = 0; at < got;) {
      const auto* event = reinterpret_cast<const inotify_event*>(buffer + at);
      at += static_cast<ssize_t>(sizeof *event + event->len);
      if (event->mask & IN_Q_OVERFLOW) events.push_back({0, IN_Q_OVERFLOW, {}});
      const auto [first, last] = ids_.equal_range(event->wd);
      for (auto place = first; place != last; ++place) {
        if (event->mask & IN_IGNORED) {
          spots_[place->second].watch = -1;
        } else {
          events.push_back({place->second, event->mask, event->len > 0 ? event->name : ""});
        }
      }
      if (event->mask & IN_IGNORED) ids_.erase(event->wd);
    }
  }
}

}  // namespace maru::indexer
