#pragma once

#include <vector>

#include "index/search/view.h"

namespace maru::index {

/// A match and what it is ranked by.
struct Ranked {
  std::size_t share;
  DocumentId document;
  double weight;
  /// The sort field's value; the same for all when the order is by weight.
  double key = 0;
};

/// Keeps the best matches of a search, as many as its page needs.
class Ranking {
 public:
  explicit Ranking(const SearchOptions& options);

  void Take(const Ranked& match) {
    if (best_.size() < wanted_ || (wanted_ > 0 && IsBetter(match, best_.front()))) Keep(match);
  }
  /// The page's matches, best first. Once.
  std::vector<Ranked> Page();

 private:
  bool IsBetter(const Ranked& a, const Ranked& b) const;
  void Keep(const Ranked& match);

  const std::size_t from_, wanted_;
  const bool ascending_;
  /// A heap, the worst in front.
  std::vector<Ranked> best_;
};

}  // namespace maru::index
