#pragma once

#include <json/value.h>

#include <string>

#include "common/common.h"

/// Talking to the search daemon: one request, one connection, closed again on every way out.
namespace maruseeker::webapi {

inline constexpr const char* kDaemonSocket = "/var/run/maruelasticd.sock";

/// Whether the daemon's socket file is there (not whether somebody listens).
bool IsDaemonSocketThere();

/// What differs from method to method.
struct ExchangeRules {
  /// What the log says when the request cannot be sent.
  const char* send_failure;
  /// Whether a reply with "success" false is thrown as the daemon says it, unlogged.
  bool judge_success;
};

/// A good reply, or a failure that the method logs and throws in its own name.
struct DaemonReply {
  /// The reply, {"success", "data" or "error"}; where success is not judged, any JSON.
  Json::Value body = Json::Value(Json::objectValue);
  bool failed = false;
  ErrorCode code = {};
  /// The line for the log.
  std::string failure;
};

/// Sends {"command", "data"} and receives the one reply. A reply that is no JSON counts as
/// malformed; where success is judged, so does one that is no object, or that reports a failure
/// without saying which. `errno` is what the connection left, and 0 where the text was at fault.
DaemonReply Exchange(const Json::Value& request, const ExchangeRules& rules);

/// Logs a failed exchange in the caller's name and throws its error.
#define MARU_THROW_IF_FAILED(reply)            \
  do {                                         \
    if ((reply).failed) {                      \
      MARU_LOG("%s", (reply).failure.c_str()); \
      throw ::maruseeker::Error((reply).code); \
    }                                          \
  } while (false)

}  // namespace maruseeker::webapi
