#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "index/search/sight.h"

/// The words of the indices: forms of a query's words, completions, spellings.
namespace maru::index {

/// Of all shares together. What it tells of words depends on documents that are seen alone.
class Vocabulary {
 public:
  /// The shares outlive this object.
  explicit Vocabulary(std::vector<Sight>& shares) : shares_(shares) {}

  /// The other words of `word`'s stem in a field, in their order: all that there are, also in
  /// documents that are not seen. Looked for in the ones that are, only theirs are found.
  std::vector<std::string> OtherFormsOf(const std::string& word,
                                        std::string_view field_prefix) const;
  /// Words of a field that begin with `prefix`, those in the most documents seen first, then in
  /// their order.
  std::vector<std::string> Beginning(const std::string& prefix, std::string_view field_prefix,
                                     std::size_t limit);
  /// The words of the text fields within a small number of edits of `word`: nearest first, then
  /// those in the most documents seen, then in their order.
  std::vector<std::string> Near(const std::string& word, std::size_t limit);

 private:
  struct Candidate {
    std::string term;
    std::string_view field_prefix;
    /// Documents, seen or not.
    std::uint64_t most;
  };

  std::optional<std::vector<Candidate>> CandidatesOfFew(const std::string& begin,
                                                        std::string_view field_prefix);
  void Poll() const;
  Xapian::Database All() const;
  std::uint64_t FrequencyOf(const std::string& term);
  std::vector<std::string> MostSeen(std::vector<Candidate> candidates, std::size_t limit);

  std::vector<Sight>& shares_;
};

}  // namespace maru::index
