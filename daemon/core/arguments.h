#pragma once

#include <json/value.h>

#include <cstdint>
#include <initializer_list>
#include <string>
#include <string_view>
#include <vector>

#include "common/error.h"

namespace maru::daemon {

/// Error 120 with a message for the caller.
maruseeker::Error BadParameter(const std::string& why);

/// Text from outside for a message: in quotation marks, shortened to 60 bytes or so.
std::string Quoted(std::string_view text);

/// Reads one JSON object of a request member by member. Every fault is an Error (120) that names
/// the member; null counts as absent everywhere. Borrows the value.
class Arguments {
 public:
  /// `where` names the object in messages ("data.pre_query"; empty for the request itself). A null
  /// value is an empty object; a member that is not among `known` is refused.
  using Names = std::initializer_list<std::string_view>;
  Arguments(const Json::Value& object, std::string where, Names known);

  bool Has(const char* key) const;
  void Require(const char* key) const;
  std::string String(const char* key, std::size_t max_bytes,
                     const std::string& fallback = {}) const;
  /// Within [low, high].
  std::int64_t Integer(const char* key, std::int64_t low, std::int64_t high,
                       std::int64_t fallback) const;
  /// Within [low, high]; it has to be there.
  double Number(const char* key, double low, double high) const;
  std::vector<std::string> Strings(const char* key, std::size_t max_items,
                                   std::size_t max_bytes) const;
  /// An object, empty when absent, and an array of objects.
  Arguments Object(const char* key, Names known) const;
  std::vector<Arguments> Objects(const char* key, std::size_t max_items, Names known) const;
  /// Whatever stands there; null when absent.
  const Json::Value& Any(const char* key) const;

  [[noreturn]] void Refuse(const char* key, const std::string& why) const;

 private:
  /// "data.pre_query.keyword".
  std::string NameOf(const char* key) const;
  /// An empty array when absent.
  const Json::Value& Array(const char* key, std::size_t max_items) const;

  const Json::Value& object_;
  std::string where_;
};

}  // namespace maru::daemon
