#include "server/poller.h"

#include <errno.h>

#include <system_error>

namespace maru::server {

Poller::Poller() : epoll_(epoll_create1(EPOLL_CLOEXEC)) {
  if (!epoll_) throw std::system_error(errno, std::generic_category(), "epoll_create1");
}

void Poller::Add(int fd, Key key, std::uint32_t events) {
  epoll_event event{};
  event.events = events;
  event.data.u64 = key;
  if (epoll_ctl(epoll_.Get(), EPOLL_CTL_ADD, fd, &event) < 0)
    throw std::system_error(errno, std::generic_category(), "epoll_ctl");
}

void Poller::Remove(int fd) {
  epoll_ctl(epoll_.Get(), EPOLL_CTL_DEL, fd, nullptr);
}

std::span<const epoll_event> Poller::Wait(int timeout_ms) {
  const int count =
      epoll_wait(epoll_.Get(), events_.data(), static_cast<int>(events_.size()), timeout_ms);
  errno = 0;
  return {events_.data(), static_cast<std::size_t>(count > 0 ? count : 0)};
}

}  // namespace maru::server
