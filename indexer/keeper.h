#pragma once

#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <thread>

#include "indexer/follow/follower.h"
#include "indexer/tree/shares.h"
#include "indexer/tree/tree.h"
#include "indexer/update/workers.h"
#include "system/mounts.h"
#include "system/unique_fd.h"

namespace maru::indexer {

/// Keeps one share's index up to date, in a thread of its own: a crawl at the start, then what the
/// system reports of changes, then a comparing crawl now and then, and when something was mounted
/// or unmounted in the share.
class Keeper {
 public:
  struct Settings {
    std::chrono::seconds crawl_interval{std::chrono::hours(24)};
    /// Between two crawls that lost events ask for.
    std::chrono::seconds lost_events_gap{30};
  };

  /// `turn`: one share crawls at a time, so that memory stays bounded.
  Keeper(Target target, Workers& workers, std::mutex& turn, const Settings& settings);
  /// Commits what is done and ends, promptly.
  ~Keeper();

  const Target& Keeps() const { return target_; }
  /// A crawl as soon as it may be.
  void CrawlSoon();
  /// What it has done so far.
  const Counts& Done() const { return counts_; }

 private:
  using Clock = std::chrono::steady_clock;

  void Run();
  void Step();
  void Wait(Clock::time_point until);
  void Crawl();
  void CrawlBy(Clock::time_point time);
  void Follow();

  const Target target_;
  Workers& workers_;
  std::mutex& turn_;
  const Settings settings_;
  Counts counts_;
  std::atomic<bool> stop_{false};
  std::atomic<bool> crawl_asked_{false};
  UniqueFd wake_;
  MountWatch mounts_;

  Clock::time_point next_crawl_;
  Clock::time_point last_crawl_;
  /// The last crawl could compare the share.
  bool compared_ = false;
  Follower follower_;
  std::unique_ptr<Tree> tree_;
  std::thread thread_;
};

}  // namespace maru::indexer
