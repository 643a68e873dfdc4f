#pragma once

#include <xapian.h>

#include <map>
#include <string>
#include <tuple>
#include <vector>

#include "index/matcher.h"
#include "index/plan.h"
#include "index/query.h"

/// From a query's tree to a plan, and to the words that are marked in fragments.
namespace maru::index {

/// Makes the sources of what only the reader knows of documents. Those of Phrase look for the
/// words, one behind the other, in the stored text of each document that has them all.
class Sources {
 public:
  virtual ~Sources() = default;
  /// What lies under a full path within the searched shares.
  virtual Xapian::Query Under(const std::string& full_path) = 0;
  virtual Xapian::Query Phrase(const std::vector<std::string>& words) = 0;
};

/// What words and prefixes were widened to at one state of the indices: (prefix of the field, word,
/// kind of query, exact) -> words. Emptied with a newer state.
class Expansions {
 public:
  using Key = std::tuple<std::string, std::string, Query::Kind, bool>;
  template <class Find>
  const std::vector<std::string>& Get(Key key, Find&& find) {
    if (known_.size() >= kMost) known_.clear();
    const auto found = known_.find(key);
    return found != known_.end() ? found->second
                                 : known_.emplace(std::move(key), find()).first->second;
  }
  void Clear() { known_.clear(); }

 private:
  static constexpr std::size_t kMost = 1000;
  std::map<Key, std::vector<std::string>> known_;
};

/// Throws Error (120) for a tree that is too deep or too large or names a field of another type.
class Compiler {
 public:
  Compiler(const Xapian::Database& database, Sources& sources, Expansions& expansions)
      : database_(database), sources_(sources), expansions_(expansions) {}

  Plan Compile(const Query& query);

  /// What to mark for a query: its words, less those it excludes.
  std::vector<MarkGroup> Marks(const Query& query);

  /// The words of the vocabulary of a field that begin with `prefix`, by number of documents, most
  /// first.
  static std::vector<std::string> WordsWithPrefix(const Xapian::Database& database,
                                                  std::string_view field_prefix,
                                                  const std::string& prefix, std::size_t limit);

 private:
  Plan Compile(const Query& query, unsigned depth);
  Plan CompileWord(const Query& query);
  Plan CompilePhrase(const Query& query);
  Plan TextPhrase(const std::vector<std::string>& words);
  Plan CompileValue(const Query& query);
  Plan CompileRange(const Query& query);
  Plan CompileParts(const Query& query, unsigned depth);
  void Mark(const Query& query, unsigned depth, std::vector<MarkGroup>& groups);
  void CountNode(unsigned depth);
  const std::vector<std::string>& Expand(const Query& query, std::string_view field_prefix);
  std::vector<std::string> FindExpansion(const Query& query, std::string_view field_prefix);
  std::vector<std::string> Forms(const std::string& word, std::string_view field_prefix);

  Xapian::Database database_;
  Sources& sources_;
  Expansions& expansions_;
  unsigned nodes_ = 0;
  std::size_t terms_ = 0;
};

}  // namespace maru::index
