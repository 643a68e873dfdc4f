#pragma once

#include <xapian.h>

#include <string>
#include <string_view>
#include <vector>

#include "index/compile.h"
#include "index/reader.h"
#include "index/texts.h"

/// Fragments round matches, by positions: which words of a text match is known from the index, so
/// only the piece of the text that a fragment shows is ever read.
namespace maru::index {

/// Words [first, last] of a text that one group matched.
struct Span {
  Xapian::termpos first;
  Xapian::termpos last;
  std::size_t group;
};

/// Where the groups match in a field of a document, from the position lists; in order of `first`.
std::vector<Span> SpansFromIndex(const Xapian::Database& database, Xapian::docid document,
                                 std::string_view field_prefix,
                                 const std::vector<MarkGroup>& groups);

/// The same for a text at hand.
std::vector<Span> SpansInText(std::string_view text, const std::vector<MarkGroup>& groups);

/// Runs of words worth showing: the windows with the most different groups, then the most matches,
/// that do not overlap; best first.
struct Window {
  Xapian::termpos first;
  Xapian::termpos last;
  unsigned matches;
};
std::vector<Window> BestWindows(const std::vector<Span>& spans, const FragmentOptions& options);

/// The window's words of the piece as HTML: escaped, white space folded to single blanks, control
/// characters and bytes that are not UTF-8 left out, spans marked.
std::string RenderWindow(const TextPiece& piece, const Window& window,
                         const std::vector<Span>& spans);

}  // namespace maru::index
