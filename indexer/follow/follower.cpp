#include "indexer/follow/follower.h"

#include <sys/inotify.h>

#include <algorithm>
#include <cerrno>
#include <unordered_set>
#include <utility>

#include "indexer/update/walks.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;
using index::Writer;

/// Stands for the folder above the share's own, in which only that folder itself has a name.
constexpr DirectoryId kAboveRoot = 0;
/// The name for a folder itself.
constexpr const char* kItself = "";

/// Names dealt with between two commits.
constexpr std::size_t kMaxDue = 2'000;

bool IsComplete(std::uint32_t mask) {
  return (mask & (IN_CLOSE_WRITE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE | IN_ATTRIB)) != 0 ||
         (mask & (IN_CREATE | IN_ISDIR)) == (IN_CREATE | IN_ISDIR);
}

/// One round of following.
class Round : public PartialWalk {
 public:
  explicit Round(Updater& updater) : PartialWalk(updater) {}

  /// What is left of `names` stands in folders that are not where they were.
  void Run(int top, NamesByFolder& names) {
    // Of a folder that is gone nothing is to be known any more.
    std::erase_if(names, [this](const auto& item) {
      return item.first != Writer::kRoot && updater_.Indexed().ParentOf(item.first) == 0;
    });
    changed_.clear();
    for (const auto& [folder, wanted] : names) changed_.insert(folder);
    PartialWalk::Run(top, names);
    Settle(updater_, top);
  }

 private:
  void Reach(int dir_fd, const FolderHandle& folder, std::vector<std::string> names) override {
    std::erase(names, kItself);
    for (const index::Entry& entry : folder->entries) {
      if (changed_.contains(entry.directory) && !IsOrphan(entry)) names.push_back(entry.name);
    }
    std::sort(names.begin(), names.end());
    names.erase(std::unique(names.begin(), names.end()), names.end());
    listing_.LookAt(dir_fd, names);
    updater_.Select(listing_, folder->id);
    updater_.Indexed().Met(dir_fd, *folder, listing_.Entries());
    // What is a folder only now is walked when this is settled: what happened in it before its
    // place was known went unseen. There is room for as many as are ever due.
    for (const Found& found : listing_.Entries()) {
      const index::Entry* entry = folder->Find(found.name);
      const bool is_known = entry && entry->stamp.inode == found.stamp.inode;
      if (found.IsFolder() && !is_known) updater_.Moved().AddArrival(*folder, found.name);
    }
    updater_.Update(dir_fd, folder, Compare(*folder, names, listing_.Entries()));
  }

  Listing listing_;
  /// Folders in which something has changed, and so their own times.
  std::unordered_set<DirectoryId> changed_;
};

}  // namespace

void Follower::Entering(int dir_fd, DirectoryId id) {
  watcher_.Watch(dir_fd, id);
  // Also in the midst of a long walk, or the kernel's queue would run over.
  Hear();
}

void Follower::Hear() {
  std::vector<Watcher::Event> events;
  watcher_.Read(events);
  for (const Watcher::Event& event : events) {
    if (event.mask == IN_Q_OVERFLOW) {
      Lose();
    } else if (!event.name.empty()) {
      Await(event.folder, event.name, IsComplete(event.mask));
    } else if (event.folder == Writer::kRoot) {
      Await(kAboveRoot, kItself, true);
    } else if (event.mask & IN_ATTRIB) {
      // Where something is mounted, the folder above does not hear of it.
      Await(event.folder, kItself, true);
    }
  }
}

/// What the names there were before say of it is no longer true: a crawl finds them.
void Follower::MetElsewhere(int dir_fd, DirectoryId folder, const Found& file) {
  const std::string name(file.name);
  if (!watcher_.WatchFile(dir_fd, folder, name)) return;
  const std::optional<Found> now = Look(dir_fd, name.c_str());
  if (!now || file.is_racy || now->stamp != file.stamp) Await(folder, name, true);
  lost_ = lost_ || catching_up_;
}

NamesByFolder Follower::TakeDue() {
  return pending_.TakeDue(Clock::now(), kMaxDue);
}

void Follower::CatchUp(Updater& updater, int top, NamesByFolder due) {
  catching_up_ = true;
  if (due.erase(kAboveRoot) > 0 || due.contains(Writer::kRoot)) updater.UpdateTop(top, share_);
  Round round(updater);
  round.Run(top, due);
  // What was not where it was may have been moved along with what has just been settled. If not,
  // more is yet to be heard of it.
  if (!due.empty()) round.Run(top, due);
  for (const auto& [folder, names] : due) {
    for (const std::string& name : names) Await(folder, name, false);
  }
  catching_up_ = false;
}

void Follower::Renew() {
  watcher_.Renew();
  lost_ = false;
  catching_up_ = false;
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
