#include "indexer/extract/wire.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace maru::extract {
namespace {

union ControlBuffer {
  cmsghdr align;
  char bytes[CMSG_SPACE(sizeof(int))];
};

bool Wait(int socket, short events, Deadline deadline) {
  if (deadline == kForever) return true;
  while (true) {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    pollfd waiting{socket, events, 0};
    const int ready = poll(&waiting, 1, static_cast<int>(std::max<long long>(left.count(), 0)));
    if (ready > 0) return true;
    if (ready == 0) {
      errno = ETIMEDOUT;
      return false;
    }
    if (errno != EINTR) return false;
  }
}

bool TryAgain(ssize_t done) {
  return done < 0 && (errno == EINTR || errno == EAGAIN);
}

UniqueFd TakeDescriptor(msghdr& message) {
  const cmsghdr* control = CMSG_FIRSTHDR(&message);
  if (!control || control->cmsg_level != SOL_SOCKET || control->cmsg_type != SCM_RIGHTS) {
    return UniqueFd();
  }
  int descriptor = -1;
  std::memcpy(&descriptor, CMSG_DATA(control), sizeof descriptor);
  return UniqueFd(descriptor);
}

}  // namespace

bool SendAll(int socket, const void* bytes, std::size_t size, int descriptor, Deadline deadline) {
  const char* at = static_cast<const char*>(bytes);
  const int flags = MSG_NOSIGNAL | (deadline == kForever ? 0 : MSG_DONTWAIT);
  while (size > 0) {
    if (!Wait(socket, POLLOUT, deadline)) return false;
    iovec part{const_cast<char*>(at), size};
    ControlBuffer control{};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (descriptor >= 0) {
      message.msg_control = control.bytes;
      message.msg_controllen = sizeof control.bytes;
      cmsghdr* header = CMSG_FIRSTHDR(&message);
      header->cmsg_level = SOL_SOCKET;
      header->cmsg_type = SCM_RIGHTS;
      header->cmsg_len = CMSG_LEN(sizeof descriptor);
      std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
    }
    const ssize_t done = sendmsg(socket, &message, flags);
    if (TryAgain(done)) continue;
    if (done < 0) return false;
    descriptor = -1;
    at += done;
    size -= static_cast<std::size_t>(done);
  }
  return true;
}

bool ReceiveAll(int socket, void* bytes, std::size_t size, UniqueFd* descriptor,
                Deadline deadline) {
  char* at = static_cast<char*>(bytes);
  const int flags = MSG_CMSG_CLOEXEC | (deadline == kForever ? 0 : MSG_DONTWAIT);
  while (size > 0) {
    if (!Wait(socket, POLLIN, deadline)) return false;
    iovec part{at, size};
    ControlBuffer control{};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (descriptor) {
      message.msg_control = control.bytes;
      message.msg_controllen = sizeof control.bytes;
    }
    const ssize_t done = recvmsg(socket, &message, flags);
    if (TryAgain(done)) continue;
    if (done <= 0) {
      if (done == 0) errno = 0;
      return false;
    }
    if (descriptor) {
      if (UniqueFd taken = TakeDescriptor(message)) *descriptor = std::move(taken);
    }
    at += done;
    size -= static_cast<std::size_t>(done);
  }
  return true;
}

}  // namespace maru::extract
