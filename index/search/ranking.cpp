#include "index/search/ranking.h"

#include <algorithm>
#include <tuple>

namespace maru::index {

Ranking::Ranking(const SearchOptions& options)
    : from_(options.from),
      wanted_(options.size == 0 ? 0 : std::size_t{options.from} + options.size),
      ascending_(options.ascending) {}

/// Below 0 when the first is the better one by key, weight and time, above when it is the worse.
int Ranking::Order(const Ranked& a, const Ranked& b) const {
  if (a.key != b.key) return (ascending_ ? a.key < b.key : a.key > b.key) ? -1 : 1;
  if (a.weight != b.weight) return a.weight > b.weight ? -1 : 1;
  return a.time == b.time ? 0 : a.time > b.time ? -1 : 1;
}

bool Ranking::IsBetter(const Ranked& a, const Ranked& b) const {
  const int order = Order(a, b);
  if (order != 0) return order < 0;
  return std::tie(a.share, a.order, a.document) < std::tie(b.share, b.order, b.document);
}

void Ranking::Take(const Ranked& match) {
  const auto better = [this](const Ranked& a, const Ranked& b) { return IsBetter(a, b); };
  if (best_.size() == wanted_) {
    if (wanted_ == 0 || !better(match, best_.front())) return;
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
