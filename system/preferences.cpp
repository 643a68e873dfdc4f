#include "system/preferences.h"

#include <errno.h>
#include <sys/stat.h>

#include <stdexcept>

#include "system/config.h"
#include "system/json.h"
#include "system/keep_errno.h"

namespace maru {
namespace {

constexpr PreferenceKey kKeys[] = {
    {"enable_history", true, 1, 0, 1},           {"max_history_num", false, 100, 1, 10'000},
    {"hide_seeker_index_prompt", true, 0, 0, 1}, {"hide_searchnow_index_prompt", true, 0, 0, 1},
    {"max_fragment_num", false, 3, 1, 100},
};

/// What the file holds; an empty object when it cannot be read.
Json::Value Read(const std::string& path) {
  const KeepErrno keep;
  Json::Value values;
  if (json::FromFile(path, values) && values.isObject()) return values;
  return Json::Value(Json::objectValue);
}

bool InBounds(const PreferenceKey& key, int number) {
  return number >= key.minimum && number <= key.maximum;
}

}  // namespace

const PreferenceKey& FindPreference(const std::string& name) {
  for (const PreferenceKey& key : kKeys) {
    if (key.name == name) return key;
  }
  throw std::invalid_argument("no such preference: " + name);
}

Preferences::Preferences(uid_t uid)
    : uid_(uid), path_(Config::Get().state_dir + "/preference/" + std::to_string(uid) + ".json") {}

int Preferences::Get(const std::string& name) const {
  const PreferenceKey& key = FindPreference(name);
  const Json::Value values = Read(path_);
  if (key.is_flag) return json::BoolMember(values, key.name, key.fallback != 0) ? 1 : 0;
  const int number = json::IntMember(values, key.name, key.fallback);
  return InBounds(key, number) ? number : key.fallback;
}

bool Preferences::Set(const std::string& name, int value) const {
  const PreferenceKey& key = FindPreference(name);
  if (!InBounds(key, value)) throw std::invalid_argument("out of bounds: " + name);
  Json::Value values = Read(path_);
  values[key.name] = key.is_flag ? Json::Value(value != 0) : Json::Value(value);
  const std::string folder = path_.substr(0, path_.rfind('/'));
  // The folder may be passed through by everyone, so that each user reaches the own file.
  if (mkdir(folder.c_str(), 0711) != 0 && errno != EEXIST) return false;
  return json::ToFile(values, path_, uid_);
}

}  // namespace maru
