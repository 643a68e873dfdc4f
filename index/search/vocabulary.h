#pragma once

#include <xapian.h>

#include <string>
#include <string_view>
#include <vector>

#include "index/search/query.h"
#include "index/search/reader.h"

/// The words of the indices: what a query's words and prefixes are widened to, completions,
/// spellings.
namespace maru::index {

/// A word of one share's or all shares' vocabulary, without its field's prefix.
struct WordCount {
  std::string word;
  std::uint64_t documents = 0;
};

class Vocabulary {
 public:
  /// The readers outlive this object.
  explicit Vocabulary(const std::vector<Reader*>& readers) : readers_(readers) {}

  /// The words that stand for `word` in a field: itself and, unless `exact`, the words of its stem.
  std::vector<std::string> FormsOf(const std::string& word, std::string_view field_prefix,
                                   bool exact) const;
  /// Words that begin with `prefix`: Query::kMaxExpansion of them, those of the most documents.
  std::vector<std::string> BeginningWith(const std::string& prefix,
                                         std::string_view field_prefix) const;

  /// Words of a field that begin with `prefix`, by number of documents, most first; not kept.
  std::vector<WordCount> MostFrequent(const std::string& prefix, std::string_view field_prefix,
                                      std::size_t limit) const;
  struct Near {
    unsigned distance;
    std::uint64_t documents;
    std::string word;
    std::string term;
  };
  /// The words of the text fields within a small number of edits of `word`, nearest and commonest
  /// first.
  std::vector<Near> NearTo(const std::string& word) const;

 private:
  std::vector<WordCount> Widened(char kind, const std::string& word,
                                 std::string_view field_prefix) const;
  Xapian::Database All() const;

  const std::vector<Reader*>& readers_;
};

}  // namespace maru::index
