#include "indexer/extract/processes.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <stdexcept>

namespace maru::extract {
namespace {

using std::chrono::milliseconds;

Extracted Good(const Source& source) {
  return {"title", {"Ann", "Bob"}, ReadStart(source.file, source.max_text)};
}
Extracted Crash(const Source&) {
  std::abort();
}
Extracted Hang(const Source&) {
  while (true) asm volatile("");
}
Extracted Oversize(const Source& source) {
  return {"", {}, std::string(source.max_text + 1, 'x')};
}
Extracted Refuses(const Source&) {
  throw std::runtime_error("not understood");
}
Extracted Greedy(const Source&) {
  std::vector<std::string> hoard;
  while (true) hoard.emplace_back(16u << 20, 'x');
}
Extracted NotUtf8(const Source&) {
  return {"\xff\xfet\n", {"a\xff"}, "x\xff\xffy"};
}
/// Tells what it could do that it must not.
Extracted Escape(const Source& source) {
  std::string done;
  if (open("/etc/passwd", O_RDONLY) >= 0) done += " open";
  if (socket(AF_INET, SOCK_STREAM, 0) >= 0) done += " socket";
  if (syscall(SYS_fork) >= 0) done += " fork";
  if (kill(getppid(), 0) == 0) done += " kill";
  if (execl("/bin/true", "true", nullptr) == 0) done += " exec";
  if (mmap(nullptr, 4096, PROT_READ | PROT_WRITE | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) !=
      MAP_FAILED) {
    done += " code";
  }
  if (fcntl(source.file, F_SETFL, O_APPEND) == 0) done += " fcntl";
  return {"", {}, "nothing" + done};
}

constexpr std::array kTable = {
    Extractor{"good", "", nullptr, Good},        Extractor{"crash", "", nullptr, Crash},
    Extractor{"hang", "", nullptr, Hang},        Extractor{"oversize", "", nullptr, Oversize},
    Extractor{"refuses", "", nullptr, Refuses},  Extractor{"greedy", "", nullptr, Greedy},
    Extractor{"not utf8", "", nullptr, NotUtf8}, Extractor{"escape", "", nullptr, Escape},
};
enum Row : std::size_t { kGood, kCrash, kHang, kOversize, kRefuses, kGreedy, kNotUtf8, kEscape };

class ProcessesTest : public testing::Test {
 protected:
  ProcessesTest() { EXPECT_EQ(5, write(file_.Get(), "hello", 5)); }
  std::optional<Extracted> Run(Row row, std::size_t max_text = 1000) {
    return processes_.Extract(0, row, file_.Get(), max_text);
  }

  UniqueFd file_{memfd_create("file", 0)};
  Processes processes_{1, kTable, milliseconds(1'000)};
};

TEST_F(ProcessesTest, AFileCostsAtMostItsOwnText) {
  for (const Row bad : {kCrash, kHang, kOversize, kRefuses, kGreedy, kCrash}) {
    EXPECT_FALSE(Run(bad)) << bad;
    const std::optional<Extracted> next = Run(kGood);
    ASSERT_TRUE(next) << "after " << bad;
    EXPECT_EQ("hello", next->text);
    EXPECT_EQ("title", next->title);
    EXPECT_EQ((std::vector<std::string>{"Ann", "Bob"}), next->authors);
  }
  EXPECT_EQ("hel", Run(kGood, 3)->text);
}

TEST_F(ProcessesTest, AnswersAreCheckedLikeAnyFile) {
  const std::optional<Extracted> answer = Run(kNotUtf8);
  ASSERT_TRUE(answer);
  EXPECT_EQ("x\xEF\xBF\xBDy", answer->text);
  EXPECT_EQ("\xEF\xBF\xBDt\n", answer->title) << "no converter runs here";
  EXPECT_EQ("a\xEF\xBF\xBD", answer->authors[0]);
}

TEST_F(ProcessesTest, AnExtractorCanDoNothingButRead) {
  const std::optional<Extracted> answer = Run(kEscape);
  ASSERT_TRUE(answer);
  EXPECT_EQ("nothing", answer->text);
}

TEST_F(ProcessesTest, TheWholeTableWorksInside) {
  Processes real(1);
  const UniqueFd page(memfd_create("page", 0));
  const std::string html =
      "<title>T</title><p>Stra\xDF"
      "e";
  ASSERT_EQ(static_cast<ssize_t>(html.size()), write(page.Get(), html.data(), html.size()));
  const std::optional<Extracted> answer = real.Extract(0, 0, page.Get(), 1000);
  ASSERT_TRUE(answer);
  EXPECT_EQ("T", answer->title);
  EXPECT_EQ(
      "Stra\xC3\x9F"
      "e",
      answer->text);
  EXPECT_TRUE(real.Extract(0, PlainTextRow(), page.Get(), 1000));
}

}  // namespace
}  // namespace maru::extract
