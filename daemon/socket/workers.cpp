#include "daemon/socket/workers.h"

#include <algorithm>

namespace maru::daemon {

Workers::Workers(unsigned threads) : most_per_user_(std::max(threads, 2u) - 1) {
  for (unsigned i = 0; i < std::max(threads, 2u); ++i) threads_.emplace_back([this] { Work(); });
}

Workers::~Workers() {
  {
    const std::lock_guard lock(mutex_);
    ended_ = true;
  }
  changed_.notify_all();
  for (std::thread& thread : threads_) thread.join();
}

void Workers::Add(uid_t user, Job job) {
  {
    const std::lock_guard lock(mutex_);
    waiting_.push_back({user, std::move(job)});
  }
  changed_.notify_one();
}

std::size_t Workers::Waiting() const {
  const std::lock_guard lock(mutex_);
  return waiting_.size();
}

std::deque<Workers::Waiter>::iterator Workers::Next() {
  auto best = waiting_.end();
  unsigned fewest = most_per_user_;
  for (auto waiter = waiting_.begin(); waiter != waiting_.end(); ++waiter) {
    const auto found = running_.find(waiter->user);
    const unsigned running = found == running_.end() ? 0 : found->second;
    if (running >= fewest) continue;
    best = waiter;
    fewest = running;
    if (fewest == 0) break;
  }
  return best;
}

void Workers::Work() {
  std::unique_lock lock(mutex_);
  for (;;) {
    auto next = waiting_.end();
    changed_.wait(lock, [&] { return ended_ || (next = Next()) != waiting_.end(); });
    if (ended_) return;
    const uid_t user = next->user;
    Job job = std::move(next->job);
    waiting_.erase(next);
    ++running_[user];
    lock.unlock();
    job();
    job = nullptr;
    lock.lock();
    if (--running_[user] == 0) running_.erase(user);
    // A waiting job of this user may have become possible for a thread that saw none.
    if (!waiting_.empty()) changed_.notify_one();
  }
}

}  // namespace maru::daemon
