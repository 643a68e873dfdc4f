#pragma once

#include <xapian.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "index/query.h"

/// From a query's tree to the engine's, and to the words that are marked in fragments.
namespace maru::index {

/// Words that count as one in a field: forms of a word, completions of a prefix, or a phrase.
struct MarkGroup {
  std::string field;
  /// Folded words without prefix; of a phrase: in its order.
  std::vector<std::string> words;
  bool phrase = false;
};

/// Makes the source that accepts what lies under a full path within the searched shares.
using FolderSource = std::function<Xapian::Query(const std::string& full_path)>;

/// Throws Error (120) for a tree that is too deep or too large or names a field of another type.
class Compiler {
 public:
  Compiler(const Xapian::Database& database, FolderSource folders)
      : database_(database), folders_(std::move(folders)) {}

  Xapian::Query Compile(const Query& query);

  /// What to mark for a query: its words, less those it excludes.
  std::vector<MarkGroup> Marks(const Query& query);

  /// The words of the vocabulary of a field that begin with `prefix`, by number of documents, most
  /// first.
  static std::vector<std::string> WordsWithPrefix(const Xapian::Database& database,
                                                  std::string_view field_prefix,
                                                  const std::string& prefix, std::size_t limit);

 private:
  Xapian::Query Compile(const Query& query, unsigned depth);
  Xapian::Query CompileWord(const Query& query);
  Xapian::Query CompilePhrase(const Query& query);
  Xapian::Query CompileValue(const Query& query);
  Xapian::Query CompileRange(const Query& query);
  Xapian::Query CompileParts(const Query& query, unsigned depth);
  void Mark(const Query& query, unsigned depth, std::vector<MarkGroup>& groups);
  void CountNode(unsigned depth);
  std::vector<std::string> Expand(const Query& query, std::string_view field_prefix);
  std::vector<std::string> Forms(const std::string& word, std::string_view field_prefix);

  Xapian::Database database_;
  FolderSource folders_;
  unsigned nodes_ = 0;
};

}  // namespace maru::index
