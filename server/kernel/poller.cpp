#include "server/kernel/poller.h"

#include "system/throw_errno.h"

namespace maru::server {

Poller::Poller() : epoll_(epoll_create1(EPOLL_CLOEXEC)) {
  CheckErrno(epoll_.Get() >= 0, "epoll_create1");
}

void Poller::Add(int fd, Key key, std::uint32_t events) {
  epoll_event event{};
  event.events = events;
  event.data.u64 = key;
  CheckErrno(epoll_ctl(epoll_.Get(), EPOLL_CTL_ADD, fd, &event) == 0, "epoll_ctl");
}

void Poller::Remove(int fd) {
  epoll_ctl(epoll_.Get(), EPOLL_CTL_DEL, fd, nullptr);
}

std::span<const epoll_event> Poller::Wait(int timeout_ms) {
  const int count =
      epoll_wait(epoll_.Get(), events_.data(), static_cast<int>(events_.size()), timeout_ms);
  return {events_.data(), static_cast<std::size_t>(count > 0 ? count : 0)};
}

}  // namespace maru::server
