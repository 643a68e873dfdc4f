#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include "indexer/extract/charset.h"
#include "indexer/extract/extractor.h"
#include "system/unique_fd.h"
#include "system/utf8.h"

namespace maru::extract {
namespace {

Extracted Html(const std::string& html, std::size_t max_text = 1u << 20) {
  const UniqueFd file(memfd_create("page", 0));
  EXPECT_EQ(static_cast<ssize_t>(html.size()), write(file.Get(), html.data(), html.size()));
  return ExtractHtml({file.Get(), max_text});
}

std::string Repeat(const std::string& text, std::size_t times) {
  std::string all;
  for (; times > 0; --times) all += text;
  return all;
}

TEST(HtmlTest, TakesWhatAReaderSees) {
  const Extracted page = Html(R"(<!DOCTYPE html><html><head>
      <title> The &quot;long&quot;
        title </title><meta name="Author" content="Ann Bee"><meta name=author content="C. D.">
      <style>.x { color: red }</style><script>var hidden = "<p>secret</p>";</script></head>
      <body><h1>Head</h1><p>one<b>word</b> &amp; &eacute;&#x20AC;&nope;<br>next<!-- comment -->
      <ul><li>first<li>second</ul><table><tr><td>cell<td>other</table><noscript>no</noscript>)");
  EXPECT_EQ("The \"long\" title", page.title);
  EXPECT_EQ((std::vector<std::string>{"Ann Bee", "C. D."}), page.authors);
  EXPECT_EQ("Head\noneword & \xC3\xA9\xE2\x82\xAC&nope;\nnext\nfirst\nsecond\ncell\nother",
            page.text);
}

TEST(HtmlTest, GoesByTheCharsetThatThePageNames) {
  EXPECT_EQ("\xD0\xBF\xD1\x80\xD0\xB8", Html("<meta charset='koi8-r'><p>\xD0\xD2\xC9").text);
  EXPECT_EQ("\xE2\x80\x93", Html("<META HTTP-EQUIV=content-type content=\"text/html; "
                                 "charset=iso-8859-1\"><p>\x96")
                                .text);
  EXPECT_EQ("\xC3\xA9", Html(std::string("\xFF\xFE<\0p\0>\0\xE9\0", 10)).text);
}

TEST(HtmlTest, RecognisesPages) {
  EXPECT_TRUE(IsHtml("\xEF\xBB\xBF \n<!doctype HTML><p>"));
  EXPECT_TRUE(IsHtml("<HTML lang=de>"));
  EXPECT_FALSE(IsHtml("<?xml version='1.0'?><feed>"));
  EXPECT_FALSE(IsHtml(""));
  EXPECT_EQ(0u, ChooseExtractor("x.htm", "no tags at all"));
  EXPECT_EQ(0u, ChooseExtractor("x", "<html>"));
  EXPECT_EQ(PlainTextRow(), ChooseExtractor("x.txt", "text"));
  EXPECT_EQ(kNoExtractor, ChooseExtractor("x.htm", std::string("<html>\0", 7)));
  EXPECT_EQ(kNoExtractor, ChooseExtractor("x.txt", "%PDF-1.7\n"));
  EXPECT_FALSE(MayHoldText("film.MP4"));
  EXPECT_TRUE(MayHoldText("README"));
}

TEST(HtmlTest, HostilePagesEndAndStayWithinBounds) {
  const std::string hostile[] = {
      Repeat("<div>", 20'000) + "deep",
      Repeat("<b>", 2'000) + "bold",
      Repeat("<table><tr><td>", 3'000) + "cells",
      Repeat("<", 100'000),
      Repeat("&", 100'000),
      "<a href=\"" + std::string(1'000'000, 'x'),
      "<!--" + std::string(100'000, '-'),
      "<script>" + Repeat("</scrip>", 10'000),
      "<title>" + std::string(100'000, 't'),
      "<svg><title>" + Repeat("<desc><svg>", 500) + "x",
      "<template>" + Repeat("<template>", 1'000) + "x",
      Repeat("<meta name=author content=x>", 1'000),
      std::string("a\0b<p\0>c", 8),
  };
  for (const std::string& html : hostile) {
    const Extracted page = Html(html, 1000);
    EXPECT_LE(page.text.size(), 1000u);
    EXPECT_LE(page.title.size(), 1024u);
    EXPECT_LE(page.authors.size(), 16u);
    EXPECT_TRUE(IsUTF8(page.text));
  }
  EXPECT_EQ("deep", Html(hostile[0]).text);
}

}  // namespace
}  // namespace maru::extract
