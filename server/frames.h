#pragma once

#include <array>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "server/descriptor.h"

/// Packets between the server's processes: sequenced-packet sockets, which keep the borders of
/// packets and tell each side when the other went away.
namespace maru::server {

/// The longest packet. Fits the system's default socket buffers three times.
constexpr std::size_t kMaxPacket = 64u << 10;

/// Two connected SOCK_SEQPACKET sockets, closed on exec.
struct SocketPair {
  Descriptor first, second;
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
  Descriptor passed;
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

/// Several texts of any bytes in one, each behind its length (32 bits, this machine's order).
std::string PackFields(std::initializer_list<std::string_view> fields);

/// The texts of a packet (views into it), or nothing unless it holds exactly N of them.
template <std::size_t N>
std::optional<std::array<std::string_view, N>> UnpackFields(std::string_view packet);

/// Takes one text off the front of `packet`; false when it is cut short.
bool TakeField(std::string_view& packet, std::string_view& field);

template <std::size_t N>
std::optional<std::array<std::string_view, N>> UnpackFields(std::string_view packet) {
  std::array<std::string_view, N> fields;
  for (std::string_view& field : fields)
    if (!TakeField(packet, field)) return std::nullopt;
  if (!packet.empty()) return std::nullopt;
  return fields;
}

/// A decimal number without sign, at most `limit`; nothing for any other text.
std::optional<unsigned long> ParseNumber(std::string_view text, unsigned long limit);

}  // namespace maru::server
