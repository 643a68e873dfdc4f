#pragma once

#include <cstdint>
#include <stdexcept>
#include <string>

namespace maruseeker {

/// What a client is told of a failure. The search daemon's errors go through as they are numbered
/// there, which may be otherwise than here.
enum ErrorCode : std::int32_t {
  kErrorUnknown = 117,
  kErrorBadParameter = 120,
  kErrorDaemonExchange = 121,
  /// An index or a database cannot be read or written: to a client, the daemon has no answer.
  kErrorStorage = kErrorDaemonExchange,
  kErrorPlatform = 502,
  kErrorSwitchUser = 503,
  kErrorNoPermission = 507,
  kErrorDaemonUnreachable = 605,
  kErrorShare = 800,
  kErrorUser = 801,
  kErrorOutdated = 1600,
  kErrorHistory = 9999,
};

/// The one exception type: a code for the client and a reason for the log. `what()` is the reason
/// alone, so that a log line shows nothing but the reason.
class Error : public std::runtime_error {
 public:
  explicit Error(ErrorCode code, const std::string& reason = {})
      : std::runtime_error("MaruSeeker error, code=" + std::to_string(code) +
                           (reason.empty() ? "" : ", reason=[" + reason + "]")),
        code_(code),
        reason_(reason) {}

  const char* what() const noexcept override { return reason_.c_str(); }

  ErrorCode Code() const { return code_; }
  const std::string& Reason() const { return reason_; }

 private:
  ErrorCode code_;
  std::string reason_;
};

}  // namespace maruseeker
