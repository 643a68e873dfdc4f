#include "platform/json.h"

#include <errno.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <rapidjson/writer.h>

#include <stdexcept>
#include <string_view>
#include <vector>

#include "platform/whole_file.h"

namespace maru::json {
namespace {

/// Bytes of strings are kept as they are; only escapes are looked at.
struct Bytes : rapidjson::UTF8<> {
  template <class Output>
  static void Encode(Output& output, unsigned character) {
    // The parser has put pairs together, and refused a first half without its second.
    if (character >= 0xdc00 && character <= 0xdfff) {
      throw std::invalid_argument("half of a surrogate pair");
    }
    rapidjson::UTF8<>::Encode(output, character);
  }
};

/// Takes what the parser reads, in its order, and makes it a value.
class Builder : public rapidjson::BaseReaderHandler<Bytes, Builder> {
 public:
  explicit Builder(Json::Value& root) { open_.push_back(&root); }

  bool Null() { return Add(Json::Value()); }
  bool Bool(bool flag) { return Add(flag); }
  bool Int(int number) { return Add(number); }
  bool Uint(unsigned number) { return Add(Json::Int64{number}); }
  bool Int64(std::int64_t number) { return Add(Json::Int64{number}); }
  bool Uint64(std::uint64_t number) {
    if (number > std::uint64_t{Json::Value::maxInt64}) return Add(Json::UInt64{number});
    return Add(static_cast<Json::Int64>(number));
  }
  bool Double(double number) { return Add(number); }
  bool String(const char* text, unsigned size, bool) { return Add(Json::Value(text, text + size)); }
  bool StartObject() { return Open(Json::objectValue); }
  bool StartArray() { return Open(Json::arrayValue); }
  bool EndObject(unsigned) { return Close(); }
  bool EndArray(unsigned) { return Close(); }
  bool Key(const char* text, unsigned size, bool) {
    key_.assign(text, size);
    return true;
  }

 private:
  bool Add(Json::Value value) {
    Place() = std::move(value);
    return true;
  }

  bool Open(Json::ValueType type) {
    if (open_.size() > kMaxDepth) throw std::length_error("too many levels");
    Json::Value& place = Place();
    place = Json::Value(type);
    open_.push_back(&place);
    return true;
  }

  bool Close() {
    open_.pop_back();
    return true;
  }

  /// Where the next value belongs.
  Json::Value& Place() {
    if (++values_ > kMaxValues) throw std::length_error("too many values");
    Json::Value& around = *open_.back();
    if (around.isArray()) return around.append(Json::Value());
    if (!around.isObject()) return around;
    const Json::ArrayIndex size = around.size();
    Json::Value& place = *around.demand(key_.data(), key_.data() + key_.size());
    if (around.size() == size) throw std::invalid_argument("a key that is there twice");
    return place;
  }

  /// The root, and every object and array that is not at its end.
  std::vector<Json::Value*> open_;
  std::string key_;
  std::size_t values_ = 0;
};

/// What the writer writes into.
struct Appender {
  using Ch = char;

  std::string& text;

  void Put(char c) { text += c; }
  void Flush() {}
};

using Writer = rapidjson::Writer<Appender, Bytes, Bytes>;

void Write(const Json::Value& value, Writer& writer) {
  switch (value.type()) {
    case Json::nullValue:
      writer.Null();
      break;
    case Json::booleanValue:
      writer.Bool(value.asBool());
      break;
    case Json::intValue:
      writer.Int64(value.asInt64());
      break;
    case Json::uintValue:
      writer.Uint64(value.asUInt64());
      break;
    case Json::realValue:
      if (!writer.Double(value.asDouble())) writer.Null();
      break;
    case Json::stringValue: {
      const char* begin = nullptr;
      const char* end = nullptr;
      value.getString(&begin, &end);
      writer.String(begin, static_cast<unsigned>(end - begin));
      break;
    }
    case Json::arrayValue:
      writer.StartArray();
      for (const Json::Value& element : value) Write(element, writer);
      writer.EndArray();
      break;
    case Json::objectValue:
      writer.StartObject();
      for (auto member = value.begin(); member != value.end(); ++member) {
        const char* end = nullptr;
        const char* begin = member.memberName(&end);
        writer.Key(begin, static_cast<unsigned>(end - begin));
        Write(*member, writer);
      }
      writer.EndObject();
  }
}

bool Refuse(std::string* error, std::string reason) {
  if (error) *error = std::move(reason);
  return false;
}

}  // namespace

bool FromString(const std::string& text, Json::Value& value, std::string* error) {
  if (text.size() > kMaxSize) return Refuse(error, "too long");
  try {
    Json::Value parsed;
    Builder builder(parsed);
    rapidjson::MemoryStream stream(text.data(), text.size());
    rapidjson::GenericReader<Bytes, Bytes> reader;
    const rapidjson::ParseResult result =
        reader.Parse<rapidjson::kParseFullPrecisionFlag>(stream, builder);
    if (!result) return Refuse(error, rapidjson::GetParseError_En(result.Code()));
    // The parser takes a NUL for the end.
    if (stream.Tell() < text.size()) return Refuse(error, "a control character");
    value = std::move(parsed);
    return true;
  } catch (const std::exception& exception) {
    return Refuse(error, exception.what());
  }
}

std::string ToString(const Json::Value& value) {
  std::string text;
  Appender appender{text};
  Writer writer(appender);
  Write(value, writer);
  return text;
}

void ObjectWriter::AddText(std::string_view key, std::string_view text) {
  BeginMember(key);
  Write(text);
}

void ObjectWriter::AddNumber(std::string_view key, std::int64_t number) {
  BeginMember(key);
  text_ += std::to_string(number);
}

void ObjectWriter::AddFlag(std::string_view key, bool flag) {
  BeginMember(key);
  text_ += flag ? "true" : "false";
}

void ObjectWriter::AddValue(std::string_view key, const Json::Value& value) {
  BeginMember(key);
  text_ += ToString(value);
}

std::string ObjectWriter::Take() {
  text_ += '}';
  return std::move(text_);
}

void ObjectWriter::BeginMember(std::string_view key) {
  if (text_.size() > 1) text_ += ',';
  Write(key);
  text_ += ':';
}

void ObjectWriter::Write(std::string_view text) {
  Appender appender{text_};
  Writer(appender).String(text.data(), static_cast<unsigned>(text.size()));
}

bool FromFile(const std::string& path, Json::Value& value) {
  std::string text;
  if (!ReadWholeFile(path, kMaxSize, text)) return false;
  errno = 0;
  return FromString(text, value);
}

bool ToFile(const Json::Value& value, const std::string& path) {
  return WriteWholeFile(path, ToString(value) + "\n", 0600);
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
