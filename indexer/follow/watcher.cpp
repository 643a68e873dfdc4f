#include "indexer/follow/watcher.h"

#include <sys/inotify.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "system/log.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;

constexpr std::uint32_t kWatched = IN_CREATE | IN_CLOSE_WRITE | IN_MODIFY | IN_ATTRIB | IN_DELETE |
                                   IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF |
                                   IN_ONLYDIR | IN_EXCL_UNLINK;

constexpr std::uint32_t kWatchedOfFiles = IN_ATTRIB | IN_MODIFY | IN_CLOSE_WRITE | IN_DONT_FOLLOW;

/// Buffers taken in one go.
constexpr unsigned kMaxParts = 16;

}  // namespace

Watcher::Watcher() : inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
  if (inotify_) return;
  complete_ = false;
  MARU_LOG("Cannot follow changes, only crawls find them");
}

/// The watch on what lies at a path below a descriptor's; -1, noted, when there is none to be had.
int Watcher::Add(const std::string& path, std::uint32_t mask) {
  const int watch = inotify_add_watch(inotify_.Get(), ("/proc/self/fd/" + path).c_str(), mask);
  if (watch >= 0 || errno == ENOENT) return watch;
  if (!std::exchange(noted_limit_, true)) {
    MARU_LOG(
        "Only %zu folders of this share are watched (sysctl fs.inotify.max_user_watches): "
        "changes elsewhere wait for a crawl",
        folders_.size());
  }
  complete_ = false;
  return watch;
}

void Watcher::Watch(int dir_fd, DirectoryId id) {
  if (id >= watches_.size()) watches_.resize(id + 1, -1);
  if (!inotify_) return;
  // Asked for each time: the watch may be on a folder that is gone and whose inode lives anew.
  const int watch = Add(std::to_string(dir_fd), kWatched);
  if (watch < 0 || watch == watches_[id]) return;
  Forget(id);
  watches_[id] = watch;
  folders_.emplace(watch, id);
}

bool Watcher::WatchFile(int dir_fd, DirectoryId folder, const std::string& name) {
  if (!inotify_) return false;
  const int watch = Add(std::to_string(dir_fd) + "/" + name, kWatchedOfFiles);
  if (watch < 0) return false;
  FileName file{folder, name};
  const auto [first, last] = files_.equal_range(watch);
  if (std::any_of(first, last, [&](const auto& item) { return item.second == file; })) return false;
  files_.emplace(watch, std::move(file));
  return true;
}

void Watcher::Forget(DirectoryId id) {
  if (id >= watches_.size()) return;
  const int watch = std::exchange(watches_[id], -1);
  const auto [first, last] = folders_.equal_range(watch);
  const auto place =
      std::find_if(first, last, [id](const auto& item) { return item.second == id; });
  if (place == last) return;
  folders_.erase(place);
  if (!folders_.contains(watch)) inotify_rm_watch(inotify_.Get(), watch);
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
      const auto [first, last] = folders_.equal_range(event->wd);
      for (auto place = first; place != last; ++place) {
        if (event->mask & IN_IGNORED) {
          watches_[place->second] = -1;
        } else {
          events.push_back({place->second, event->mask, event->len > 0 ? event->name : ""});
        }
      }
      const auto [first_file, last_file] = files_.equal_range(event->wd);
      for (auto file = first_file; file != last_file; ++file) {
        if (event->mask & IN_IGNORED) continue;
        events.push_back({file->second.folder, event->mask, file->second.name});
      }
      if (event->mask & IN_IGNORED) folders_.erase(event->wd);
      if (event->mask & IN_IGNORED) files_.erase(event->wd);
    }
  }
}

}  // namespace maru::indexer
