#pragma once

#include <sys/types.h>

#include <string>

namespace maru {

/// One row of the table of preferences, which stands in preferences.cpp.
struct PreferenceKey {
  const char* name;
  /// 0 or 1, and a truth in the file.
  bool is_flag;
  int fallback;
  int minimum, maximum;
};

/// Throws std::invalid_argument when there is no such preference.
const PreferenceKey& FindPreference(const std::string& name);

/// Preferences of one user: a small JSON file per user id in the state folder, readable by that
/// user. A missing file, key or ill-typed value reads as the default. Throws as FindPreference.
class Preferences {
 public:
  explicit Preferences(uid_t uid);

  int Get(const std::string& name) const;
  /// Stores a value (atomically); for root and the service. False with errno when the file cannot
  /// be written; throws std::invalid_argument when the value is out of bounds.
  bool Set(const std::string& name, int value) const;

 private:
  uid_t uid_;
  std::string path_;
};

}  // namespace maru
