#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>

/// From where somebody searches, and how a process that serves somebody else's request says so at
/// the daemon.
namespace maru {

class ClientAddress {
 public:
  /// Nothing is known, and no rule admits it.
  ClientAddress() = default;
  /// Of anything but an IPv4 or IPv6 address (which may have a zone) nothing is known.
  explicit ClientAddress(const std::string& text);
  /// Of who uses no network: 127.0.0.1.
  static ClientAddress OfThisMachine() { return ClientAddress("127.0.0.1"); }

  /// As the C library writes it; IPv4 also where it came in IPv6. Empty when nothing is known.
  const std::string& Text() const { return text_; }

 private:
  std::string text_;
};

/// For whom this process works: this machine's until `WorkFor` was called. One thread.
const ClientAddress& PresentClient();
void WorkFor(ClientAddress client);

/// Says at a daemon's socket, first of all, for whom this process works, as a line that the kernel
/// attests to be root's: only a process that is or was root can say it. Says nothing before
/// `WorkFor`. False with errno.
bool IntroduceClient(int socket);

/// The other side. `HearSenders` lets the kernel attest who sends; false with errno.
bool HearSenders(int socket);
/// recv; `sender` is the user who sent these bytes, -1 when the kernel does not say. Bytes of
/// several users do not come together; descriptors that come with them are thrown away.
ssize_t ReceiveFrom(int socket, void* bytes, std::size_t size, int flags, uid_t& sender);

/// The line is this, the address, and a line break. No JSON text begins so.
inline constexpr char kIntroduction[] =
    "\x01"
    "client ";

}  // namespace maru
