#pragma once

#include <string>
#include <vector>

#include "index/search/plan.h"
#include "index/search/query.h"
#include "index/search/sight.h"
#include "index/search/vocabulary.h"
#include "index/text/word_finder.h"

namespace maru::index {

/// From a query's tree to a plan, and to the words that are marked in fragments. Throws Error (120)
/// for a tree that is too deep or too large or names a field of another type.
class Planner {
 public:
  /// `ids` are the shares' index ids; all outlive this object.
  Planner(std::vector<Sight>& shares, const std::vector<std::string>& ids)
      : shares_(shares), ids_(ids), vocabulary_(shares) {}

  Plan PlanOf(const Query& query);

  /// What to mark for a query: its words, less those it excludes.
  std::vector<MarkGroup> MarksOf(const Query& query);

 private:
  Plan Make(const Query& query, unsigned depth);
  Plan MakeWord(const Query& query);
  Plan MakePrefix(const Query& query);
  Plan MakePhrase(const Query& query);
  Plan MakeTextPhrase(const std::vector<std::string>& words);
  Plan MakeValue(const Query& query);
  Plan MakeRange(const Query& query);
  Plan MakeUnder(const Query& query);
  Plan MakeParts(const Query& query, unsigned depth);
  MarkGroup MarkOf(const Query& query, const std::string& field);
  void Mark(const Query& query, unsigned depth, std::vector<MarkGroup>& groups);
  void CountNode(unsigned depth);
  void CountWords(std::size_t words);

  std::vector<Sight>& shares_;
  const std::vector<std::string>& ids_;
  Vocabulary vocabulary_;
  unsigned nodes_ = 0;
  std::size_t terms_ = 0;
};

}  // namespace maru::index
