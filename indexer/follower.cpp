#include "indexer/follower.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>

#include <algorithm>
#include <cerrno>
#include <map>
#include <set>
#include <utility>

#include "system/log.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;
using index::Writer;
using std::chrono::milliseconds;
using std::chrono::minutes;
using std::chrono::seconds;

/// While not every folder is watched: crawls this often, or so that they take a fifth of the time.
constexpr minutes kUnwatchedInterval{15};
constexpr int kUnwatchedRest = 4;
/// Until an index that could not be opened or written is tried again.
constexpr seconds kRetry{60};
/// A crawl that has to wait for another share's.
constexpr milliseconds kTurnWait{500};
/// Names dealt with between two commits.
constexpr std::size_t kBatch = 2'000;

/// What stands for the share's own folder, which has no folder above it.
constexpr DirectoryId kShareItself = 0;

constexpr Catalog::Bounds kBounds{};

bool IsComplete(std::uint32_t mask) {
  return (mask & (IN_CLOSE_WRITE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE | IN_ATTRIB)) != 0 ||
         (mask & (IN_CREATE | IN_ISDIR)) == (IN_CREATE | IN_ISDIR);
}

/// The share's own folder may lie behind a link: the settings say where.
UniqueFd OpenTop(const std::string& path) {
  return UniqueFd(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

}  // namespace

Follower::Follower(Target target, Workers& workers, std::mutex& turn, const Settings& settings)
    : target_(std::move(target)),
      workers_(workers),
      turn_(turn),
      settings_(settings),
      wake_(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)),
      next_crawl_(Clock::now()),
      last_crawl_(Clock::now() - settings.lost_events_gap),
      thread_([this] { Run(); }) {}

Follower::~Follower() {
  stop_ = true;
  eventfd_write(wake_.Get(), 1);
  thread_.join();
}

void Follower::CrawlSoon() {
  crawl_asked_ = true;
  eventfd_write(wake_.Get(), 1);
}

void Follower::Entering(int folder, DirectoryId id) {
  watcher_.Watch(folder, id);
  TakeEvents();
}

void Follower::Placed(DirectoryId id, DirectoryId parent, const std::string& name) {
  watcher_.Place(id, parent, name);
}

void Follower::Removed(DirectoryId id) {
  watcher_.Forget(id);
}

void Follower::Run() {
  while (!stop_) {
    try {
      Step();
    } catch (const std::exception& error) {
      errno = 0;
      MARU_LOG("Index of share %s: %s", target_.share.c_str(), error.what());
      crawler_.reset();
      catalog_.reset();
      next_crawl_ = Clock::now() + kRetry;
    }
  }
  crawler_.reset();
  catalog_.reset();
}

void Follower::Step() {
  TakeEvents();
  if (crawl_asked_.exchange(false)) CrawlBy(Clock::now());
  const Clock::time_point now = Clock::now();
  if (now >= next_crawl_) {
    const std::unique_lock turn(turn_, std::try_to_lock);
    if (turn) {
      Crawl();
    } else {
      Wait(now + kTurnWait);
    }
  }
  if (!catalog_) return Wait(next_crawl_);
  ApplyPending();
  Wait(std::min(next_crawl_, pending_.NextDue()));
}

void Follower::Wait(Clock::time_point until) {
  const auto left = std::chrono::ceil<milliseconds>(until - Clock::now());
  if (stop_ || left.count() <= 0) return;
  pollfd sources[] = {{wake_.Get(), POLLIN, 0}, {watcher_.Descriptor(), POLLIN, 0}};
  constexpr milliseconds kLongest = minutes(10);
  poll(sources, 2, static_cast<int>(std::min(left, kLongest).count()));
  eventfd_t count = 0;
  eventfd_read(wake_.Get(), &count);
}

void Follower::CrawlBy(Clock::time_point time) {
  next_crawl_ = std::min(next_crawl_, time);
}

void Follower::Crawl() {
  if (!catalog_) {
    FolderListener* listener = this;
    catalog_ = std::make_unique<Catalog>(target_.index_folder, counts_, listener);
    crawler_ = std::make_unique<Crawler>(*catalog_, workers_, counts_, stop_, listener, kBounds);
  }
  const Clock::time_point begin = Clock::now();
  watcher_.Renew();
  lost_ = false;
  UniqueFd top = OpenTop(target_.path);
  if (!top) MARU_LOG("Cannot open the folder of share %s", target_.share.c_str());
  compared_ = top && crawler_->CrawlShare(std::move(top), target_.share);
  last_crawl_ = Clock::now();
  const auto took = std::chrono::duration_cast<seconds>(last_crawl_ - begin);
  const auto rest = std::max<seconds>(kUnwatchedInterval, took * kUnwatchedRest);
  const bool follows = compared_ && watcher_.Complete();
  const seconds wait =
      follows ? settings_.crawl_interval : std::min(settings_.crawl_interval, rest);
  next_crawl_ = lost_ ? last_crawl_ + settings_.lost_events_gap : last_crawl_ + wait;
}

void Follower::TakeEvents() {
  std::vector<Watcher::Event> events;
  watcher_.Read(events);
  for (const Watcher::Event& event : events) Note(event);
}

void Follower::Note(const Watcher::Event& event) {
  if (event.mask == IN_Q_OVERFLOW) return Lose();
  if (!event.name.empty()) return Await(event.folder, event.name, IsComplete(event.mask));
  if (event.folder == Writer::kRoot) Await(kShareItself, {}, true);
}

void Follower::Await(DirectoryId folder, const std::string& name, bool complete) {
  if (!pending_.Add(folder, name, complete, Clock::now())) Lose();
}

void Follower::Lose() {
  pending_.Clear();
  CrawlBy(std::max(Clock::now() + Pending::kQuiet, last_crawl_ + settings_.lost_events_gap));
  if (std::exchange(lost_, true)) return;
  errno = 0;
  MARU_LOG("Share %s changes faster than can be followed; a crawl will find the rest",
           target_.share.c_str());
}

void Follower::ApplyPending() {
  std::vector<Pending::Batch> batches = pending_.TakeDue(Clock::now(), kBatch);
  if (batches.empty() || !compared_) return;
  const UniqueFd top = OpenTop(target_.path);
  if (!top) return;
  Compare(top.Get(), batches);
  // What changes in a folder changes the folder's own time.
  std::map<DirectoryId, std::set<std::string>> above;
  for (const Pending::Batch& batch : batches) {
    above[watcher_.Parent(batch.folder)].insert(watcher_.Name(batch.folder));
  }
  batches.clear();
  for (const auto& [folder, names] : above)
    batches.push_back({folder, {names.begin(), names.end()}});
  Compare(top.Get(), batches);
  catalog_->Commit();
}

void Follower::Compare(int top, const std::vector<Pending::Batch>& batches) {
  std::vector<const Pending::Batch*> elsewhere;
  for (const Pending::Batch& batch : batches) {
    TakeEvents();
    if (!CompareNames(top, batch)) elsewhere.push_back(&batch);
  }
  crawler_->Settle(top);
  if (elsewhere.empty()) return;
  for (const Pending::Batch* batch : elsewhere) {
    if (CompareNames(top, *batch)) continue;
    // Its way has changed and word of that is still to be taken in: then it is where it is, or
    // gone.
    for (const std::string& name : batch->names) Await(batch->folder, name, false);
  }
  crawler_->Settle(top);
}

/// False when the folder is not where it was last known to be: it was moved, or is gone.
bool Follower::CompareNames(int top, const Pending::Batch& batch) {
  if (batch.folder == kShareItself) {
    crawler_->RefreshRoot(top, target_.share);
    return true;
  }
  if (batch.folder != Writer::kRoot && watcher_.Parent(batch.folder) == 0) return true;
  const std::string path = watcher_.Path(batch.folder);
  const UniqueFd folder = OpenPath(top, path);
  if (!folder || IdOf(folder.Get()).inode != watcher_.Inode(batch.folder)) return false;
  crawler_->CrawlNames(folder.Get(), path, batch.folder, batch.names);
  return true;
}

}  // namespace maru::indexer
