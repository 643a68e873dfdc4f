#include "system/preference.h"

#include <errno.h>
#include <sys/stat.h>

#include <stdexcept>
#include <string_view>

#include "system/config.h"
#include "system/json.h"
#include "system/keep_errno.h"
#include "system/whole_file.h"

namespace maruseeker::pref {
namespace {

struct Key {
  std::string_view name;
  Json::ValueType type;
  int fallback;
  int minimum, maximum;
};

constexpr Key kKeys[] = {
    {"enable_history", Json::booleanValue, 1, 0, 1},
    {"max_history_num", Json::intValue, 100, 1, 10'000},
    {"hide_seeker_index_prompt", Json::booleanValue, 0, 0, 1},
    {"hide_searchnow_index_prompt", Json::booleanValue, 0, 0, 1},
    {"max_fragment_num", Json::intValue, 3, 1, 100},
};

constexpr std::size_t kMaxFile = 64u << 10;

const Key& Find(const std::string& name, Json::ValueType type) {
  for (const Key& key : kKeys) {
    if (key.name == name && key.type == type) return key;
  }
  throw std::invalid_argument("no such preference: " + name);
}

/// What the file holds; an empty object when it cannot be read.
Json::Value Read(const std::string& path) {
  const maru::KeepErrno keep;
  std::string text;
  Json::Value values;
  if (!maru::ReadWholeFile(path, kMaxFile, text) || !maru::json::FromString(text, values) ||
      !values.isObject()) {
    values = Json::Value(Json::objectValue);
  }
  return values;
}

bool InBounds(const Key& key, int number) {
  return number >= key.minimum && number <= key.maximum;
}

bool Store(const std::string& path, uid_t uid, const std::string& key, const Json::Value& value) {
  Json::Value values = Read(path);
  values[key] = value;
  const std::string folder = path.substr(0, path.rfind('/'));
  // The folder may be passed through by everyone, so that each user reaches the own file.
  if (mkdir(folder.c_str(), 0711) != 0 && errno != EEXIST) return false;
  return maru::WriteWholeFile(path, maru::json::ToString(values) + "\n", 0600, uid);
}

}  // namespace

Preference::Preference(uid_t uid)
    : uid_(uid),
      path_(maru::Config::Get().state_dir + "/preference/" + std::to_string(uid) + ".json") {}

template <>
bool Preference::Get<bool>(const std::string& key) const {
  const Key& row = Find(key, Json::booleanValue);
  return maru::json::BoolMember(Read(path_), key.c_str(), row.fallback != 0);
}

template <>
int Preference::Get<int>(const std::string& key) const {
  const Key& row = Find(key, Json::intValue);
  const int number = maru::json::IntMember(Read(path_), key.c_str(), row.fallback);
  return InBounds(row, number) ? number : row.fallback;
}

template <>
bool Preference::Set<bool>(const std::string& key, bool value) {
  Find(key, Json::booleanValue);
  return Store(path_, uid_, key, value);
}

template <>
bool Preference::Set<int>(const std::string& key, int value) {
  if (!InBounds(Find(key, Json::intValue), value)) {
    throw std::invalid_argument("out of bounds: " + key);
  }
  return Store(path_, uid_, key, value);
}

}  // namespace maruseeker::pref
