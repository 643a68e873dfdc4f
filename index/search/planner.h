#pragma once

#include <string>
#include <vector>

#include "index/search/plan.h"
#include "index/search/query.h"
#include "index/search/reader.h"
#include "index/search/vocabulary.h"
#include "index/text/word_finder.h"

namespace maru::index {

/// From a query's tree to a plan, and to the words that are marked in fragments. Throws Error (120)
/// for a tree that is too deep or too large or names a field of another type.
class Planner {
 public:
  /// `ids` are the readers' index ids; all outlive this object.
  Planner(const std::vector<Reader*>& readers, const std::vector<std::string>& ids)
      : readers_(readers), ids_(ids), vocabulary_(readers) {}

  Plan PlanOf(const Query& query);

  /// What to mark for a query: its words, less those it excludes.
  std::vector<MarkGroup> MarksOf(const Query& query);

 private:
  Plan Make(const Query& query, unsigned depth);
  Plan MakeWord(const Query& query);
  Plan MakePhrase(const Query& query);
  Plan MakeTextPhrase(const std::vector<std::string>& words);
  Plan MakeValue(const Query& query);
  Plan MakeRange(const Query& query);
  Plan MakeUnder(const Query& query);
  Plan MakeParts(const Query& query, unsigned depth);
  void Mark(const Query& query, unsigned depth, std::vector<MarkGroup>& groups);
  void CountNode(unsigned depth);
  std::vector<std::string> Expand(const Query& query, std::string_view field_prefix) const;

  const std::vector<Reader*>& readers_;
  const std::vector<std::string>& ids_;
  const Vocabulary vocabulary_;
  unsigned nodes_ = 0;
  std::size_t terms_ = 0;
};

}  // namespace maru::index
