#include "system/client_address.h"

#include <arpa/inet.h>
#include <errno.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <optional>
#include <utility>

namespace maru {
namespace {

/// Who sends, beside bytes; there is no room for descriptors, which the kernel then drops without
/// giving them to this process: to close one may mean to wait for its sender.
struct Attested {
  Attested(const void* bytes, std::size_t size) : part{const_cast<void*>(bytes), size} {
    header.msg_iov = &part;
    header.msg_iovlen = 1;
    header.msg_control = control;
    header.msg_controllen = CMSG_LEN(sizeof(ucred));
  }

  iovec part;
  msghdr header{};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(ucred))] = {};
};

std::optional<ClientAddress>& Present() {
  static std::optional<ClientAddress> client;
  return client;
}

}  // namespace

ClientAddress::ClientAddress(const std::string& text) {
  const std::string plain = text.substr(0, text.find('%'));
  in6_addr bytes{};
  int family = AF_INET;
  if (inet_pton(AF_INET, plain.c_str(), &bytes) != 1) {
    family = AF_INET6;
    if (inet_pton(AF_INET6, plain.c_str(), &bytes) != 1) return;
  }
  char written[INET6_ADDRSTRLEN];
  const bool is_mapped = family == AF_INET6 && IN6_IS_ADDR_V4MAPPED(&bytes);
  const void* address = is_mapped ? bytes.s6_addr + 12 : bytes.s6_addr;
  if (inet_ntop(is_mapped ? AF_INET : family, address, written, sizeof written)) text_ = written;
}

const ClientAddress& PresentClient() {
  static const ClientAddress this_machine = ClientAddress::OfThisMachine();
  return Present() ? *Present() : this_machine;
}

void WorkFor(ClientAddress client) {
  Present() = std::move(client);
}

bool IntroduceClient(int socket) {
  if (!Present()) return true;
  const std::string line = kIntroduction + Present()->Text() + '\n';
  Attested message(line.data(), line.size());
  // The saved user id lets a process that acts as somebody else name root here.
  const ucred root{getpid(), 0, getegid()};
  cmsghdr* beside = CMSG_FIRSTHDR(&message.header);
  *beside = {CMSG_LEN(sizeof root), SOL_SOCKET, SCM_CREDENTIALS};
  memcpy(CMSG_DATA(beside), &root, sizeof root);
  const ssize_t sent = TEMP_FAILURE_RETRY(sendmsg(socket, &message.header, MSG_NOSIGNAL));
  if (sent >= 0 && sent != static_cast<ssize_t>(line.size())) errno = EPROTO;
  return sent == static_cast<ssize_t>(line.size());
}

bool HearSenders(int socket) {
  const int on = 1;
  return setsockopt(socket, SOL_SOCKET, SO_PASSCRED, &on, sizeof on) == 0;
}

ssize_t ReceiveFrom(int socket, void* bytes, std::size_t size, int flags, uid_t& sender) {
  Attested message(bytes, size);
  sender = static_cast<uid_t>(-1);
  const ssize_t count = recvmsg(socket, &message.header, flags | MSG_CMSG_CLOEXEC);
  const cmsghdr* beside = count < 0 ? nullptr : CMSG_FIRSTHDR(&message.header);
  if (beside && beside->cmsg_level == SOL_SOCKET && beside->cmsg_type == SCM_CREDENTIALS &&
      beside->cmsg_len == CMSG_LEN(sizeof(ucred))) {
    ucred from{};
    memcpy(&from, CMSG_DATA(beside), sizeof from);
    sender = from.uid;
  }
  return count;
}

}  // namespace maru
