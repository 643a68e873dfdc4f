#pragma once

#include <cstdint>
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

/// Of each group, in their order, the hashes of its words that a document may have. None: it has
/// nothing of the group.
using PresentWords = std::vector<std::vector<std::uint64_t>>;

/// Finds fragments for one query in one field, in text after text. One thread.
class FragmentFinder {
 public:
  explicit FragmentFinder(std::vector<MarkGroup> groups);

  /// The words of each in ascending order, but for phrases.
  const std::vector<MarkGroup>& Groups() const { return groups_; }
  const PresentWords& AllWords() const { return all_; }

  /// The best fragments of a stored text. Bounded: looks into a few chunks that promise the most.
  std::vector<Fragment> In(StoredText& text, const PresentWords& present,
                           const FragmentOptions& options);
  /// The whole text, when something matches.
  std::vector<Fragment> Whole(std::string_view text) const;

 private:
  unsigned Promise(const StoredText& text, std::size_t chunk, const PresentWords& present) const;
  std::vector<std::size_t> Promising(const StoredText& text, const PresentWords& present) const;

  std::vector<MarkGroup> groups_;
  Matcher matcher_;
  /// By group; those of groups that are no phrases stay unused.
  std::vector<PhraseFinder> phrases_;
  PresentWords all_;
  std::string piece_;
};

}  // namespace maru::index
