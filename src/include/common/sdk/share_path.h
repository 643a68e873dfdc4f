#pragma once

#include <string>

namespace maruseeker::sdk {

struct User;

class SharePathMgr {
 public:
  /// What users call the file: "/volume1/photo/a.jpg" is "/photo/a.jpg", and with the home
  /// service the user's own "/volume1/homes/alice/x" is "/home/x". Empty, with a log line, when the
  /// path has no such form; throws nothing for a bad path.
  static std::string GetSharePath(const std::string& vol_path, const User& user);
};

}  // namespace maruseeker::sdk
