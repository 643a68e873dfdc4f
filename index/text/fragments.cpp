#include "index/text/fragments.h"

#include <utf8proc.h>

#include <algorithm>

namespace maru::index {
namespace {

/// How far a window's edge moves to fall between words.
constexpr std::size_t kMaxEdge = 40;

bool IsBlank(char c) {
  return static_cast<unsigned char>(c) <= 0x20 || c == 0x7f;
}

bool IsInside(char c) {
  return (static_cast<unsigned char>(c) & 0xc0) == 0x80;
}

/// Whether a reader sees a character begin at `at`: of a run of blanks, one.
bool Shows(std::string_view text, std::size_t at) {
  if (IsInside(text[at])) return false;
  return !IsBlank(text[at]) || at + 1 == text.size() || !IsBlank(text[at + 1]);
}

bool SplitsWord(std::string_view text, std::size_t at) {
  return at > 0 && at < text.size() && IsWordByte(text[at - 1]) && IsWordByte(text[at]);
}

std::size_t Back(std::string_view text, std::size_t at, std::size_t characters) {
  const std::size_t start = at;
  while (at > 0 && characters > 0) characters -= Shows(text, --at);
  std::size_t edge = at;
  while (edge < start && edge - at < kMaxEdge && SplitsWord(text, edge)) ++edge;
  return SplitsWord(text, edge) ? at : edge;
}

std::size_t Forth(std::string_view text, std::size_t at, std::size_t characters) {
  while (at < text.size() && (characters > 0 || IsInside(text[at]))) {
    characters -= characters > 0 && Shows(text, at);
    ++at;
  }
  std::size_t edge = at;
  while (edge - at < kMaxEdge && SplitsWord(text, edge)) ++edge;
  return SplitsWord(text, edge) ? at : edge;
}

void AppendEscaped(std::string& html, std::string_view text) {
  std::size_t at = 0;
  while (at < text.size()) {
    const auto byte = static_cast<unsigned char>(text[at]);
    if (byte <= 0x20 || byte == 0x7f) {
      if (!html.empty() && html.back() != ' ') html += ' ';
      ++at;
      continue;
    }
    if (byte < 0x80) {
      switch (text[at]) {
        case '&':
          html += "&amp;";
          break;
        case '<':
          html += "&lt;";
          break;
        case '>':
          html += "&gt;";
          break;
        case '"':
          html += "&quot;";
          break;
        case '\'':
          html += "&#39;";
          break;
        default:
          html += text[at];
      }
      ++at;
      continue;
    }
    utf8proc_int32_t c = 0;
    const auto size = utf8proc_iterate(reinterpret_cast<const utf8proc_uint8_t*>(text.data()) + at,
                                       static_cast<utf8proc_ssize_t>(text.size() - at), &c);
    if (size <= 0) {
      ++at;
      continue;
    }
    const auto category = utf8proc_category(c);
    if (category != UTF8PROC_CATEGORY_CC && category != UTF8PROC_CATEGORY_CF) {
      html.append(text, at, static_cast<std::size_t>(size));
    }
    at += static_cast<std::size_t>(size);
  }
}

}  // namespace

bool IsBetter(const Window& a, const Window& b) {
  return a.groups != b.groups ? a.groups > b.groups : a.matches > b.matches;
}

std::vector<Window> BestWindows(std::string_view text, const std::vector<Match>& matches,
                                const FragmentOptions& options) {
  std::vector<Window> candidates;
  std::vector<unsigned> inside;
  unsigned different = 0;
  const auto enter = [&](std::size_t group) {
    if (inside.size() <= group) inside.resize(group + 1);
    different += inside[group]++ == 0;
  };
  std::size_t end = 0;
  for (std::size_t begin = 0; begin < matches.size(); ++begin) {
    while (end < matches.size() &&
           (end <= begin || matches[end].end <= matches[begin].begin + options.length)) {
      enter(matches[end++].group);
    }
    candidates.push_back({begin, end, different, static_cast<unsigned>(end - begin)});
    different -= --inside[matches[begin].group] == 0;
  }
  std::stable_sort(candidates.begin(), candidates.end(), IsBetter);
  std::vector<Window> windows;
  for (const Window& candidate : candidates) {
    if (windows.size() >= options.count) break;
    const std::size_t first = matches[candidate.begin].begin;
    std::size_t last = 0;
    for (std::size_t i = candidate.begin; i < candidate.end; ++i) {
      last = std::max(last, matches[i].end);
    }
    const std::size_t covered = std::min(options.length, last - first);
    Window window = candidate;
    window.begin = Back(text, first, (options.length - covered) / 2);
    window.end = Forth(text, last, options.length - covered - (options.length - covered) / 2);
    const bool overlaps = std::any_of(windows.begin(), windows.end(), [&](const Window& other) {
      return window.begin < other.end && other.begin < window.end;
    });
    if (!overlaps) windows.push_back(window);
  }
  return windows;
}

std::string RenderWindow(std::string_view text, const Window& window,
                         const std::vector<Match>& matches) {
  std::string html;
  std::size_t rendered = window.begin;
  auto match = std::lower_bound(matches.begin(), matches.end(), window.begin,
                                [](const Match& a, std::size_t begin) { return a.begin < begin; });
  for (; match != matches.end() && match->end <= window.end; ++match) {
    if (match->begin < rendered) continue;
    AppendEscaped(html, text.substr(rendered, match->begin - rendered));
    html += "<mark>";
    AppendEscaped(html, text.substr(match->begin, match->end - match->begin));
    html += "</mark>";
    rendered = match->end;
  }
  AppendEscaped(html, text.substr(rendered, window.end - rendered));
  const std::size_t begin = std::min(html.find_first_not_of(' '), html.size());
  const std::size_t end = html.find_last_not_of(' ') + 1;
  return begin < end ? html.substr(begin, end - begin) : std::string();
}

}  // namespace maru::index
