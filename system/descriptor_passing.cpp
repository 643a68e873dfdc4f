#include "system/descriptor_passing.h"

#include <errno.h>
#include <string.h>
#include <sys/socket.h>

namespace maru {
namespace {

/// A message of one part, and the room for a descriptor beside it.
struct Message {
  Message(void* bytes, std::size_t size) : part{bytes, size} {
    header.msg_iov = &part;
    header.msg_iovlen = 1;
  }

  /// Exactly one: CMSG_SPACE would have room for a second, which nobody would close.
  void MakeRoomForDescriptor() {
    header.msg_control = control;
    header.msg_controllen = CMSG_LEN(sizeof(int));
  }

  iovec part;
  msghdr header{};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
};

UniqueFd TakeDescriptor(msghdr& message) {
  const cmsghdr* control = CMSG_FIRSTHDR(&message);
  if (!control || control->cmsg_level != SOL_SOCKET || control->cmsg_type != SCM_RIGHTS)
    return UniqueFd();
  int descriptor;
  memcpy(&descriptor, CMSG_DATA(control), sizeof(descriptor));
  return UniqueFd(descriptor);
}

template <class Call>
ssize_t Uninterrupted(Call call) {
  ssize_t result;
  do {
    result = call();
  } while (result < 0 && errno == EINTR);
  return result;
}

}  // namespace

ssize_t SendWithDescriptor(int socket, const void* bytes, std::size_t size, int passed, int flags) {
  Message message(const_cast<void*>(bytes), size);
  if (passed >= 0) {
    message.MakeRoomForDescriptor();
    cmsghdr* control = CMSG_FIRSTHDR(&message.header);
    control->cmsg_level = SOL_SOCKET;
    control->cmsg_type = SCM_RIGHTS;
    control->cmsg_len = CMSG_LEN(sizeof(passed));
    memcpy(CMSG_DATA(control), &passed, sizeof(passed));
  }
  return Uninterrupted([&] { return sendmsg(socket, &message.header, flags | MSG_NOSIGNAL); });
}

ssize_t ReceiveWithDescriptor(int socket, void* bytes, std::size_t size, UniqueFd* passed,
                              int flags) {
  Message message(bytes, size);
  if (passed) message.MakeRoomForDescriptor();
  const ssize_t received =
      Uninterrupted([&] { return recvmsg(socket, &message.header, flags | MSG_CMSG_CLOEXEC); });
  if (received < 0 || !passed) return received;
  if (UniqueFd descriptor = TakeDescriptor(message.header)) *passed = std::move(descriptor);
  return received;
}

}  // namespace maru
