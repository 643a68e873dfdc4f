#include "daemon/language/range.h"

#include <charconv>
#include <cmath>
#include <cstdint>
#include <ctime>
#include <limits>
#include <string>
#include <tuple>

#include "system/text.h"

namespace maru::daemon {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

/// What one end stands for: a number is itself, a date all its seconds.
using EndParser = std::optional<Range> (*)(std::string_view);

std::optional<Range> ParseComparison(std::string_view text, EndParser parse) {
  const bool less = text[0] == '<';
  text.remove_prefix(1);
  const bool with_end = text.starts_with('=');
  if (with_end) text.remove_prefix(1);
  const std::optional<Range> end = parse(Trimmed(text));
  if (!end) return std::nullopt;
  if (less) return Range{-kInfinity, with_end ? end->high : std::ceil(end->low) - 1};
  return Range{with_end ? end->low : std::floor(end->high) + 1, kInfinity};
}

std::optional<Range> ParseRange(std::string_view text, EndParser parse) {
  text = Trimmed(text);
  if (text.starts_with('<') || text.starts_with('>')) return ParseComparison(text, parse);
  const std::size_t dots = text.find("..");
  if (dots == std::string_view::npos) return parse(text);
  const std::string_view first = Trimmed(text.substr(0, dots));
  const std::string_view last = Trimmed(text.substr(dots + 2));
  if (first.empty() && last.empty()) return std::nullopt;
  const std::optional<Range> open(Range{-kInfinity, kInfinity});
  const std::optional<Range> low = first.empty() ? open : parse(first);
  const std::optional<Range> high = last.empty() ? open : parse(last);
  if (!low || !high || low->low > high->high) return std::nullopt;
  return Range{low->low, high->high};
}

std::optional<Range> ParseSize(std::string_view text) {
  if (text.empty() || text[0] < '0' || text[0] > '9') return std::nullopt;
  double number = 0;
  const auto [behind, error] =
      std::from_chars(text.data(), text.data() + text.size(), number, std::chars_format::fixed);
  if (error != std::errc()) return std::nullopt;
  const std::string_view unit = Trimmed({behind, text.data() + text.size()});
  if (unit.empty() || SameWord(unit, "b")) return Range{number, number};
  const std::size_t power = std::string_view("kKmMgGtT").find(unit[0]);
  const std::string_view rest = unit.substr(1);
  if (power == std::string_view::npos ||
      !(rest.empty() || SameWord(rest, "b") || SameWord(rest, "ib"))) {
    return std::nullopt;
  }
  number *= std::pow(1024.0, static_cast<double>(power / 2 + 1));
  return Range{number, number};
}

/// Takes digits off the front: `least` to `most` of them.
std::optional<int> TakeNumber(std::string_view& text, std::size_t least, std::size_t most) {
  std::size_t count = 0;
  int number = 0;
  while (count < most && count < text.size() && text[count] >= '0' && text[count] <= '9') {
    number = number * 10 + (text[count++] - '0');
  }
  if (count < least) return std::nullopt;
  text.remove_prefix(count);
  return number;
}

bool TakeMark(std::string_view& text, std::string_view marks) {
  if (text.empty() || marks.find(text.front()) == std::string_view::npos) return false;
  text.remove_prefix(1);
  return true;
}

/// "Z", "+02:00", "-0530" or nothing. `seconds` east of Greenwich; false when malformed.
bool TakeZone(std::string_view& text, std::optional<int>& seconds) {
  if (text.empty()) return true;
  if (TakeMark(text, "Zz")) {
    seconds = 0;
    return true;
  }
  const int sign = text.front() == '-' ? -1 : 1;
  if (!TakeMark(text, "+-")) return false;
  const std::optional<int> hours = TakeNumber(text, 2, 2);
  TakeMark(text, ":");
  const std::optional<int> minutes = TakeNumber(text, 2, 2);
  if (!hours || !minutes || *hours > 14 || *minutes > 59) return false;
  seconds = sign * (*hours * 3600 + *minutes * 60);
  return true;
}

double SecondsOf(std::tm time, const std::optional<int>& zone) {
  time.tm_isdst = -1;
  return static_cast<double>(zone ? timegm(&time) - *zone : mktime(&time));
}

std::optional<Range> ParseEpoch(std::string_view text) {
  std::int64_t seconds = 0;
  const char* const end = text.data() + text.size();
  const auto [behind, error] = std::from_chars(text.data(), end, seconds);
  if (error != std::errc() || behind != end) return std::nullopt;
  return Range{static_cast<double>(seconds), static_cast<double>(seconds)};
}

/// The year and, as far as they are there, month and day. `step` becomes the last that is.
bool TakeDate(std::string_view& text, std::tm& time, int std::tm::*& step) {
  const std::optional<int> year = TakeNumber(text, 4, 4);
  if (!year) return false;
  time.tm_year = *year - 1900;
  time.tm_mday = 1;
  step = &std::tm::tm_year;
  if (!TakeMark(text, "-")) return true;
  const std::optional<int> month = TakeNumber(text, 1, 2);
  if (!month) return false;
  time.tm_mon = *month - 1;
  step = &std::tm::tm_mon;
  if (!TakeMark(text, "-")) return true;
  const std::optional<int> day = TakeNumber(text, 1, 2);
  if (!day) return false;
  time.tm_mday = *day;
  step = &std::tm::tm_mday;
  return true;
}

/// Hours, minutes and, if they are there, seconds. `step` becomes the last that is.
bool TakeClock(std::string_view& text, std::tm& time, int std::tm::*& step) {
  const std::optional<int> hour = TakeNumber(text, 2, 2);
  if (!hour || !TakeMark(text, ":")) return false;
  const std::optional<int> minute = TakeNumber(text, 2, 2);
  if (!minute) return false;
  time.tm_hour = *hour;
  time.tm_min = *minute;
  step = &std::tm::tm_min;
  if (TakeMark(text, ":")) {
    const std::optional<int> second = TakeNumber(text, 2, 2);
    if (!second) return false;
    time.tm_sec = *second;
    step = &std::tm::tm_sec;
  }
  return true;
}

/// Whether the calendar and the clock know that moment: what they do not know they carry over.
bool Exists(const std::tm& time) {
  const auto parts = [](const std::tm& of) {
    return std::tie(of.tm_mon, of.tm_mday, of.tm_hour, of.tm_min, of.tm_sec);
  };
  std::tm carried = time;
  timegm(&carried);
  return parts(carried) == parts(time);
}

std::optional<Range> ParseTime(std::string_view text) {
  if (text.starts_with('@')) return ParseEpoch(text.substr(1));
  std::tm time{};
  int std::tm::*step = nullptr;
  std::optional<int> zone;
  if (!TakeDate(text, time, step)) return std::nullopt;
  if (step == &std::tm::tm_mday && TakeMark(text, "Tt ") &&
      !(TakeClock(text, time, step) && TakeZone(text, zone))) {
    return std::nullopt;
  }
  if (!text.empty() || !Exists(time)) return std::nullopt;
  std::tm next = time;
  ++(next.*step);
  return Range{SecondsOf(time, zone), SecondsOf(next, zone) - 1};
}

}  // namespace

std::optional<Range> ParseSizeRange(std::string_view text) {
  return ParseRange(text, ParseSize);
}

std::optional<Range> ParseTimeRange(std::string_view text) {
  return ParseRange(text, ParseTime);
}

}  // namespace maru::daemon
