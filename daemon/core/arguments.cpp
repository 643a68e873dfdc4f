#include "daemon/core/arguments.h"

#include <algorithm>

#include "system/json.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kQuotedBytes = 60;

}  // namespace

maruseeker::Error BadParameter(const std::string& why) {
  return maruseeker::Error(maruseeker::kErrorBadParameter, why);
}

std::string Quoted(std::string_view text) {
  if (text.size() <= kQuotedBytes) return "\"" + std::string(text) + "\"";
  std::size_t end = kQuotedBytes;
  while (end > 0 && (static_cast<unsigned char>(text[end]) & 0xc0) == 0x80) --end;
  return "\"" + std::string(text.substr(0, end)) + "…\"";
}

Arguments::Arguments(const Json::Value& object, std::string where, Names known)
    : object_(object), where_(std::move(where)) {
  if (object_.isNull()) return;
  if (!object_.isObject()) {
    throw BadParameter((where_.empty() ? "The request" : where_) + " is not an object");
  }
  for (auto member = object_.begin(); member != object_.end(); ++member) {
    const std::string name = member.name();
    if (std::ranges::find(known, name) == known.end()) {
      throw BadParameter("Unknown member " + Quoted(name) +
                         (where_.empty() ? "" : " in " + where_));
    }
  }
}

const Json::Value& Arguments::Any(const char* key) const {
  return json::Member(object_, key);
}

bool Arguments::Has(const char* key) const {
  return !Any(key).isNull();
}

std::string Arguments::NameOf(const char* key) const {
  return where_.empty() ? key : where_ + "." + key;
}

void Arguments::Refuse(const char* key, const std::string& why) const {
  throw BadParameter(NameOf(key) + " " + why);
}

void Arguments::Require(const char* key) const {
  if (!Has(key)) Refuse(key, "is missing");
}

std::string Arguments::String(const char* key, std::size_t max_bytes,
                              const std::string& fallback) const {
  if (!Has(key)) return fallback;
  const Json::Value& value = Any(key);
  if (!value.isString()) Refuse(key, "is not a string");
  std::string text = value.asString();
  if (text.size() > max_bytes) {
    Refuse(key, "is longer than " + std::to_string(max_bytes) + " bytes");
  }
  return text;
}

std::int64_t Arguments::Integer(const char* key, std::int64_t low, std::int64_t high,
                                std::int64_t fallback) const {
  if (!Has(key)) return fallback;
  const Json::Value& value = Any(key);
  if (!value.isInt64()) Refuse(key, "is not an integer");
  const std::int64_t number = value.asInt64();
  if (number < low || number > high) {
    Refuse(key, "is not within " + std::to_string(low) + " to " + std::to_string(high));
  }
  return number;
}

double Arguments::Number(const char* key, double low, double high) const {
  Require(key);
  const Json::Value& value = Any(key);
  if (!value.isNumeric()) Refuse(key, "is not a number");
  const double number = value.asDouble();
  if (!(number >= low && number <= high)) Refuse(key, "is out of range");
  return number;
}

const Json::Value& Arguments::Array(const char* key, std::size_t max_items) const {
  static const Json::Value empty(Json::arrayValue);
  if (!Has(key)) return empty;
  const Json::Value& value = Any(key);
  if (!value.isArray()) Refuse(key, "is not an array");
  if (value.size() > max_items) {
    Refuse(key, "has more than " + std::to_string(max_items) + " elements");
  }
  return value;
}

std::vector<std::string> Arguments::Strings(const char* key, std::size_t max_items,
                                            std::size_t max_bytes) const {
  std::vector<std::string> strings;
  for (const Json::Value& item : Array(key, max_items)) {
    if (!item.isString()) Refuse(key, "holds something other than strings");
    strings.push_back(item.asString());
    if (strings.back().size() > max_bytes) Refuse(key, "holds a string that is too long");
  }
  return strings;
}

Arguments Arguments::Object(const char* key, Names known) const {
  return {Any(key), NameOf(key), known};
}

std::vector<Arguments> Arguments::Objects(const char* key, std::size_t max_items,
                                          Names known) const {
  std::vector<Arguments> objects;
  for (const Json::Value& item : Array(key, max_items))
    objects.push_back({item, NameOf(key), known});
  return objects;
}

}  // namespace maru::daemon
