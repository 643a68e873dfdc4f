#pragma once

#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <unordered_map>

#include "server/host/clock.h"
#include "server/host/plugin.h"
#include "server/kernel/poller.h"
#include "server/wire/messages.h"

namespace maru::server {

/// The host's request children: a few forked ahead, those at work, and those that rest until their
/// user's next request. One thread.
class Children {
 public:
  /// Both outlive this object. What happens at a child's sockets is reported by `poller` under the
  /// child's process id as key.
  Children(Poller& poller, const Plugin& plugin) : poller_(poller), plugin_(plugin) {}

  /// Whether a child is to be forked ahead, now that there is nothing else to do.
  bool WantsMore(Seconds now) const { return fresh_.size() < kAhead && now >= not_before_; }
  /// Whether the next requests may find no child ready.
  bool RunsShort() const { return fresh_.size() <= kShort; }
  void ForkAhead(Seconds now);
  /// Lets the children go that have nothing to do, and those at work once they are done, since the
  /// shares have changed.
  void Renew();

  /// Hands a request to a child of its user that rests, or to a new one; forks one when none waits.
  /// On true `request` is taken over; on false (too many, or no process to be had) it is the
  /// caller's still.
  bool Hand(const Task& task, UniqueFd& request, Seconds now);

  /// What is known when a request is over.
  struct Finished {
    std::string session_id;
    bool session_over = false;
  };
  /// The front has closed its end, or the child has said something. Ends a child that nobody waits
  /// for any longer, unless it has answered and only finishes what follows. Unknown ids are
  /// ignored.
  std::optional<Finished> Hear(pid_t pid, Seconds now);
  /// Ends the children that have worked too long, and lets those go that have rested long enough.
  void EndOverdue(Seconds now);
  /// To be told of every process that was stopped: users can stop those that act as they do, which
  /// then hold places for nothing. Ends it.
  void EndStopped(pid_t pid);
  /// To be told of every process that was waited for. Removes what it left behind. Tells the front
  /// when the child went without an answer. Nothing for a process that was not at work here.
  std::optional<Finished> Reaped(pid_t pid, int wait_status, Seconds now);

  std::size_t Idle() const { return fresh_.size() + rested_.size(); }
  std::size_t AtWork() const { return busy_.size(); }
  std::uint64_t Forked() const { return forked_; }

  static constexpr std::size_t kAhead = 8;
  static constexpr std::size_t kShort = 2;
  static constexpr std::size_t kMaxBusy = 256;
  static constexpr std::size_t kMaxRested = 32;
  static constexpr Seconds kRestSeconds = 10;
  static constexpr Seconds kMaxSeconds = 300;

 private:
  struct Child {
    pid_t pid;
    UniqueFd tasks;
  };
  struct RestedChild {
    Child child;
    std::string user;
    /// The request that was handed out first of those since it rests.
    std::uint64_t first;
    Seconds since;
  };
  struct BusyChild {
    std::string session_id, user;
    UniqueFd tasks, request;
    /// Counts the requests.
    std::uint64_t number;
    Seconds since;
    bool ends_own_only = false;
    bool answered = false;
    bool overdue = false;
  };
  using Busy = std::unordered_map<pid_t, BusyChild>;

  std::optional<Child> Fork();
  static bool MayEnd(const BusyChild& child, const std::string& user);
  std::optional<Child> TakeRested(const std::string& user);
  bool ListenTo(const BusyChild& child, pid_t pid);
  void StopListening(const BusyChild& child);
  std::optional<Finished> Rest(Busy::iterator place, Seconds now);

  Poller& poller_;
  const Plugin& plugin_;
  std::deque<Child> fresh_;
  std::deque<RestedChild> rested_;
  Busy busy_;
  Seconds not_before_ = 0;
  std::uint64_t next_number_ = 0;
  /// Children whose request has a lower number know the shares as they were.
  std::uint64_t renewed_ = 0;
  std::uint64_t forked_ = 0;
};

}  // namespace maru::server
