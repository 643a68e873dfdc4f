#pragma once

#include <json/value.h>
#include <sys/types.h>

#include <cstdint>
#include <string>
#include <string_view>

/// Text and file operations on JSON values that stock JsonCpp lacks.
///
/// Reading is strict: one JSON text and nothing behind it but white space; no comments, no
/// duplicate keys, no NaN or infinities, no raw control characters, no half surrogate pairs; at
/// most `kMaxDepth` levels, `kMaxValues` values and `kMaxSize` bytes; no number that neither 64-bit
/// integers nor a finite double can hold (an integer beyond 64 bits becomes a double). Nothing here
/// throws on bad input, and a value is replaced only when the whole text was good.
namespace maru::json {

constexpr unsigned kMaxDepth = 64;
/// A value in memory takes a hundred bytes, on the wire perhaps two.
constexpr std::size_t kMaxValues = 1u << 20;
constexpr std::size_t kMaxSize = 64u << 20;

/// Parses `text` into `value`. On false `value` is unchanged and, when asked for, `error` says why.
bool FromString(const std::string& text, Json::Value& value, std::string* error = nullptr);

/// One line, no line breaks, keys sorted. Bytes of strings are kept as they are, also where they
/// are not UTF-8 (file names may be anything).
std::string ToString(const Json::Value& value);

/// An object written member by member, as ToString would write it: for messages that are many, and
/// whose values nobody needs. Members come in the order of adding; the caller adds each key once.
class ObjectWriter {
 public:
  void AddText(std::string_view key, std::string_view text);
  void AddNumber(std::string_view key, std::int64_t number);
  void AddFlag(std::string_view key, bool flag);
  void AddValue(std::string_view key, const Json::Value& value);
  /// Ends the object and hands it over; nothing can be added after that.
  std::string Take();

 private:
  /// Where the value of a new member is to be written.
  std::string& Member(std::string_view key);

  std::string text_ = "{";
};

/// Reads and parses a regular file, without following a symbolic link in the last component. On
/// false `value` is unchanged; `errno` tells of the file, or is 0 when the text was at fault.
bool FromFile(const std::string& path, Json::Value& value);

/// Writes `value` so that a reader sees the old text or the new one, never a part (temporary file
/// in the same folder, then rename). New files get mode 0600 less the umask, and `owner` unless
/// that is -1. False with `errno` set.
bool ToFile(const Json::Value& value, const std::string& path,
            uid_t owner = static_cast<uid_t>(-1));

/// Member access that never throws: null, `fallback` or false when `object` is not an object, has
/// no such member, or the member is of another type.
const Json::Value& Member(const Json::Value& object, const char* key);
std::string StringMember(const Json::Value& object, const char* key,
                         const std::string& fallback = {});
int IntMember(const Json::Value& object, const char* key, int fallback = 0);
bool BoolMember(const Json::Value& object, const char* key, bool fallback = false);

}  // namespace maru::json
