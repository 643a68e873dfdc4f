#pragma once

#include <sys/types.h>

#include <stdexcept>
#include <string>
#include <type_traits>

#include "system/preferences.h"

namespace maruseeker::pref {

/// Preferences of one user: "enable_history" (true), "max_history_num" (100),
/// "hide_seeker_index_prompt" (false), "hide_searchnow_index_prompt" (false), "max_fragment_num"
/// (3). What is not set, or not well, reads as that default.
class Preference {
 public:
  explicit Preference(uid_t uid) : uid_(uid) {}

  /// T is bool or int. Throws std::invalid_argument for a key that there is not with that type.
  template <class T>
  T Get(const std::string& key) const {
    if (maru::FindPreference(key).is_flag != std::is_same_v<T, bool>) {
      throw std::invalid_argument("no such preference: " + key);
    }
    return static_cast<T>(maru::Preferences(uid_).Get(key));
  }

 private:
  uid_t uid_;
};

}  // namespace maruseeker::pref
