#include "server/wire/packets.h"

#include <errno.h>
#include <sodium.h>
#include <sys/socket.h>

#include "system/descriptor_passing.h"
#include "system/throw_errno.h"

namespace maru::server {
namespace {

int Flags(Wait wait) {
  return wait == Wait::kNo ? MSG_DONTWAIT : 0;
}

}  // namespace

SocketPair MakeSocketPair() {
  int ends[2];
  CheckErrno(socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) == 0, "socketpair");
  return {UniqueFd(ends[0]), UniqueFd(ends[1])};
}

SendResult SendPacket(int socket, std::string_view packet, Wait wait, int passed) {
  if (SendWithDescriptor(socket, packet.data(), packet.size(), passed, Flags(wait)) >= 0)
    return SendResult::kDone;
  // Too many descriptors under way is also a matter of time.
  const bool full = errno == EAGAIN || errno == ENOBUFS || errno == ETOOMANYREFS;
  return full ? SendResult::kFull : SendResult::kGone;
}

void Packet::Wipe() {
  sodium_memzero(room_.get(), size_);
}

ReceiveResult ReceivePacket(int socket, Packet& packet, Wait wait) {
  packet.passed.Close();
  packet.size_ = 0;
  ssize_t size;
  do {
    // With MSG_TRUNC the size is that of the packet as it was sent, also where it does not fit.
    size = ReceiveWithDescriptor(socket, packet.room_.get(), kMaxPacket, &packet.passed,
                                 Flags(wait) | MSG_TRUNC);
    // ECONNRESET comes once, ahead of what the other end has sent, when that end was closed before
    // it had read everything: a refusal may well wait behind it.
  } while (size < 0 && errno == ECONNRESET);
  if (size < 0) return errno == EAGAIN ? ReceiveResult::kNothing : ReceiveResult::kEnd;
  // A sequenced-packet socket tells its end by an empty packet, which nobody sends.
  if (size == 0 || size > static_cast<ssize_t>(kMaxPacket)) return ReceiveResult::kEnd;
  packet.size_ = static_cast<std::size_t>(size);
  return ReceiveResult::kPacket;
}

}  // namespace maru::server
