#include "system/daemon_connection.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <chrono>
#include <utility>

#include "system/client_address.h"

namespace marudaemon {
namespace {

using Clock = std::chrono::steady_clock;

/// About a page of hits. Every process that receives pays for memory it never had before.
constexpr std::size_t kChunk = 16u << 10;

bool Refuse(int error) {
  errno = error;
  return false;
}

/// What was tried on the way to success leaves no trace.
bool Done(int errno_before) {
  errno = errno_before;
  return true;
}

Clock::time_point After(int milliseconds) {
  return Clock::now() + std::chrono::milliseconds(milliseconds);
}

std::chrono::microseconds Left(Clock::time_point deadline) {
  return std::chrono::ceil<std::chrono::microseconds>(deadline - Clock::now());
}

/// Waits until the descriptor is ready for `events`, or broken; ETIMEDOUT at the deadline.
bool Await(int descriptor, short events, Clock::time_point deadline) {
  for (;;) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(Left(deadline));
    if (left.count() <= 0) return Refuse(ETIMEDOUT);
    pollfd entry{descriptor, events, 0};
    const int ready = poll(&entry, 1, static_cast<int>(left.count()));
    if (ready > 0) return true;
    if (ready < 0 && errno != EINTR) return false;
  }
}

/// Connects while the listener's queue has room, or waits for room until the deadline.
bool ConnectBefore(int descriptor, const sockaddr_un& address, Clock::time_point deadline) {
  for (;;) {
    const std::chrono::microseconds left = Left(deadline);
    if (left.count() <= 0) return Refuse(ETIMEDOUT);
    // A UNIX socket cannot be polled for room in the queue; connect itself waits for it.
    const timeval limit{left.count() / 1'000'000, left.count() % 1'000'000};
    if (setsockopt(descriptor, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof(limit)) != 0) return false;
    if (connect(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0) {
      return true;
    }
    if (errno != EINTR && errno != EAGAIN) return false;
  }
}

}  // namespace

void SockConnection::Disconnect() {
  descriptor_ = maru::UniqueFd();
  received_.clear();
  begin_ = 0;
}

bool SockConnection::Send(const std::string& message) {
  const int before = errno;
  if (!descriptor_) return Refuse(ENOTCONN);
  if (message.size() > kMaxMessage) return Refuse(EMSGSIZE);
  if (message.find('\n') != std::string::npos) return Refuse(EINVAL);
  const std::string line = message + '\n';
  const auto deadline = After(kSendTimeout);
  for (std::size_t sent = 0; sent < line.size();) {
    const ssize_t count =
        send(descriptor_.Get(), line.data() + sent, line.size() - sent, MSG_NOSIGNAL);
    if (count >= 0) {
      sent += static_cast<std::size_t>(count);
    } else if (errno == EAGAIN) {
      if (!Await(descriptor_.Get(), POLLOUT, deadline)) return false;
    } else if (errno != EINTR) {
      return false;
    }
  }
  return Done(before);
}

bool SockConnection::Recv(std::string& message) {
  const int before = errno;
  if (!descriptor_) return Refuse(ENOTCONN);
  const auto deadline = After(kReceiveTimeout);
  for (std::size_t searched = begin_;;) {
    const std::size_t end = received_.find('\n', searched);
    if (std::min(end, received_.size()) - begin_ > kMaxMessage) return Refuse(EMSGSIZE);
    if (end != std::string::npos) {
      message.assign(received_, begin_, end - begin_);
      begin_ = end + 1;
      return Done(before);
    }
    received_.erase(0, std::exchange(begin_, 0));
    const std::size_t size = searched = received_.size();
    received_.resize(size + kChunk);
    const ssize_t count = recv(descriptor_.Get(), received_.data() + size, kChunk, 0);
    const int error = errno;
    received_.resize(size + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    if (count == 0) return Refuse(size == 0 ? 0 : EPROTO);
    if (count > 0 || error == EINTR) continue;
    if (error != EAGAIN) return Refuse(error);
    if (!Await(descriptor_.Get(), POLLIN, deadline)) return false;
  }
}

bool DomainSockConnection::Connect() {
  const int before = errno;
  Disconnect();
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path_.empty() || path_.size() >= sizeof(address.sun_path)) return Refuse(ENAMETOOLONG);
  memcpy(address.sun_path, path_.c_str(), path_.size());
  maru::UniqueFd socket_file(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!socket_file || !ConnectBefore(socket_file.Get(), address, After(kConnectTimeout)) ||
      !maru::IntroduceClient(socket_file.Get()) ||
      fcntl(socket_file.Get(), F_SETFL, O_NONBLOCK) != 0) {
    return false;
  }
  descriptor_ = std::move(socket_file);
  return Done(before);
}

}  // namespace marudaemon
