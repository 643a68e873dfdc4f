#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <thread>
#include <vector>

namespace maru::daemon {

/// A few threads that carry out requests. Fair: the next job is the oldest of the user who has the
/// fewest running, and one user never has all threads.
class Workers {
 public:
  using Job = std::function<void()>;

  explicit Workers(unsigned threads);
  /// Ends when the running jobs have ended; waiting ones are dropped.
  ~Workers();
  Workers(const Workers&) = delete;
  Workers& operator=(const Workers&) = delete;

  /// The job must not throw.
  void Add(uid_t user, Job job);
  std::size_t Waiting() const;
  std::size_t Threads() const { return threads_.size(); }

 private:
  struct Waiter {
    uid_t user;
    Job job;
  };

  void Work();
  std::deque<Waiter>::iterator Next();

  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<Waiter> waiting_;
  std::map<uid_t, unsigned> running_;
  unsigned most_per_user_;
  bool ended_ = false;
  std::vector<std::thread> threads_;
};

}  // namespace maru::daemon
