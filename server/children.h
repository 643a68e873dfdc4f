#pragma once

#include <deque>
#include <optional>
#include <string>
#include <unordered_map>

#include "server/messages.h"
#include "server/plugin.h"
#include "server/poller.h"
#include "server/session.h"

namespace maru::server {

/// The host's request children: a few forked ahead, and those at work. One thread.
class Children {
 public:
  /// Both outlive this object. Hang-ups of the front are reported by `poller` under the child's
  /// process id as key.
  Children(Poller& poller, const Plugin& plugin) : poller_(poller), plugin_(plugin) {}

  /// Whether a child is to be forked ahead, now that there is nothing else to do.
  bool WantsMore(Seconds now) const { return idle_.size() < kAhead && now >= not_before_; }
  /// Whether the next requests may find no child ready.
  bool RunsShort() const { return idle_.size() <= kShort; }
  void ForkAhead(Seconds now);
  /// Lets the idle children go, since the shares have changed.
  void Renew() { idle_.clear(); }

  enum class Start { kDone, kTooMany, kFailed };
  /// Hands a request to a child; forks one when none is idle. On kDone `request` is taken over;
  /// otherwise it is the caller's still.
  Start Hand(const Task& task, Descriptor& request, Seconds now);

  /// The front has closed its end: ends the child, unless that has answered and only finishes what
  /// follows. Unknown ids are ignored.
  void HangUp(pid_t pid);
  /// Ends the children that have worked too long.
  void EndOverdue(Seconds now);

  struct Finished {
    std::string session_id;
    bool session_over = false;
  };
  /// To be told of every process that was waited for. Tells the front when the child went without
  /// an answer. Nothing for a process that was not at work here.
  std::optional<Finished> Reaped(pid_t pid, int wait_status, Seconds now);

  std::size_t Idle() const { return idle_.size(); }
  std::size_t Busy() const { return busy_.size(); }
  std::uint64_t Forked() const { return forked_; }

  static constexpr std::size_t kAhead = 8;
  static constexpr std::size_t kShort = 2;
  static constexpr std::size_t kMaxBusy = 256;
  static constexpr Seconds kMaxSeconds = 300;

 private:
  struct IdleChild {
    pid_t pid;
    Descriptor tasks;
  };
  struct BusyChild {
    std::string session_id;
    Descriptor tasks, request;
    Seconds since;
    bool overdue = false;
  };

  std::optional<IdleChild> Fork();
  static bool HasAnswered(const BusyChild& child);

  Poller& poller_;
  const Plugin& plugin_;
  std::deque<IdleChild> idle_;
  std::unordered_map<pid_t, BusyChild> busy_;
  Seconds not_before_ = 0;
  std::uint64_t forked_ = 0;
};

}  // namespace maru::server
