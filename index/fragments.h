#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "index/matcher.h"
#include "index/reader.h"

/// Fragments: runs of a text round matches.
namespace maru::index {

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

/// The window's text as HTML: escaped, white space folded to single blanks, control characters and
/// bytes that are not UTF-8 left out, matches marked.
std::string RenderWindow(std::string_view text, const Window& window,
                         const std::vector<Match>& matches);

/// The best fragments of a stored text. Bounded: looks into a few chunks that promise the most.
std::vector<Fragment> FragmentsOf(StoredText& text, const std::vector<MarkGroup>& groups,
                                  const FragmentOptions& options);

}  // namespace maru::index
