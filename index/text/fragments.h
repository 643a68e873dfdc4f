#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "index/text/word_finder.h"

/// Fragments: runs of a text round matches.
namespace maru::index {

/// A run of a field's text round matches.
struct Fragment {
  /// HTML-escaped, matches marked <mark>like this</mark>.
  std::string html;
  unsigned matches = 0;
};

struct FragmentOptions {
  std::string field;
  /// Length of a fragment in characters, about; whole words are kept.
  std::size_t length = 100;
  std::size_t count = 3;
};

/// A run of bytes [begin, end) worth showing.
struct Window {
  std::size_t begin;
  std::size_t end;
  /// Different groups in it, and matches.
  unsigned groups;
  unsigned matches;
};

/// The windows with the most different groups, then the most matches, that do not overlap; best
/// first. They begin and end between words, where words are not too long for that.
std::vector<Window> BestWindows(std::string_view text, const std::vector<Match>& matches,
                                const FragmentOptions& options);

/// Whether the first is the better one to show.
bool IsBetter(const Window& a, const Window& b);

/// The window's text as HTML: escaped, white space folded to single blanks, control characters and
/// bytes that are not UTF-8 left out, matches marked.
std::string RenderWindow(std::string_view text, const Window& window,
                         const std::vector<Match>& matches);

}  // namespace maru::index
