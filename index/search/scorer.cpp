#include "index/search/scorer.h"

#include <cmath>

namespace maru::index {

Scorer::Scorer(std::vector<Sight>& shares) : shares_(shares) {
  Collection all;
  for (Sight& share : shares) {
    all.documents += share.Seen().documents;
    all.words += share.Seen().words;
  }
  documents_ = static_cast<double>(all.documents);
  if (all.words > 0) half_per_average_ = 0.5 * documents_ / static_cast<double>(all.words);
}

double Scorer::WeightOf(const std::string& term, bool is_prefix) const {
  const auto [known, added] = known_.try_emplace({is_prefix, term});
  if (!added) return known->second;
  std::uint64_t frequency = 0;
  for (Sight& share : shares_) frequency += share.FrequencyOf(term, is_prefix);
  const auto with = static_cast<double>(frequency);
  double rarity = (documents_ - with + 0.5) / (with + 0.5);
  if (rarity < 2) rarity = rarity * 0.5 + 1;
  return known->second = 2 * std::log(rarity);
}

}  // namespace maru::index
