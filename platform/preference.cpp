#include "platform/preference.h"

#include <stdexcept>

#include "system/preferences.h"

namespace maruseeker::pref {
namespace {

int Read(uid_t uid, const std::string& key, bool is_flag) {
  if (maru::FindPreference(key).is_flag != is_flag) {
    throw std::invalid_argument("no such preference: " + key);
  }
  return maru::Preferences(uid).Get(key);
}

}  // namespace

template <>
bool Preference::Get<bool>(const std::string& key) const {
  return Read(uid_, key, true) != 0;
}

template <>
int Preference::Get<int>(const std::string& key) const {
  return Read(uid_, key, false);
}

}  // namespace maruseeker::pref
