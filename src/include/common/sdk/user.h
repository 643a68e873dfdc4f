#pragma once

#include <cstdint>
#include <string>

struct MARUUSER;

namespace maruseeker::sdk {

/// One account, as it stood when this was made. Making one takes SDKMutex() and throws Error 801
/// when there is no such account.
struct User {
  explicit User(const std::string& user_name);
  explicit User(std::uint32_t user_id);

  std::string name;
  std::uint32_t uid = 0;
  std::uint32_t gid = 0;
  /// Where the account comes from, which the platform wants to know before it tells of homes.
  int auth_type = 0;
  /// Whether this account's files at home are shared.
  bool home_enabled = false;

 private:
  void Fill(const MARUUSER& entry);
};

}  // namespace maruseeker::sdk
