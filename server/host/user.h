#pragma once

#include <json/value.h>
#include <sys/types.h>

#include <optional>
#include <string>

/// Accounts as sessions know them. What asks the name service or PAM may wait for it: that is
/// for child processes only, so that the host never waits.
namespace maru::server {

struct User {
  /// As the name service spells it.
  std::string name;
  uid_t uid = 0;
  /// A digest of the account's password entry where this process can read it, else empty. Changes
  /// when the password is changed or locked.
  std::string stamp;
  bool is_admin = false;
};

/// What the web is told of its user.
Json::Value Description(const User& user);

/// Nothing when there is no such account or it has expired.
std::optional<User> FindUser(const std::string& name);

/// Whether PAM (its account part) still admits the user. May take its time.
bool IsAdmitted(const std::string& name);

/// Does what PAM service "maruseeker" says: authentication, then the account's own state. `source`
/// is the client's address, for PAM's log. May take seconds. Nothing when refused.
std::optional<User> SignIn(const std::string& name, const std::string& password,
                           const std::string& source);

}  // namespace maru::server
