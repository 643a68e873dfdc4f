#pragma once

#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "indexer/catalog.h"
#include "indexer/crawler.h"
#include "indexer/pending.h"
#include "indexer/pipeline.h"
#include "indexer/shares.h"
#include "indexer/watcher.h"
#include "system/unique_fd.h"

namespace maru::indexer {

/// Keeps one share's index up to date, in a thread of its own: a crawl at the start, then what the
/// system reports of changes, then a comparing crawl now and then.
class Follower : private FolderListener {
 public:
  struct Settings {
    std::chrono::seconds crawl_interval{std::chrono::hours(24)};
    /// Between two crawls that lost events ask for.
    std::chrono::seconds lost_events_gap{30};
  };

  /// `turn`: one share crawls at a time, so that memory stays bounded.
  Follower(Target target, Workers& workers, std::mutex& turn, const Settings& settings);
  /// Commits what is done and ends, promptly.
  ~Follower() override;

  const Target& Share() const { return target_; }
  /// A crawl as soon as it may be.
  void CrawlSoon();
  /// What it has done so far.
  const Counts& Done() const { return counts_; }

 private:
  using Clock = std::chrono::steady_clock;

  void Entering(int folder, index::DirectoryId id) override;
  void Placed(index::DirectoryId id, index::DirectoryId parent, const std::string& name) override;
  void Removed(index::DirectoryId id) override;

  void Run();
  void Step();
  void Wait(Clock::time_point until);
  void Crawl();
  void TakeEvents();
  void Note(const Watcher::Event& event);
  /// The name is looked at when it has come to rest.
  void Await(index::DirectoryId folder, const std::string& name, bool complete);
  /// More has changed than is known: a crawl will find it.
  void Lose();
  void CrawlBy(Clock::time_point time);
  void ApplyPending();
  void Compare(int top, const std::vector<Pending::Batch>& batches);
  bool CompareNames(int top, const Pending::Batch& batch);

  const Target target_;
  Workers& workers_;
  std::mutex& turn_;
  const Settings settings_;
  Counts counts_;
  std::atomic<bool> stop_{false};
  std::atomic<bool> crawl_asked_{false};
  UniqueFd wake_;

  Watcher watcher_;
  Pending pending_;
  Clock::time_point next_crawl_;
  Clock::time_point last_crawl_;
  /// Events were lost since the last crawl.
  bool lost_ = false;
  /// The last crawl could compare the share.
  bool compared_ = false;
  std::unique_ptr<Catalog> catalog_;
  std::unique_ptr<Crawler> crawler_;
  std::thread thread_;
};

}  // namespace maru::indexer
