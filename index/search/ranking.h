#pragma once

#include <vector>

#include "index/search/view.h"

namespace maru::index {

/// A match and what it is ranked by. Of equals the newest comes first, then what `order` says,
/// which is made of names: where a document came to lie in the index tells of those indexed before
/// it.
struct Ranked {
  std::size_t share;
  DocumentId document;
  double weight;
  /// The sort field's value; the same for all when the order is by weight.
  double key = 0;
  double time = 0;
  std::uint64_t order = 0;
};

/// Keeps the best matches of a search, as many as its page needs.
class Ranking {
 public:
  explicit Ranking(const SearchOptions& options);

  /// Whether a match may be among the best, as far as its key, weight and time tell.
  bool Wants(const Ranked& match) const {
    return best_.size() < wanted_ || (wanted_ > 0 && Order(match, best_.front()) <= 0);
  }
  void Take(const Ranked& match);
  /// The page's matches, best first. Once.
  std::vector<Ranked> Page();

 private:
  int Order(const Ranked& a, const Ranked& b) const;
  bool IsBetter(const Ranked& a, const Ranked& b) const;

  const std::size_t from_, wanted_;
  const bool ascending_;
  /// A heap, the worst in front.
  std::vector<Ranked> best_;
};

}  // namespace maru::index
