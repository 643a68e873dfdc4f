#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

/// Accounts as the web server looks at them. Every function asks the name service and may wait for
/// it: for child processes only, so that the host never waits.
namespace maru::server {

struct Account {
  /// As the name service spells it.
  std::string name;
  uid_t uid = 0;
  /// A digest of the account's password entry where this process can read it, else empty. Changes
  /// when the password is changed or locked.
  std::string stamp;
};

/// Nothing when there is no such account or it has expired.
std::optional<Account> FindAccount(const std::string& name);

/// Whether `name` is in the administrators' group.
bool IsAdministrator(const std::string& name);

/// Whether PAM (its account part) still admits the account. May take its time.
bool IsAdmitted(const std::string& name);

/// Does what PAM service "maruseeker" says: authentication, then the account's own state. `source`
/// is the client's address, for PAM's log. May take seconds. Nothing when refused.
std::optional<Account> SignIn(const std::string& user, const std::string& password,
                              const std::string& source);

}  // namespace maru::server
