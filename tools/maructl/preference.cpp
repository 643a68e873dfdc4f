#include "system/preference.h"

#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <optional>
#include <stdexcept>

#include "platform/account.h"
#include "tools/maructl/commands.h"

namespace maru::control {
namespace {

using maruseeker::pref::Preference;

Preference PreferenceOf(const std::string& user) {
  MARUUSER* account = nullptr;
  if (MARUUserGet(user.c_str(), &account) != 0) throw std::runtime_error("no such user: " + user);
  const uid_t uid = account->nUid;
  MARUUserFree(account);
  return Preference(uid);
}

/// None when the key is of another type.
template <class T>
std::optional<T> Get(const Preference& preference, const std::string& key) {
  try {
    return preference.Get<T>(key);
  } catch (const std::invalid_argument&) {
    return std::nullopt;
  }
}

template <class T>
int Store(Preference& preference, const std::string& key, T value) {
  if (!preference.Set<T>(key, value)) {
    throw std::runtime_error(std::string("cannot store it: ") + std::strerror(errno));
  }
  return kGood;
}

bool Flag(const std::string& value) {
  if (value == "yes" || value == "true") return true;
  if (value == "no" || value == "false") return false;
  throw std::invalid_argument("not yes or no: " + value);
}

int Number(const std::string& value) {
  int number = 0;
  const char* end = value.data() + value.size();
  const auto [at, error] = std::from_chars(value.data(), end, number);
  if (error != std::errc() || at != end) throw std::invalid_argument("not a number: " + value);
  return number;
}

}  // namespace

int GetPreference(const std::string& user, const std::string& key) {
  const Preference preference = PreferenceOf(user);
  if (const auto flag = Get<bool>(preference, key)) {
    std::printf("%s\n", *flag ? "yes" : "no");
  } else {
    std::printf("%d\n", preference.Get<int>(key));
  }
  return kGood;
}

int SetPreference(const std::string& user, const std::string& key, const std::string& value) {
  Preference preference = PreferenceOf(user);
  if (Get<bool>(preference, key)) return Store(preference, key, Flag(value));
  preference.Get<int>(key);
  return Store(preference, key, Number(value));
}

}  // namespace maru::control
