#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <optional>

#include "indexer/tree/tree.h"
#include "indexer/update/workers.h"

namespace maru::indexer {

/// One tree's way to the workers and back. What is under way is bounded, so that no queue grows.
/// One thread, but for Deliver; throws as the tree does.
class Lane {
 public:
  Lane(Workers& workers, Tree& tree) : workers_(workers), tree_(tree) {}
  /// Waits for what is under way and drops it.
  ~Lane();
  Lane(const Lane&) = delete;
  Lane& operator=(const Lane&) = delete;

  /// Waits until there is room. A file must not be submitted again while it is under way.
  void Submit(Job job);
  /// Puts what is finished into the tree.
  void Collect();
  /// The same with all that is under way.
  void Finish();

  /// Hands over a result; any thread.
  void Deliver(Result result);

 private:
  bool HasRoom() const;
  std::optional<Result> Take(bool wait);
  void Put(Result result);

  Workers& workers_;
  Tree& tree_;
  std::size_t under_way_ = 0;
  std::size_t cost_ = 0;
  std::mutex mutex_;
  std::condition_variable finished_;
  std::deque<Result> results_;
};

}  // namespace maru::indexer
