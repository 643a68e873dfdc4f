#include "system/utf8.h"

#include <gtest/gtest.h>

namespace {

/// Every code point of Unicode, one after the other, and what a strict reader says of it.
std::string Encoded(std::uint32_t point) {
  const auto follow = [&](int shift) { return static_cast<char>(0x80 | (point >> shift & 0x3f)); };
  if (point < 0x80) return {static_cast<char>(point)};
  if (point < 0x800) return {static_cast<char>(0xc0 | point >> 6), follow(0)};
  if (point < 0x10000) return {static_cast<char>(0xe0 | point >> 12), follow(6), follow(0)};
  return {static_cast<char>(0xf0 | point >> 18), follow(12), follow(6), follow(0)};
}

TEST(UTF8, KnowsEveryCharacterWholeAndCut) {
  for (std::uint32_t point = 0; point < 0x120000; ++point) {
    const bool is_one = point < 0x110000 && (point < 0xd800 || point > 0xdfff);
    const std::string bytes = Encoded(point);
    ASSERT_EQ(maru::IsUTF8(bytes), is_one) << std::hex << point;
    if (!is_one) continue;
    for (std::size_t cut = 1; cut < bytes.size(); ++cut) {
      const std::string beginning = bytes.substr(0, cut);
      ASSERT_FALSE(maru::IsUTF8(beginning)) << std::hex << point;
      ASSERT_TRUE(maru::IsCutUTF8(beginning)) << std::hex << point;
    }
    ASSERT_FALSE(maru::IsCutUTF8(bytes)) << std::hex << point;
  }
}

TEST(UTF8, RefusesWhatIsNone) {
  for (const std::string bad :
       {"\x80", "\xc0\x80", "\xc1\xbf", "\xe0\x9f\xbf", "\xf0\x8f\xbf\xbf", "\xf5\x80\x80\x80",
        "\xff", "\xc3(", "\xe2\x82(", "\xf0\x9f\x98("}) {
    EXPECT_FALSE(maru::IsUTF8(bad)) << bad;
    EXPECT_FALSE(maru::IsCutUTF8(bad)) << bad;
    EXPECT_EQ(maru::UTF8Beginning("0123456\xc3\xa9" + bad + "rest"), 9u) << bad;
  }
  for (const std::string bad : {"", "a", "\xe0\x80", "\xed\xa0", "\xf0\x80", "\xf4\x90", "\xf8"}) {
    EXPECT_FALSE(maru::IsCutUTF8(bad)) << bad;
  }
}

TEST(UTF8, IsCutBetweenCharacters) {
  const std::string text = "a\xc3\xa9\xe2\x82\xac\xf0\x9f\x98\x80";
  const std::size_t ends[] = {0, 1, 1, 3, 3, 3, 6, 6, 6, 6, 10, 10};
  for (std::size_t limit = 0; limit < std::size(ends); ++limit) {
    std::string cut = text;
    maru::CutUTF8(cut, limit);
    EXPECT_EQ(cut.size(), ends[limit]) << limit;
  }
}

}  // namespace
