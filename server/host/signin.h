#pragma once

#include <optional>
#include <string>
#include <unordered_map>

#include "server/host/clock.h"
#include "server/host/user.h"
#include "server/wire/messages.h"
#include "system/unique_fd.h"

namespace maru::server {

/// Attempts to sign in that are under way, each in a process of its own, since PAM may take its
/// time. One thread.
class SignIns {
 public:
  /// Forks the process that asks PAM. On true `request` is taken over; on false (too many, or no
  /// process to be had) it is the caller's still.
  bool Begin(const Ask& ask, UniqueFd& request, Seconds now);

  struct Outcome {
    UniqueFd request;
    /// As they were given.
    std::string name, source;
    /// Nothing when refused.
    std::optional<User> user;
  };
  /// To be told of every process that was waited for; nothing for one that is not of these.
  std::optional<Outcome> Reaped(pid_t pid);
  void EndOverdue(Seconds now);
  std::size_t Count() const { return pending_.size(); }

  static constexpr std::size_t kMaxPending = 32;
  static constexpr Seconds kMaxSeconds = 60;

 private:
  struct Pending {
    /// As it is if nothing more is heard.
    Outcome refused;
    UniqueFd result;
    Seconds since;
  };

  std::unordered_map<pid_t, Pending> pending_;
};

}  // namespace maru::server
