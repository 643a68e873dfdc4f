#include "index/search/ranking.h"

#include <algorithm>
#include <tuple>

namespace maru::index {

Ranking::Ranking(const SearchOptions& options)
    : from_(options.from),
      wanted_(options.size == 0 ? 0 : std::size_t{options.from} + options.size),
      ascending_(options.ascending) {}

/// Of equals the first document is the better one.
bool Ranking::IsBetter(const Ranked& a, const Ranked& b) const {
  if (a.key != b.key) return ascending_ ? a.key < b.key : a.key > b.key;
  return a.weight != b.weight ? a.weight > b.weight
                              : std::tie(a.document, a.share) < std::tie(b.document, b.share);
}

void Ranking::Keep(const Ranked& match) {
  const auto better = [this](const Ranked& a, const Ranked& b) { return IsBetter(a, b); };
  if (best_.size() == wanted_) {
    std::pop_heap(best_.begin(), best_.end(), better);
    best_.pop_back();
  }
  best_.push_back(match);
  std::push_heap(best_.begin(), best_.end(), better);
}

std::vector<Ranked> Ranking::Page() {
  std::sort_heap(best_.begin(), best_.end(),
                 [this](const Ranked& a, const Ranked& b) { return IsBetter(a, b); });
  best_.erase(best_.begin(),
              best_.begin() + static_cast<std::ptrdiff_t>(std::min(from_, best_.size())));
  return std::move(best_);
}

}  // namespace maru::index
