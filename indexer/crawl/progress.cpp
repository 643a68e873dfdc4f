#include "indexer/crawl/progress.h"

#include <unistd.h>

#include <cstdarg>
#include <cstdio>

namespace maru::indexer {
namespace {

using std::chrono::milliseconds;

constexpr milliseconds kTerminalInterval{250};
constexpr milliseconds kLineInterval{5'000};
constexpr double kMegabyte = 1e6;
/// Before that, a rate says nothing.
constexpr double kFirstEstimate = 3;

std::string Format(const char* format, ...) __attribute__((format(printf, 1, 2)));
std::string Format(const char* format, ...) {
  char line[256];
  va_list values;
  va_start(values, format);
  std::vsnprintf(line, sizeof line, format, values);
  va_end(values);
  return line;
}

std::string Duration(double seconds) {
  const auto whole = static_cast<unsigned long long>(seconds + 0.5);
  if (whole < 60) return Format("%llu s", whole);
  if (whole < 3600) return Format("%llu:%02llu min", whole / 60, whole % 60);
  return Format("%llu:%02llu h", whole / 3600, whole / 60 % 60);
}

std::string TimeLeft(const Counts& counts, double seconds) {
  const double expected = static_cast<double>(counts.expected);
  const double seen = static_cast<double>(counts.Seen());
  if (expected <= seen || seen == 0 || seconds < kFirstEstimate) return {};
  return ", " + Duration(seconds * (expected - seen) / seen) + " left";
}

/// A share's name may hold anything; a terminal must not hear it.
std::string Printable(std::string name) {
  for (char& c : name) {
    if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) c = '?';
  }
  return name;
}

}  // namespace

Progress::Progress(bool quiet) : quiet_(quiet), terminal_(isatty(STDERR_FILENO) == 1) {}

milliseconds Progress::Interval() const {
  return terminal_ ? kTerminalInterval : kLineInterval;
}

double Progress::Seconds() const {
  return std::chrono::duration<double>(Clock::now() - begin_).count();
}

void Progress::Begin(const std::string& share) {
  share_ = share;
  begin_ = Clock::now();
}

void Progress::Show(const Counts& counts) {
  if (quiet_ || share_.empty()) return;
  const std::string line = Line(share_, counts, Seconds());
  if (terminal_) {
    std::fprintf(stderr, "\r%s\033[K", line.c_str());
  } else {
    std::fprintf(stderr, "%s\n", line.c_str());
  }
  std::fflush(stderr);
}

void Progress::End(const Counts& counts) {
  if (!quiet_) {
    if (terminal_) std::fputs("\r\033[K", stderr);
    std::printf("%s\n", Summary(share_, counts, Seconds()).c_str());
    std::fflush(stdout);
  }
  share_.clear();
}

std::string Progress::Line(const std::string& share, const Counts& counts, double seconds) {
  const double per_second = seconds > 0 ? 1 / seconds : 0;
  return Printable(share) +
         Format(": %llu files, %.0f files/s, %.1f MB/s",
                static_cast<unsigned long long>(counts.Seen()),
                static_cast<double>(counts.Seen()) * per_second,
                static_cast<double>(counts.bytes) / kMegabyte * per_second) +
         TimeLeft(counts, seconds);
}

std::string Progress::Summary(const std::string& share, const Counts& counts, double seconds) {
  const auto number = [](const std::atomic<std::uint64_t>& count) {
    return static_cast<unsigned long long>(count);
  };
  return Printable(share) +
         Format(": %llu new, %llu changed, %llu unchanged, %llu removed, %llu failed, %.1f s",
                number(counts.added), number(counts.changed), number(counts.unchanged),
                number(counts.removed), number(counts.failed) + number(counts.unreadable), seconds);
}

}  // namespace maru::indexer
