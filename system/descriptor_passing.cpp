#include "system/descriptor_passing.h"

#include <errno.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

namespace maru {
namespace {

/// A message of one part and, when asked for, room for exactly one descriptor beside it: CMSG_SPACE
/// would have room for a second, which nobody would close.
struct Message {
  Message(const void* bytes, std::size_t size, bool beside) : part{const_cast<void*>(bytes), size} {
    header.msg_iov = &part;
    header.msg_iovlen = 1;
    if (!beside) return;
    header.msg_control = control;
    header.msg_controllen = CMSG_LEN(sizeof(int));
  }

  iovec part;
  msghdr header{};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
};

}  // namespace

ssize_t SendWithDescriptor(int socket, const void* bytes, std::size_t size, int passed, int flags) {
  const Message message(bytes, size, passed >= 0);
  if (cmsghdr* beside = CMSG_FIRSTHDR(&message.header)) {
    *beside = {CMSG_LEN(sizeof(passed)), SOL_SOCKET, SCM_RIGHTS};
    memcpy(CMSG_DATA(beside), &passed, sizeof(passed));
  }
  return TEMP_FAILURE_RETRY(sendmsg(socket, &message.header, flags | MSG_NOSIGNAL));
}

ssize_t ReceiveWithDescriptor(int socket, void* bytes, std::size_t size, UniqueFd* passed,
                              int flags) {
  Message message(bytes, size, passed != nullptr);
  const ssize_t received =
      TEMP_FAILURE_RETRY(recvmsg(socket, &message.header, flags | MSG_CMSG_CLOEXEC));
  const cmsghdr* beside = received < 0 ? nullptr : CMSG_FIRSTHDR(&message.header);
  if (beside && beside->cmsg_level == SOL_SOCKET && beside->cmsg_type == SCM_RIGHTS) {
    int descriptor;
    memcpy(&descriptor, CMSG_DATA(beside), sizeof(descriptor));
    *passed = UniqueFd(descriptor);
  }
  return received;
}

}  // namespace maru
