#pragma once

#include <sys/epoll.h>

#include <array>
#include <cstdint>
#include <span>

#include "system/unique_fd.h"

namespace maru::server {

/// Waits for events on many descriptors, level triggered. Each has a key of the caller's choice.
class Poller {
 public:
  using Key = std::uint64_t;

  /// Throws std::system_error.
  Poller();
  /// `events` as epoll names them; hang-ups are always reported. Throws std::system_error.
  void Add(int fd, Key key, std::uint32_t events);
  /// Before `fd` is closed: a forked child may still hold it.
  void Remove(int fd);
  /// At most `timeout_ms`; 0 looks without waiting. The events are valid until the next call.
  std::span<const epoll_event> Wait(int timeout_ms);

 private:
  UniqueFd epoll_;
  std::array<epoll_event, 64> events_;
};

}  // namespace maru::server
