#pragma once

#include <cstdint>
#include <string>

namespace maruseeker::sdk {

/// Lets the process act as another user for a scope. Every change of identity holds SDKMutex().
/// What fails throws Error 503, after a log line.
class SDKCredentials {
 public:
  /// Changes nothing; the destructor comes back to who the process is now.
  SDKCredentials();
  /// Switches to the user at once. The destructor comes back to *this* user, not to the one before:
  /// a scope inside a request ends as whom it began to act, and the request's own scope follows.
  explicit SDKCredentials(const std::string& name);
  /// Does nothing while the effective ids are those of construction. Throws when coming back fails,
  /// but only logs it while another exception is on its way. Hence no smart pointer may own one.
  ~SDKCredentials() noexcept(false);
  SDKCredentials(const SDKCredentials&) = delete;
  SDKCredentials& operator=(const SDKCredentials&) = delete;

  /// Switches to the user; to "root" for a member of the administrators' group.
  void AsUser(const std::string& name);

 private:
  std::uint32_t euid_;
  std::uint32_t egid_;
  std::string username_;
  /// Exceptions on their way at construction.
  int exceptions_;
};

}  // namespace maruseeker::sdk
