#pragma once

#include <string>

#include "system/unique_fd.h"

namespace maru {

/// Where the search daemon listens.
inline constexpr const char* kDaemonSocket = "/var/run/maruelasticd.sock";

}  // namespace maru

namespace marudaemon {

/// One connection to a daemon: JSON Lines, a message is one text without line breaks and "\n"
/// behind it. Every operation has a time-out, goes on after EINTR and partial reads and writes,
/// never raises SIGPIPE, and returns false with errno where the system set one (ETIMEDOUT,
/// EMSGSIZE, EPIPE, EPROTO among them; 0 for an end of stream between messages).
class SockConnection {
 public:
  static constexpr std::size_t kMaxMessage = 64u << 20;
  /// For one whole message, in milliseconds. A search streams: each message has its own time.
  static constexpr int kConnectTimeout = 5'000;
  static constexpr int kSendTimeout = 30'000;
  static constexpr int kReceiveTimeout = 60'000;

  virtual ~SockConnection() = default;
  SockConnection(const SockConnection&) = delete;
  SockConnection& operator=(const SockConnection&) = delete;

  virtual bool Connect() = 0;
  /// Sends one message; a text with a line break or over kMaxMessage is refused (EMSGSIZE, EINVAL).
  bool Send(const std::string& message);
  /// Takes the next message, the whole of it, without its line end.
  bool Recv(std::string& message);
  void Disconnect();

 protected:
  SockConnection() = default;
  maru::UniqueFd descriptor_;

 private:
  std::string received_;
  /// Where in it the next message begins.
  std::size_t begin_ = 0;
};

class DomainSockConnection : public SockConnection {
 public:
  explicit DomainSockConnection(std::string path) : path_(std::move(path)) {}
  /// Says also for whom this process works (system/client_address.h), when it was told.
  bool Connect() override;

 private:
  std::string path_;
};

}  // namespace marudaemon
