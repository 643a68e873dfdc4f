// File names that are no UTF-8, in JSON texts.

#include <gtest/gtest.h>

#include "server/host/surrogate_escape.h"

namespace maru::server {
namespace {

TEST(SurrogateEscape, BytesThatAreNoTextSurviveTheWeb) {
  const std::pair<std::string, std::string> texts[] = {
      {R"("plain \u00e4 \ud83d\udc80")", R"("plain \u00e4 \ud83d\udc80")"},
      {"\"\xc3\xa4 \xf0\x9f\x92\x80\"", "\"\xc3\xa4 \xf0\x9f\x92\x80\""},
      {"\"caf\xe9\"", R"("caf\udce9")"},
      {"\"\xff\x80\xc3\"", R"("\udcff\udc80\udcc3")"},
      {"\"\xed\xa0\x80\"", R"("\udced\udca0\udc80")"},
      {"\"\xc0\xaf\xf5\x80\x80\x80\"", R"("\udcc0\udcaf\udcf5\udc80\udc80\udc80")"},
  };
  for (const auto& [bytes, web] : texts) {
    EXPECT_EQ(EscapeBytes(bytes), web);
    EXPECT_EQ(UnescapeBytes(web), bytes);
  }
}

TEST(SurrogateEscape, OnlyLoneSurrogatesAreBytes) {
  for (const std::string text : {R"("\\udc80")", R"("\ud83d\udc80")", R"("\udc7f")", R"("\ud800")",
                                 R"("\udd00")", R"("\udc8)", R"("\)", R"("\u)", R"("\ud83d\u")"})
    EXPECT_EQ(UnescapeBytes(text), text);
  EXPECT_EQ(UnescapeBytes(R"("\\\udc80\ud83d\ud83d\udc80\udc80")"),
            "\"\\\\\x80\\ud83d\\ud83d\\udc80\x80\"");
}

}  // namespace
}  // namespace maru::server
