#include "indexer/keeper.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "indexer/crawl/crawl.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

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

}  // namespace

Keeper::Keeper(Target target, Workers& workers, std::mutex& turn, const Settings& settings)
    : target_(std::move(target)),
      workers_(workers),
      turn_(turn),
      settings_(settings),
      wake_(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)),
      mounts_(target_.path),
      next_crawl_(Clock::now()),
      last_crawl_(Clock::now() - settings.lost_events_gap),
      follower_(target_.share),
      thread_([this] { Run(); }) {}

Keeper::~Keeper() {
  stop_ = true;
  eventfd_write(wake_.Get(), 1);
  thread_.join();
}

void Keeper::CrawlSoon() {
  crawl_asked_ = true;
  eventfd_write(wake_.Get(), 1);
}

void Keeper::Run() {
  while (!stop_) {
    try {
      Step();
    } catch (const std::exception& error) {
      errno = 0;
      MARU_LOG("Index of share %s: %s", target_.share.c_str(), error.what());
      tree_.reset();
      next_crawl_ = Clock::now() + kRetry;
    }
  }
  tree_.reset();
}

void Keeper::Step() {
  follower_.Hear();
  const Clock::time_point now = Clock::now();
  if (crawl_asked_.exchange(false)) CrawlBy(now);
  if (follower_.HasLost()) {
    CrawlBy(std::max(now + Pending::kQuiet, last_crawl_ + settings_.lost_events_gap));
  }
  if (now >= next_crawl_) {
    const std::unique_lock turn(turn_, std::try_to_lock);
    if (turn) {
      Crawl();
    } else {
      Wait(now + kTurnWait);
    }
  }
  if (!tree_) return Wait(next_crawl_);
  Follow();
  Wait(std::min(next_crawl_, follower_.NextDue()));
}

void Keeper::Wait(Clock::time_point until) {
  const auto left = std::chrono::ceil<milliseconds>(until - Clock::now());
  if (stop_ || left.count() <= 0) return;
  pollfd sources[] = {{wake_.Get(), POLLIN, 0},
                      {follower_.Descriptor(), POLLIN, 0},
                      {mounts_.Descriptor(), POLLPRI, 0}};
  constexpr milliseconds kLongest = minutes(10);
  poll(sources, std::size(sources), static_cast<int>(std::min(left, kLongest).count()));
  if (sources[2].revents && mounts_.HaveChanged()) CrawlBy(Clock::now());
  eventfd_t count = 0;
  eventfd_read(wake_.Get(), &count);
}

void Keeper::CrawlBy(Clock::time_point time) {
  next_crawl_ = std::min(next_crawl_, time);
}

void Keeper::Crawl() {
  if (!tree_) {
    PrepareIndex(target_);
    tree_ = std::make_unique<Tree>(target_.index_folder, counts_, &follower_);
  }
  const Clock::time_point begin = Clock::now();
  follower_.Renew();
  const UniqueFd top = OpenTop(target_.path);
  if (!top) MARU_LOG("Cannot open the folder of share %s", target_.share.c_str());
  Updater updater(*tree_, target_.selection, workers_, stop_);
  compared_ = top && CrawlByTerms(updater, target_, top.Get());
  last_crawl_ = Clock::now();
  const auto took = std::chrono::duration_cast<seconds>(last_crawl_ - begin);
  const auto rest = std::max<seconds>(kUnwatchedInterval, took * kUnwatchedRest);
  const bool follows = compared_ && follower_.HearsAll();
  next_crawl_ =
      last_crawl_ + (follows ? settings_.crawl_interval : std::min(settings_.crawl_interval, rest));
}

void Keeper::Follow() {
  NamesByFolder due = follower_.TakeDue();
  const UniqueFd top = due.empty() || !compared_ ? UniqueFd() : OpenTop(target_.path);
  if (!top) return;
  Updater updater(*tree_, target_.selection, workers_, stop_);
  follower_.CatchUp(updater, top.Get(), std::move(due));
  tree_->Commit();
}

}  // namespace maru::indexer
