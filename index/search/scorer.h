#pragma once

#include <algorithm>
#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "index/search/sight.h"

namespace maru::index {

/// Weighs terms as the engine does by default: BM25 with k1 = 1, k3 = 1, b = 0.5 and lengths of at
/// least half the average, by the documents seen in all shares that are searched together.
/// Robertson et al., "Okapi at TREC-3", 1994. One thread.
class Scorer {
 public:
  /// The shares outlive this object.
  explicit Scorer(std::vector<Sight>& shares);

  /// What a document could at most get for the term, or for those that begin with it as one.
  double WeightOf(const std::string& term, bool is_prefix) const;
  /// What the count of a term is set against in a document of so many words.
  double Against(std::uint32_t length) const {
    return std::max(length * half_per_average_ + 0.5, 0.75);
  }

 private:
  std::vector<Sight>& shares_;
  double documents_ = 0;
  double half_per_average_ = 0;
  mutable std::map<std::pair<bool, std::string>, double> known_;
};

}  // namespace maru::index
