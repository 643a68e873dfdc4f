#pragma once

#include <json/value.h>

#include <string>

/// JSON values as JsonCpp converts them, without its exceptions.
namespace maruseeker {

/// False where there is no truth in it, as in texts.
inline bool AsBool(const Json::Value& value) {
  return value.isConvertibleTo(Json::booleanValue) && value.asBool();
}

/// False, and `number` unchanged, where it is no number of 32 bits.
inline bool AsInt(const Json::Value& value, int& number) {
  if (!value.isConvertibleTo(Json::intValue)) return false;
  number = value.asInt();
  return true;
}

/// Empty for arrays and objects.
inline std::string AsText(const Json::Value& value) {
  return value.isConvertibleTo(Json::stringValue) ? value.asString() : std::string();
}

}  // namespace maruseeker
