#include <gtest/gtest.h>

#include <random>
#include <vector>

#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"
#include "system/utf8.h"

namespace maru::extract {
namespace {

using namespace std::string_literals;

TEST(CharsetTest, TellsTextFromBinary) {
  EXPECT_FALSE(IsBinary(""));
  EXPECT_FALSE(IsBinary("text\twith\r\nlines\f and \033[1mcolours\b"));
  EXPECT_FALSE(IsBinary("\xFF\xFEh\0i\0"s));
  EXPECT_FALSE(IsBinary("\xE9t\xE9"));
  EXPECT_TRUE(IsBinary("PNG\0"s));
  EXPECT_TRUE(IsBinary("\x01\x02\x03 abc"));
  EXPECT_EQ("script", TextPart("script\0\xff\xff"s));
  EXPECT_EQ(6u, TextPart("\xFF\xFEh\0i\0"s).size());
}

TEST(CharsetTest, KnowsUTF8) {
  EXPECT_TRUE(IsUTF8("caf\xC3\xA9 \xE2\x82\xAC \xF0\x9F\x98\x80"));
  for (const char* bad : {"\xC0\x80", "\xE0\x80\x80", "\xED\xA0\x80", "\xF4\x90\x80\x80", "\xF5",
                          "\x80", "\xC3(", "caf\xE9!"}) {
    EXPECT_FALSE(IsUTF8(bad)) << bad;
    EXPECT_FALSE(UTF8Text(bad)) << bad;
  }
  // Cut off at its end, each in another way.
  for (const char* rest :
       {"\xC3", "\xE0", "\xE0\xA0", "\xED\x9F", "\xF0", "\xF4\x8F", "\xF0\x9F\x98"}) {
    EXPECT_EQ("cut ", UTF8Text(std::string("cut ") + rest)) << rest;
  }
  std::string text = "ab\xE2\x82\xAC";
  CutUTF8(text, 4);
  EXPECT_EQ("ab", text);
}

TEST(CharsetTest, ConvertsWhatItIsToldSeesOrGuesses) {
  LoadCharsets();
  EXPECT_EQ("h\xC3\xA9", ToUTF8("\xFF\xFEh\0\xE9\0"s, ""));
  EXPECT_EQ("h\xC3\xA9", ToUTF8("\xFE\xFF\0h\0\xE9"s, "utf-8"));
  EXPECT_EQ("h\xF0\x9F\x98\x80", ToUTF8("\xFF\xFE\0\0h\0\0\0\0\xF6\x01\0"s, ""));
  EXPECT_EQ("plain", ToUTF8("\xEF\xBB\xBFplain", "koi8-r"));
  EXPECT_EQ("\xD0\xBF\xD1\x80\xD0\xB8\xD0\xB2\xD0\xB5\xD1\x82",
            ToUTF8("\xD0\xD2\xC9\xD7\xC5\xD4", "koi8-r"));
  EXPECT_EQ("\xE2\x82\xAC \xE2\x80\x93", ToUTF8("\x80 \x96", "ISO-8859-1")) << "as browsers do";
  const std::string russian = ToUTF8(
      "\xCF\xF0\xE8\xE2\xE5\xF2, \xFD\xF2\xEE \xEE\xE1\xFB\xF7\xED\xFB\xE9 \xF2\xE5\xEA\xF1\xF2 "
      "\xED\xE0 \xF0\xF3\xF1\xF1\xEA\xEE\xEC \xFF\xE7\xFB\xEA\xE5",
      "");
  EXPECT_EQ(0u, russian.find("\xD0\x9F\xD1\x80\xD0\xB8\xD0\xB2\xD0\xB5\xD1\x82")) << russian;
  const std::string japanese = ToUTF8(
      "\x93\xFA\x96\x7B\x8C\xEA\x82\xCC\x83\x65\x83\x4C\x83\x58\x83\x67\x82\xC5\x82\xB7\x81\x42",
      "");
  EXPECT_EQ(0u, japanese.find("\xE6\x97\xA5\xE6\x9C\xAC\xE8\xAA\x9E")) << japanese;
}

/// Bytes that decide something: marks, beginnings, whole characters and parts of them.
const std::string kPieces[] = {
    "\xEF\xBB\xBF", "\xFF\xFE",         "\xFE\xFF",     "\0\0\xFE\xFF"s, "\0"s,  "\x01",
    "%PDF-",        "PK\003\004",       "<html",        " \t\n",         "text", "\xC3\xA9",
    "\xE2\x82\xAC", "\xF0\x9F\x98\x80", "\xED\xA0\x80", "\xF0\x9F",      "\xE0", "\x80",
    "\xFF"};

/// What the indexer does itself with hostile bytes, each time in memory that ends with them.
TEST(CharsetTest, TheIndexersOwnLookTakesAnyBytesAndFindsTheExtractorsText) {
  std::mt19937 random(7);
  unsigned taken = 0;
  for (int i = 0; i < 20'000; ++i) {
    std::string made;
    while (random() % 5 != 0) made += kPieces[random() % std::size(kPieces)];
    const std::vector<char> exact(made.begin(), made.end());
    const std::string_view bytes(exact.data(), exact.size());
    ChooseExtractor("name", bytes);
    const auto text = UTF8Text(TextPart(bytes));
    if (!text) continue;
    ++taken;
    ASSERT_TRUE(IsUTF8(*text));
    ASSERT_EQ(ToUTF8(TextPart(bytes), ""), *text);
    ASSERT_FALSE(bytes.starts_with("\xEF\xBB\xBF") && text->data() == bytes.data());
    ASSERT_TRUE(text->empty() || (text->begin() >= bytes.begin() && text->end() <= bytes.end()));
  }
  EXPECT_GT(taken, 2'000u);
}

TEST(CharsetTest, NonsenseBecomesValidUTF8) {
  std::string noise;
  for (int i = 1; i < 100'000; ++i) noise += static_cast<char>(i * 7919 >> 3);
  for (const char* declared : {"", "utf-8", "shift_jis", "utf-16le", "no-such-charset", "gb18030",
                               "iso-2022-kr", "../../etc/passwd"}) {
    EXPECT_TRUE(IsUTF8(ToUTF8(noise, declared))) << declared;
  }
  EXPECT_EQ("a\xEF\xBF\xBDz", ToUTF8("a\xff\xff\xffz", "utf-8"));
}

}  // namespace
}  // namespace maru::extract
