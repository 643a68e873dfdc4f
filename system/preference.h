#pragma once

#include <sys/types.h>

#include <string>

namespace maruseeker::pref {

/// Preferences of one user: a small JSON file per user id in the state folder, readable by that
/// user. One table of keys with type, default and bounds stands in preference.cpp: "enable_history"
/// (true), "max_history_num" (100), "hide_seeker_index_prompt" (false),
/// "hide_searchnow_index_prompt" (false), "max_fragment_num" (3). A missing file, key or ill-typed
/// value reads as the default.
class Preference {
 public:
  explicit Preference(uid_t uid);

  /// T is bool or int. Throws std::invalid_argument for a key that is not in the table with that
  /// type.
  template <class T>
  T Get(const std::string& key) const;

  /// Stores a value (atomically); for root and the service. False with errno when the file cannot
  /// be written; throws as Get does, and when the value is out of bounds.
  template <class T>
  bool Set(const std::string& key, T value);

 private:
  uid_t uid_;
  std::string path_;
};

template <>
bool Preference::Get<bool>(const std::string& key) const;
template <>
int Preference::Get<int>(const std::string& key) const;
template <>
bool Preference::Set<bool>(const std::string& key, bool value);
template <>
bool Preference::Set<int>(const std::string& key, int value);

}  // namespace maruseeker::pref
