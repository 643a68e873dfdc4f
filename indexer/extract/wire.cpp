#include "indexer/extract/wire.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>

#include "system/descriptor_passing.h"

namespace maru::extract {
namespace {

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

/// The bytes are waited for with poll when there is a deadline.
int Flags(Deadline deadline) {
  return deadline == kForever ? 0 : MSG_DONTWAIT;
}

}  // namespace

bool SendAll(int socket, const void* bytes, std::size_t size, int descriptor, Deadline deadline) {
  const char* at = static_cast<const char*>(bytes);
  while (size > 0) {
    if (!Wait(socket, POLLOUT, deadline)) return false;
    const ssize_t done = SendWithDescriptor(socket, at, size, descriptor, Flags(deadline));
    if (done < 0 && errno == EAGAIN) continue;
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
  while (size > 0) {
    if (!Wait(socket, POLLIN, deadline)) return false;
    const ssize_t done = ReceiveWithDescriptor(socket, at, size, descriptor, Flags(deadline));
    if (done < 0 && errno == EAGAIN) continue;
    if (done <= 0) {
      if (done == 0) errno = 0;
      return false;
    }
    at += done;
    size -= static_cast<std::size_t>(done);
  }
  return true;
}

}  // namespace maru::extract
