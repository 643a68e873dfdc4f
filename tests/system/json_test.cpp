#include "system/json.h"

#include <errno.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/writer.h>

#include <random>

#include "tests/support/support.h"

namespace json = maru::json;

namespace {

Json::Value Parse(const std::string& text) {
  Json::Value value;
  std::string error;
  EXPECT_TRUE(json::FromString(text, value, &error)) << text << ": " << error;
  return value;
}

/// In one line, with the bytes of strings as they are.
std::string AsTheLibraryWrites(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

TEST(Json, TakesWhatTheGrammarAllows) {
  for (const std::string text :
       {"0", "-0", "1.5e+3", "1e-999", "\"\"", " [ ] ", "null", "true", "\"\\ud83d\\ude00\"",
        "{\"\":{}}", "18446744073709551615", "-9223372036854775808", "\"\x7f\"", "\"\\/\""}) {
    Parse(text);
  }
  EXPECT_EQ(Parse("\"\\u00e9\\u0000x\"").asString(), std::string("\xc3\xa9\0x", 4));
  // Beyond 64 bits: a double, not a wrapped integer.
  EXPECT_EQ(Parse("18446744073709551616").type(), Json::realValue);
}

TEST(Json, RefusesEverythingElseAndChangesNothing) {
  const std::string refused[] = {"",
                                 " ",
                                 "01",
                                 "-",
                                 "1.",
                                 ".5",
                                 "+1",
                                 "1e",
                                 "--1",
                                 "1.e5",
                                 "0x10",
                                 "1e999",
                                 "-1e999",
                                 "NaN",
                                 "Infinity",
                                 "[1,]",
                                 "[,1]",
                                 "[1 2]",
                                 "[1",
                                 "]",
                                 "{\"a\":1,}",
                                 "{\"a\" 1}",
                                 "{a:1}",
                                 "{1:2}",
                                 "{\"a\":1,\"a\":2}",
                                 "'a'",
                                 "\"abc",
                                 "\"\\x\"",
                                 "\"\\u12\"",
                                 "\"\\u12g4\"",
                                 "\"\n\"",
                                 std::string("\"\0\"", 3),
                                 "\"\\ud800\"",
                                 "\"\\udc00\"",
                                 "\"\\ud800\\u0041\"",
                                 "[1]x",
                                 "[1][2]",
                                 "1 2",
                                 "[1]//c",
                                 "/*c*/[1]",
                                 "\xef\xbb\xbf[1]",
                                 "nullx",
                                 "tru",
                                 std::string("[1]\0", 4),
                                 "[-]",
                                 "[1]\v",
                                 "\"\\",
                                 "\"\\u",
                                 "[0,\"\\ud83d\\u"};
  for (const std::string& text : refused) {
    Json::Value value = "before";
    std::string error;
    EXPECT_FALSE(json::FromString(text, value, &error)) << text;
    EXPECT_EQ(value, "before") << text;
    EXPECT_NE(error, "") << text;
  }
}

TEST(Json, HasBounds) {
  const auto nested = [](unsigned levels) {
    return std::string(levels, '[') + std::string(levels, ']');
  };
  Json::Value value;
  EXPECT_TRUE(json::FromString(nested(json::kMaxDepth), value));
  EXPECT_FALSE(json::FromString(nested(json::kMaxDepth + 1), value));
  EXPECT_FALSE(json::FromString(std::string(1 << 20, '['), value));
  std::string many = "[0";
  for (std::size_t i = 0; i < json::kMaxValues; ++i) many += ",0";
  EXPECT_FALSE(json::FromString(many + "]", value));
  EXPECT_FALSE(json::FromString('"' + std::string(json::kMaxSize, 'a') + '"', value));
}

/// Whatever is taken comes back the same from its own text; nothing throws or crashes.
TEST(Json, SurvivesDamagedTexts) {
  const std::string good =
      R"({"command":"search","data":{"indice":["a","\u00e9"],"size":50,"w":-1.5e3,"x":[null,true]}})";
  std::mt19937 random(7);
  const auto below = [&](std::size_t n) {
    return std::uniform_int_distribution<std::size_t>(0, n - 1)(random);
  };
  for (int round = 0; round < 20'000; ++round) {
    std::string text = good;
    for (std::size_t faults = 1 + below(3); faults > 0; --faults) {
      const std::size_t at = below(text.size());
      const std::string alphabet = "\"\\{}[],:0-+.eutn/ \n\xff";
      if (below(2))
        text[at] = alphabet[below(alphabet.size())];
      else
        text.erase(at, 1 + below(4));
      if (text.empty()) text = " ";
    }
    Json::Value value;
    if (!json::FromString(text, value)) continue;
    const std::string written = json::ToString(value);
    ASSERT_EQ(Parse(written), value) << text;
    ASSERT_EQ(written, AsTheLibraryWrites(value));
  }
}

TEST(Json, KeepsBytesThatAreNotUTF8) {
  const std::string name = "caf\xe9 \xff\x01\n\"";
  Json::Value value;
  value["path"] = name;
  const std::string text = json::ToString(value);
  EXPECT_EQ(text, "{\"path\":\"caf\xe9 \xff\\u0001\\n\\\"\"}");
  EXPECT_EQ(Parse(text)["path"].asString(), name);
}

TEST(Json, IsWrittenAsTheLibraryWritesIt) {
  std::string every;
  for (int c = 0; c < 256; ++c) every += static_cast<char>(c);
  Json::Value value, list;
  for (const double number : {0.0, -0.0, 1.0, 0.1, 1e300, 5e-324, 123456789012345678.0, 1.0 / 3}) {
    list.append(number);
  }
  for (const std::string& text : {std::string(), every, every + "é日本\\", std::string("\0", 1)}) {
    list.append(text);
    for (const std::int64_t number : {std::int64_t{0}, INT64_MIN, INT64_MAX}) {
      json::ObjectWriter writer;
      writer.AddFlag("a\n", text.empty());
      writer.AddNumber("b", number);
      writer.AddText("c", text);
      writer.AddValue("d", list);
      value["a\n"] = text.empty();
      value["b"] = Json::Int64{number};
      value["c"] = text;
      value["d"] = list;
      EXPECT_EQ(writer.Take(), AsTheLibraryWrites(value));
      EXPECT_EQ(json::ToString(value), AsTheLibraryWrites(value));
    }
  }
  for (const Json::Value& bare : {Json::Value(), Json::Value(Json::arrayValue),
                                  Json::Value(Json::objectValue), Json::Value(UINT64_MAX)}) {
    EXPECT_EQ(json::ToString(bare), AsTheLibraryWrites(bare));
  }
  EXPECT_EQ(json::ObjectWriter().Take(), "{}");
}

TEST(Json, ReadsRegularFilesOnly) {
  const TempFolder folder;
  Json::Value value = "before";
  const auto error_of = [&](const std::string& path) {
    errno = 0;
    EXPECT_FALSE(json::FromFile(path, value));
    EXPECT_EQ(value, "before");
    return errno;
  };
  const std::string good = folder.Write("good", "{\"pid\": 1}\n");
  EXPECT_EQ(symlink(good.c_str(), (folder / "link").c_str()), 0);
  mkfifo((folder / "fifo").c_str(), 0600);
  EXPECT_EQ(error_of(folder / "none"), ENOENT);
  EXPECT_EQ(error_of(folder / "link"), ELOOP);
  EXPECT_EQ(error_of(folder / "fifo"), EINVAL);
  EXPECT_EQ(error_of(folder / ""), EINVAL);
  EXPECT_EQ(error_of(folder.Write("bad", "{")), 0);
  EXPECT_TRUE(json::FromFile(good, value));
  EXPECT_EQ(value["pid"], 1);
}

TEST(Json, WritesWholeFilesOrNone) {
  const TempFolder folder;
  const std::string victim = folder.Write("victim", "untouched");
  EXPECT_EQ(symlink(victim.c_str(), (folder / "a").c_str()), 0);
  Json::Value value(Json::arrayValue);
  value.append("x");
  ASSERT_TRUE(json::ToFile(value, folder / "a"));  // the link is replaced, not followed
  EXPECT_EQ(FileText(victim), "untouched");
  Json::Value read;
  ASSERT_TRUE(json::FromFile(folder / "a", read));
  EXPECT_EQ(read, value);
  struct stat status;
  stat((folder / "a").c_str(), &status);
  EXPECT_EQ(status.st_mode & 0777, 0600u);
  errno = 0;
  EXPECT_FALSE(json::ToFile(value, folder / "no/such/folder"));
  EXPECT_EQ(errno, ENOENT);
  mkdir((folder / "folder").c_str(), 0755);
  EXPECT_FALSE(json::ToFile(value, folder / "folder"));
  // Nothing is left behind.
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(folder / ""), {}), 3);
}

TEST(Json, MembersNeverThrow) {
  const Json::Value array = Parse("[]");
  EXPECT_EQ(json::IntMember(array, "a", 7), 7);
  EXPECT_TRUE(json::Member(array, "a").isNull());
  const Json::Value object = Parse(R"({"i":3000000000,"s":"5","t":"x","b":true,"f":1.0})");
  EXPECT_EQ(json::IntMember(object, "i", -1), -1);
  EXPECT_EQ(json::IntMember(object, "s", -1), -1);
  EXPECT_EQ(json::IntMember(object, "f", -1), 1);
  EXPECT_EQ(json::StringMember(object, "i", "none"), "none");
  EXPECT_TRUE(json::BoolMember(object, "b"));
  EXPECT_FALSE(json::BoolMember(object, "i"));
}

}  // namespace
