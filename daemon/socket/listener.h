#pragma once

#include <sys/types.h>

#include <string>

#include "system/rights.h"
#include "system/unique_fd.h"

namespace maru::daemon {

/// The daemon's listening socket, a file of the identity that the daemon will have. Where that one
/// cannot write in the socket's folder (/run is root's), the socket lies in a folder of its own
/// beside it, "maruelasticd", and the public path is a link there: so the daemon can take its
/// socket away again.
class Listener {
 public:
  /// Makes the socket, open to everybody. What a daemon that is gone left behind is replaced in one
  /// step; a socket that somebody serves, or anything else in the way, is a std::runtime_error.
  Listener(const std::string& path, const Identity& owner);
  /// Takes the socket away, unless another daemon has replaced it.
  ~Listener();
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;

  int Socket() const { return socket_.Get(); }

 private:
  void Bind(const Identity& owner);

  /// Where the socket itself lies.
  std::string place_;
  UniqueFd socket_;
  dev_t device_ = 0;
  ino_t inode_ = 0;
};

}  // namespace maru::daemon
