#include "common/sdk/share_path.h"

#include "common/common.h"
#include "common/sdk/user.h"
#include "platform/account.h"
#include "platform/share.h"

namespace maruseeker::sdk {
namespace {

constexpr std::size_t kPathSize = 4096;

/// The path from its first "/homes/" on, or the whole path.
std::string FromHomes(const std::string& path) {
  const std::size_t homes = path.find("/homes/");
  return homes == std::string::npos ? path : path.substr(homes);
}

}  // namespace

std::string SharePathMgr::GetSharePath(const std::string& vol_path, const User& user) {
  char name[kPathSize] = {};
  char share_path[kPathSize] = {};
  if (MARUShareNamePathGet(vol_path.c_str(), name, sizeof(name), share_path, sizeof(share_path)) !=
      0) {
    MARU_LOG("MARUShareNamePathGet failed, vol_path=%s", vol_path.c_str());
    return {};
  }
  if (name == std::string("homes") && user.home_enabled) {
    char home_path[kPathSize] = {};
    if (MARUServiceHomePathGet(user.name.c_str(), home_path, sizeof(home_path)) < 0) {
      MARU_LOG("MARUServiceHomePathGet failed, user=%s", user.name.c_str());
      return {};
    }
    const std::string home = FromHomes(home_path);
    const std::string place = FromHomes(vol_path);
    if (StringStartWith(place + "/", home + "/")) return "/home" + place.substr(home.size());
  }
  const std::size_t share_length = std::string(share_path).size();
  if (share_length <= vol_path.size()) return "/" + (name + vol_path.substr(share_length));
  MARU_LOG("Malformed input: %s, %s", vol_path.c_str(), share_path);
  return {};
}

}  // namespace maruseeker::sdk
