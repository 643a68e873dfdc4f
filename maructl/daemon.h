#pragma once

#include <json/value.h>

#include <string>

#include "system/daemon_connection.h"

namespace maru::control {

/// One request to the search daemon and its replies, as this user. Throws std::runtime_error when
/// the daemon cannot be reached or breaks off.
class Daemon {
 public:
  Daemon();

  void Ask(const std::string& command, const Json::Value& data);
  /// The next message of the reply.
  Json::Value Next();
  /// The data of a reply in one message; an error reply is thrown.
  Json::Value Reply();
  /// Throws what an error reply says.
  static void Judge(const Json::Value& message);

 private:
  marudaemon::DomainSockConnection connection_;
};

}  // namespace maru::control
