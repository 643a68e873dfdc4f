#include "indexer/follow/follower.h"

#include <sys/inotify.h>

#include <cerrno>
#include <utility>

#include "indexer/follow/round.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;

/// Names dealt with between two commits.
constexpr std::size_t kMaxDue = 2'000;

bool IsComplete(std::uint32_t mask) {
  return (mask & (IN_CLOSE_WRITE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE | IN_ATTRIB)) != 0 ||
         (mask & (IN_CREATE | IN_ISDIR)) == (IN_CREATE | IN_ISDIR);
}

}  // namespace

void Follower::Entering(int dir_fd, DirectoryId id) {
  watcher_.Watch(dir_fd, id);
  // Also in the midst of a long walk, or the kernel's queue would run over.
  Hear();
}

void Follower::Hear() {
  std::vector<Watcher::Event> events;
  watcher_.Read(events);
  for (const Watcher::Event& event : events) Note(event);
}

NamesByFolder Follower::TakeDue() {
  return pending_.TakeDue(Clock::now(), kMaxDue);
}

void Follower::TryAgain(const NamesByFolder& names) {
  for (const auto& [folder, wanted] : names) {
    for (const std::string& name : wanted) Await(folder, name, false);
  }
}

void Follower::Renew() {
  watcher_.Renew();
  lost_ = false;
}

void Follower::Note(const Watcher::Event& event) {
  if (event.mask == IN_Q_OVERFLOW) return Lose();
  if (!event.name.empty()) return Await(event.folder, event.name, IsComplete(event.mask));
  if (event.folder == index::Writer::kRoot) Await(kAboveRoot, {}, true);
}

void Follower::Await(DirectoryId folder, const std::string& name, bool complete) {
  if (!pending_.Add(folder, name, complete, Clock::now())) Lose();
}

void Follower::Lose() {
  pending_.Clear();
  if (std::exchange(lost_, true)) return;
  errno = 0;
  MARU_LOG("Share %s changes faster than can be followed; a crawl will find the rest",
           share_.c_str());
}

}  // namespace maru::indexer
