#include "server/frames.h"

#include <errno.h>
#include <sodium.h>
#include <sys/socket.h>

#include <charconv>
#include <cstdint>
#include <cstring>
#include <system_error>

namespace maru::server {

SocketPair MakeSocketPair() {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) < 0)
    throw std::system_error(errno, std::generic_category(), "socketpair");
  return {Descriptor(ends[0]), Descriptor(ends[1])};
}

SendResult SendPacket(int socket, std::string_view packet, Wait wait, int passed) {
  iovec bytes{const_cast<char*>(packet.data()), packet.size()};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
  msghdr message{};
  message.msg_iov = &bytes;
  message.msg_iovlen = 1;
  if (passed >= 0) {
    message.msg_control = control;
    message.msg_controllen = sizeof(control);
    cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof(int));
    memcpy(CMSG_DATA(header), &passed, sizeof(int));
  }
  const int flags = MSG_NOSIGNAL | (wait == Wait::kNo ? MSG_DONTWAIT : 0);
  ssize_t sent;
  do {
    sent = sendmsg(socket, &message, flags);
  } while (sent < 0 && errno == EINTR);
  const int error = std::exchange(errno, 0);
  if (sent >= 0) return SendResult::kDone;
  // Too many descriptors under way is also a matter of time.
  const bool full = error == EAGAIN || error == ENOBUFS || error == ETOOMANYREFS;
  return full ? SendResult::kFull : SendResult::kGone;
}

void Packet::Wipe() {
  sodium_memzero(room_.get(), size_);
}

ReceiveResult ReceivePacket(int socket, Packet& packet, Wait wait) {
  packet.passed.Close();
  packet.size_ = 0;
  iovec bytes{packet.room_.get(), kMaxPacket};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))];
  msghdr message{};
  message.msg_iov = &bytes;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof(control);
  const int flags = MSG_CMSG_CLOEXEC | (wait == Wait::kNo ? MSG_DONTWAIT : 0);
  ssize_t received;
  do {
    received = recvmsg(socket, &message, flags);
    // ECONNRESET comes once, ahead of what the other end has sent, when that end was closed before
    // it had read everything: a refusal may well wait behind it.
  } while (received < 0 && (errno == EINTR || errno == ECONNRESET));
  const int error = std::exchange(errno, 0);
  if (received < 0) return error == EAGAIN ? ReceiveResult::kNothing : ReceiveResult::kEnd;
  for (cmsghdr* header = CMSG_FIRSTHDR(&message); header; header = CMSG_NXTHDR(&message, header)) {
    if (header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) continue;
    int fd;
    memcpy(&fd, CMSG_DATA(header), sizeof(fd));
    packet.passed = Descriptor(fd);
  }
  if (received == 0 || (message.msg_flags & MSG_TRUNC)) return ReceiveResult::kEnd;
  packet.size_ = static_cast<std::size_t>(received);
  return ReceiveResult::kPacket;
}

std::string PackFields(std::initializer_list<std::string_view> fields) {
  std::string packet;
  for (const std::string_view field : fields) {
    const auto size = static_cast<std::uint32_t>(field.size());
    packet.append(reinterpret_cast<const char*>(&size), sizeof(size));
    packet.append(field);
  }
  return packet;
}

bool TakeField(std::string_view& packet, std::string_view& field) {
  std::uint32_t size;
  if (packet.size() < sizeof(size)) return false;
  memcpy(&size, packet.data(), sizeof(size));
  packet.remove_prefix(sizeof(size));
  if (packet.size() < size) return false;
  field = packet.substr(0, size);
  packet.remove_prefix(size);
  return true;
}

std::optional<unsigned long> ParseNumber(std::string_view text, unsigned long limit) {
  unsigned long number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size() || number > limit)
    return std::nullopt;
  return number;
}

}  // namespace maru::server
