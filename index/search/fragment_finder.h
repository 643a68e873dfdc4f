#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "index/search/phrase_finder.h"
#include "index/store/texts.h"
#include "index/text/fragments.h"
#include "index/text/word_finder.h"

namespace maru::index {

/// Of each group, in their order, the hashes of its words that a document may have. None: it has
/// nothing of the group. Not told, as of all words that begin with a prefix: it may have any.
using PresentWords = std::vector<std::optional<std::vector<std::uint64_t>>>;

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
  WordFinder words_;
  /// By group; those of groups that are no phrases stay unused.
  std::vector<PhraseFinder> phrases_;
  PresentWords all_;
  std::string piece_;
};

}  // namespace maru::index
