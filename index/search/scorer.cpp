#include "index/search/scorer.h"

#include <cmath>

namespace maru::index {

Scorer::Scorer(const std::vector<Reader*>& readers) : readers_(readers) {
  double length = 0;
  for (const Reader* reader : readers) {
    documents_ += static_cast<double>(reader->State().Documents());
    length += reader->State().TotalLength();
  }
  if (length > 0) half_per_average_ = 0.5 * documents_ / length;
}

double Scorer::WeightOf(const std::string& term) const {
  const auto [known, added] = known_.try_emplace(term);
  if (!added) return known->second;
  double frequency = 0;
  for (const Reader* reader : readers_) {
    frequency += static_cast<double>(reader->FrequencyOf(term));
  }
  double rarity = (documents_ - frequency + 0.5) / (frequency + 0.5);
  if (rarity < 2) rarity = rarity * 0.5 + 1;
  return known->second = 2 * std::log(rarity);
}

}  // namespace maru::index
