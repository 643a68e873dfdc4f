#pragma once

#include <sys/types.h>

#include <string>

namespace maruseeker::pref {

/// Preferences of one user: "enable_history" (true), "max_history_num" (100),
/// "hide_seeker_index_prompt" (false), "hide_searchnow_index_prompt" (false), "max_fragment_num"
/// (3). What is not set, or not well, reads as that default.
class Preference {
 public:
  explicit Preference(uid_t uid) : uid_(uid) {}

  /// T is bool or int. Throws std::invalid_argument for a key that there is not with that type.
  template <class T>
  T Get(const std::string& key) const;

 private:
  uid_t uid_;
};

template <>
bool Preference::Get<bool>(const std::string& key) const;
template <>
int Preference::Get<int>(const std::string& key) const;

}  // namespace maruseeker::pref
