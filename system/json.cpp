#include "system/json.h"

#include <errno.h>
#include <json/reader.h>
#include <json/writer.h>

#include <memory>
#include <string_view>

#include "system/whole_file.h"

namespace maru::json {
namespace {

/// Refuses what the library would let pass, or throw at: control characters in strings, numbers of
/// other grammars, surrogates without their partner, too many levels or values. Everything else is
/// left to the parser.
class StrictnessCheck {
 public:
  explicit StrictnessCheck(std::string_view text) : text_(text) {}

  /// Null, or what is wrong.
  const char* Fault() {
    while (at_ < text_.size()) {
      const char c = text_[at_];
      const char* fault = nullptr;
      if (c == '"') {
        fault = String();
      } else if (c == '-' || c == '+' || IsDigit(c)) {
        fault = Number();
      } else {
        fault = Structure(c);
        ++at_;
      }
      if (fault) return fault;
    }
    return nullptr;
  }

 private:
  static bool IsDigit(char c) { return c >= '0' && c <= '9'; }
  char Peek() const { return at_ < text_.size() ? text_[at_] : '\0'; }

  const char* Structure(char c) {
    if (c == '[' || c == '{') {
      if (++depth_ > kMaxDepth) return "too many levels";
      ++values_;
    } else if (c == ']' || c == '}') {
      if (depth_ > 0) --depth_;
    } else if (c == ',') {
      ++values_;
    } else if (static_cast<unsigned char>(c) < 0x20 && c != '\n' && c != '\r' && c != '\t') {
      return "a control character";  // the parser takes a NUL for the end
    }
    return values_ > kMaxValues ? "too many values" : nullptr;
  }

  const char* String() {
    for (++at_; at_ < text_.size(); ++at_) {
      const auto c = static_cast<unsigned char>(text_[at_]);
      if (c == '"') {
        ++at_;
        return nullptr;
      }
      if (c < 0x20) return "a control character in a string";
      if (c != '\\') continue;
      ++at_;
      if (Peek() == 'u' && !UnicodeEscape()) return "half of a surrogate pair";
    }
    return "a string without an end";
  }

  /// Stands on the u of an escape, and leaves on the last character of it, or of the pair.
  bool UnicodeEscape() {
    const unsigned unit = HexUnit(at_ + 1);
    if (unit < 0xd800 || unit > 0xdfff) return true;
    if (unit > 0xdbff || text_.substr(at_ + 5, 2) != "\\u") return false;
    const unsigned low = HexUnit(at_ + 7);
    if (low < 0xdc00 || low > 0xdfff) return false;
    at_ += 10;
    return true;
  }

  /// Four hexadecimal digits, or 0, which the parser then judges.
  unsigned HexUnit(std::size_t from) const {
    unsigned unit = 0;
    if (from + 4 > text_.size()) return 0;
    for (const char c : text_.substr(from, 4)) {
      const char lower = static_cast<char>(c | 0x20);
      if (IsDigit(c)) {
        unit = unit * 16 + static_cast<unsigned>(c - '0');
      } else if (lower >= 'a' && lower <= 'f') {
        unit = unit * 16 + static_cast<unsigned>(lower - 'a') + 10;
      } else {
        return 0;
      }
    }
    return unit;
  }

  const char* Number() {
    constexpr const char* kMalformed = "a malformed number";
    if (Peek() == '-') ++at_;
    const bool zero = Peek() == '0';
    const std::size_t digits = Digits();
    if (digits == 0 || (zero && digits > 1)) return kMalformed;
    if (Peek() == '.') {
      ++at_;
      if (Digits() == 0) return kMalformed;
    }
    if (Peek() == 'e' || Peek() == 'E') {
      ++at_;
      if (Peek() == '+' || Peek() == '-') ++at_;
      if (Digits() == 0) return kMalformed;
    }
    return nullptr;
  }

  std::size_t Digits() {
    const std::size_t start = at_;
    while (IsDigit(Peek())) ++at_;
    return at_ - start;
  }

  std::string_view text_;
  std::size_t at_ = 0;
  std::size_t depth_ = 0;
  std::size_t values_ = 0;
};

std::unique_ptr<Json::CharReader> NewReader() {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;
  builder["skipBom"] = false;
  builder["stackLimit"] = kMaxDepth + 1;
  return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

void AppendText(std::string_view text, std::string& out) {
  constexpr std::string_view kNamed = "\b\f\n\r\t";
  constexpr std::string_view kNames = "bfnrt";
  constexpr std::string_view kDigits = "0123456789abcdef";
  out += '"';
  std::size_t run = 0;  // the start of what is not written yet
  for (std::size_t at = 0; at < text.size(); ++at) {
    const auto c = static_cast<unsigned char>(text[at]);
    if (c >= ' ' && c != '"' && c != '\\') continue;
    out.append(text, run, at - run);
    run = at + 1;
    out += '\\';
    if (const std::size_t named = kNamed.find(text[at]); named != std::string_view::npos) {
      out += kNames[named];
    } else if (c >= ' ') {
      out += text[at];
    } else {
      out.append("u00").append({kDigits[c / 16], kDigits[c % 16]});
    }
  }
  out.append(text, run).append("\"");
}

void AppendValue(const Json::Value& value, std::string& out);

void AppendMembers(const Json::Value& object, std::string& out) {
  out += '{';
  for (auto member = object.begin(); member != object.end(); ++member) {
    if (member != object.begin()) out += ',';
    const char* end = nullptr;
    const char* name = member.memberName(&end);
    AppendText({name, end}, out);
    out += ':';
    AppendValue(*member, out);
  }
  out += '}';
}

void AppendElements(const Json::Value& array, std::string& out) {
  out += '[';
  for (Json::ArrayIndex i = 0; i < array.size(); ++i) {
    if (i > 0) out += ',';
    AppendValue(array[i], out);
  }
  out += ']';
}

void AppendString(const Json::Value& value, std::string& out) {
  const char* begin = nullptr;
  const char* end = nullptr;
  value.getString(&begin, &end);
  AppendText({begin, end}, out);
}

void AppendValue(const Json::Value& value, std::string& out) {
  switch (value.type()) {
    case Json::nullValue:
      out += "null";
      return;
    case Json::intValue:
      out += std::to_string(value.asLargestInt());
      return;
    case Json::uintValue:
      out += std::to_string(value.asLargestUInt());
      return;
    case Json::realValue:
      out += Json::valueToString(value.asDouble());
      return;
    case Json::stringValue:
      return AppendString(value, out);
    case Json::booleanValue:
      out += value.asBool() ? "true" : "false";
      return;
    case Json::arrayValue:
      return AppendElements(value, out);
    case Json::objectValue:
      return AppendMembers(value, out);
  }
}

bool Refuse(std::string* error, std::string reason) {
  if (error) *error = std::move(reason);
  return false;
}

}  // namespace

bool FromString(const std::string& text, Json::Value& value, std::string* error) {
  if (text.size() > kMaxSize) return Refuse(error, "too long");
  if (const char* fault = StrictnessCheck(text).Fault()) return Refuse(error, fault);
  try {
    // Making a reader takes as long as reading a short request.
    thread_local const std::unique_ptr<Json::CharReader> reader = NewReader();
    Json::Value parsed;
    std::string reason;
    if (!reader->parse(text.data(), text.data() + text.size(), &parsed, &reason)) {
      return Refuse(error, std::move(reason));
    }
    value = std::move(parsed);
    return true;
  } catch (const std::exception& exception) {
    return Refuse(error, exception.what());
  }
}

std::string ToString(const Json::Value& value) {
  std::string text;
  AppendValue(value, text);
  return text;
}

void ObjectWriter::AddText(std::string_view key, std::string_view text) {
  AppendText(text, Member(key));
}

void ObjectWriter::AddNumber(std::string_view key, std::int64_t number) {
  Member(key) += std::to_string(number);
}

void ObjectWriter::AddFlag(std::string_view key, bool flag) {
  Member(key) += flag ? "true" : "false";
}

void ObjectWriter::AddValue(std::string_view key, const Json::Value& value) {
  AppendValue(value, Member(key));
}

std::string ObjectWriter::Take() {
  text_ += '}';
  return std::move(text_);
}

std::string& ObjectWriter::Member(std::string_view key) {
  if (text_.size() > 1) text_ += ',';
  AppendText(key, text_);
  return text_ += ':';
}

bool FromFile(const std::string& path, Json::Value& value) {
  std::string text;
  if (!ReadWholeFile(path, kMaxSize, text)) return false;
  errno = 0;
  return FromString(text, value);
}

bool ToFile(const Json::Value& value, const std::string& path, uid_t owner) {
  return WriteWholeFile(path, ToString(value) + "\n", 0600, owner);
}

const Json::Value& Member(const Json::Value& object, const char* key) {
  if (!object.isObject()) return Json::Value::nullSingleton();
  return object[key];
}

std::string StringMember(const Json::Value& object, const char* key, const std::string& fallback) {
  const Json::Value& member = Member(object, key);
  return member.isString() ? member.asString() : fallback;
}

int IntMember(const Json::Value& object, const char* key, int fallback) {
  const Json::Value& member = Member(object, key);
  return member.isInt() ? member.asInt() : fallback;
}

bool BoolMember(const Json::Value& object, const char* key, bool fallback) {
  const Json::Value& member = Member(object, key);
  return member.isBool() ? member.asBool() : fallback;
}

}  // namespace maru::json
