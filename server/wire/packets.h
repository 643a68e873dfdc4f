#pragma once

#include <memory>
#include <string_view>

#include "system/unique_fd.h"

/// Packets between the server's processes: sequenced-packet sockets, which keep the borders of
/// packets and tell each side when the other went away.
namespace maru::server {

/// The longest packet. Fits the system's default socket buffers three times.
constexpr std::size_t kMaxPacket = 64u << 10;

/// Two connected SOCK_SEQPACKET sockets, closed on exec.
struct SocketPair {
  UniqueFd first, second;
};
/// Throws std::system_error.
SocketPair MakeSocketPair();

enum class Wait { kNo, kYes };

enum class SendResult { kDone, kFull, kGone };
/// Sends one packet of 1 to kMaxPacket bytes and, unless `passed` is -1, a descriptor with it
/// (which stays the caller's too). `kFull` only without waiting: nothing was sent, try later.
/// `kGone`: the other end is closed, or the packet cannot be sent at all.
SendResult SendPacket(int socket, std::string_view packet, Wait wait, int passed = -1);

enum class ReceiveResult { kPacket, kNothing, kEnd };

/// What ReceivePacket fills; made once and used for many packets.
class Packet {
 public:
  Packet() : room_(std::make_unique<char[]>(kMaxPacket)) {}
  std::string_view View() const { return {room_.get(), size_}; }
  /// The descriptor that came with the packet; empty when none did.
  UniqueFd passed;
  /// Overwrites the bytes, for packets that held a password.
  void Wipe();

 private:
  friend ReceiveResult ReceivePacket(int socket, Packet& packet, Wait wait);
  std::unique_ptr<char[]> room_;
  std::size_t size_ = 0;
};

/// `kNothing` only without waiting. `kEnd`: the other end is closed, or sent a packet that is too
/// long.
ReceiveResult ReceivePacket(int socket, Packet& packet, Wait wait);

}  // namespace maru::server
