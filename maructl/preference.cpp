#include <charconv>
#include <cstdio>
#include <optional>
#include <stdexcept>

#include "maructl/commands.h"
#include "system/accounts.h"
#include "system/preferences.h"
#include "system/text.h"
#include "system/throw_errno.h"

namespace maru::control {
namespace {

Preferences PreferencesOf(const std::string& user) {
  const std::optional<Account> account = AccountByName(user);
  if (!account) throw std::runtime_error("no such user: " + user);
  return Preferences(account->uid);
}

int Flag(const std::string& value) {
  const std::optional<bool> truth = Truth(value);
  if (!truth) throw std::invalid_argument("not yes or no: " + value);
  return *truth ? 1 : 0;
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
  const int value = PreferencesOf(user).Get(key);
  if (FindPreference(key).is_flag) {
    std::printf("%s\n", value ? "yes" : "no");
  } else {
    std::printf("%d\n", value);
  }
  return kGood;
}

int SetPreference(const std::string& user, const std::string& key, const std::string& value) {
  const Preferences preferences = PreferencesOf(user);
  if (!preferences.Set(key, FindPreference(key).is_flag ? Flag(value) : Number(value))) {
    ThrowErrno("cannot store it");
  }
  return kGood;
}

}  // namespace maru::control
