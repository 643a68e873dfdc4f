#include "indexer/crawl/once.h"

#include <cerrno>
#include <condition_variable>
#include <mutex>
#include <thread>

#include "indexer/crawl/crawl.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

/// Counts what there is, beside the first crawl, so that it can tell how long it will take.
class Counter : private Walk {
 public:
  Counter(const std::string& path, Counts& counts, const std::atomic<bool>& stop)
      : counts_(counts), stop_(stop), thread_([this, path] { Count(path); }) {}
  ~Counter() override {
    done_ = true;
    thread_.join();
  }

 private:
  void Count(const std::string& path) {
    const UniqueFd top = OpenTop(path);
    if (top) Run(top.Get(), 0);
    if (!Stopped()) counts_.expected = found_;
  }
  void Visit(int dir_fd, index::DirectoryId, std::vector<Child>& children) override {
    if (!listing_.Read(dir_fd)) return;
    found_ += listing_.Entries().size();
    for (const Found& found : listing_.Entries()) {
      if (found.IsFolder()) children.push_back({std::string(found.name), 0});
    }
  }
  bool Stopped() override { return stop_ || done_; }

  Counts& counts_;
  const std::atomic<bool>& stop_;
  std::atomic<bool> done_{false};
  std::uint64_t found_ = 1;
  Listing listing_;
  std::thread thread_;
};

/// Shows how a crawl goes until it is asked to stop.
void Show(const std::stop_token& ended, Progress& progress, const Counts& counts) {
  std::mutex mutex;
  std::unique_lock lock(mutex);
  std::condition_variable_any never;
  while (true) {
    never.wait_for(lock, ended, progress.Interval(), [] { return false; });
    if (ended.stop_requested()) return;
    progress.Show(counts);
  }
}

bool CrawlTarget(const Target& target, Workers& workers, Counts& counts,
                 const std::atomic<bool>& stop) {
  const UniqueFd top = OpenTop(target.path);
  if (!top) {
    MARU_LOG("Cannot open the folder of share %s", target.share.c_str());
    return false;
  }
  PrepareIndex(target);
  Tree tree(target.index_folder, counts, nullptr);
  std::unique_ptr<Counter> counter;
  if (tree.HasRoot()) {
    counts.expected = tree.Documents();
  } else {
    counter = std::make_unique<Counter>(target.path, counts, stop);
  }
  Updater updater(tree, target.selection, workers, stop);
  return CrawlByTerms(updater, target, top.Get());
}

bool CrawlNoThrow(const Target& target, Workers& workers, Counts& counts,
                  const std::atomic<bool>& stop) {
  try {
    return CrawlTarget(target, workers, counts, stop);
  } catch (const std::exception& error) {
    errno = 0;
    MARU_LOG("Index of share %s: %s", target.share.c_str(), error.what());
    return false;
  }
}

}  // namespace

bool CrawlOnce(const std::vector<Target>& targets, Workers& workers, const OnceOptions& options,
               Progress& progress, const std::atomic<bool>& stop) {
  bool good = true;
  for (const Target& target : targets) {
    if (stop) break;
    if (options.full) RemoveIndex(target.index_folder);
    Counts counts;
    progress.Begin(target.share);
    std::jthread show([&](const std::stop_token& ended) { Show(ended, progress, counts); });
    good = CrawlNoThrow(target, workers, counts, stop) && good;
    show = {};
    progress.End(counts);
  }
  return good;
}

}  // namespace maru::indexer
