#pragma once

#include <string>
#include <unordered_map>

#include "server/host/clock.h"

/// How often signing in may fail.
namespace maru::server {

/// Counts failed attempts in windows of kWindow, by user and address together, by address, and by
/// user. An attempt counts as failed until it has succeeded, so that attempts made at once gain
/// nothing. One thread.
class SignInLimits {
 public:
  /// Takes the attempt into account. False: too many have failed; the attempt is not to be made.
  bool Admit(const std::string& user, const std::string& address, Seconds now);
  /// The admitted attempt was good.
  void Succeeded(const std::string& user, const std::string& address);

  static constexpr Seconds kWindow = 300;
  /// One client guessing one user's password.
  static constexpr unsigned kMaxPair = 5;
  /// One client going through users. Higher, since many people may share an address.
  static constexpr unsigned kMaxAddress = 50;
  /// Many clients guessing one user's password. Higher, so that it is hard to lock somebody out.
  static constexpr unsigned kMaxUser = 100;
  /// Beyond so many counters, attempts from new users and addresses are refused.
  static constexpr std::size_t kMaxCounters = 30'000;

 private:
  struct Counter {
    Seconds since = 0;
    unsigned failed = 0;
  };

  void Forget(Seconds now);

  std::unordered_map<std::string, Counter> counters_;
  /// The counters are looked through now and then only, however many attempts are made.
  Seconds next_forget_ = 0;
};

}  // namespace maru::server
