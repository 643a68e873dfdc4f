#include "index/search/view.h"

#include <algorithm>
#include <array>
#include <numeric>
#include <set>
#include <tuple>

#include "index/search/planner.h"
#include "index/search/ranking.h"
#include "index/search/view_state.h"
#include "index/search/vocabulary.h"
#include "index/store/fields.h"
#include "index/text/tokenizer.h"

namespace maru::index {
namespace {

/// The weight that a boost of 1 adds: about that of a rare word.
constexpr double kBoostWeight = 10;
/// Words looked at per suggestion asked for.
constexpr std::size_t kCandidatesPerWord = 8;

using KindSet = std::array<bool, kKinds>;

/// The kinds a filter keeps, when that is all it asks.
std::optional<KindSet> KindsKept(const Query& filter) {
  KindSet kinds{};
  if (filter.kind == Query::Kind::kEverything) {
    kinds.fill(true);
    return kinds;
  }
  if (filter.kind == Query::Kind::kValue && filter.field == kKind && IsKind(filter.text)) {
    kinds[KindNumber(filter.text)] = true;
    return kinds;
  }
  if (filter.kind != Query::Kind::kOr) return std::nullopt;
  for (const Query& part : filter.parts) {
    const auto some = KindsKept(part);
    if (!some) return std::nullopt;
    for (std::size_t i = 0; i < kKinds; ++i) kinds[i] = kinds[i] || (*some)[i];
  }
  return kinds;
}

/// The value slot of the sort field; -1 for the order by weight.
int SlotOf(const std::string& sort_field) {
  if (sort_field.empty()) return -1;
  const Field* field = FindField(sort_field);
  if (field && field->slot >= 0) return field->slot;
  throw maruseeker::Error(maruseeker::kErrorBadParameter, "Cannot sort by " + sort_field);
}

Plan PlanOf(const View::State& state, const Query& query) {
  return Planner(state.Readers(), state.Ids()).PlanOf(query);
}

Hit HitOf(const Reader& reader, std::size_t share, DocumentId id, Stored stored) {
  const DirectoryTable& table = reader.State().Table();
  Hit hit;
  hit.share = share;
  hit.document = id;
  hit.record = std::move(stored.record);
  hit.owner = table.Rights(stored.place.rights).uid;
  hit.text = stored.text;
  const DirectoryId parent = stored.place.parent;
  if (parent != 0) hit.path = table.PathOf(parent) + "/" + hit.record.name;
  return hit;
}

/// Documents are read in their own order, in which the engine reads each block once.
std::vector<Hit> HitsOf(View::State& state, const std::vector<Ranked>& matches) {
  std::vector<std::size_t> order(matches.size());
  std::iota(order.begin(), order.end(), 0);
  std::sort(order.begin(), order.end(), [&](auto a, auto b) {
    return std::tie(matches[a].share, matches[a].document) <
           std::tie(matches[b].share, matches[b].document);
  });
  std::vector<Hit> hits(matches.size());
  for (const std::size_t rank : order) {
    const Ranked& match = matches[rank];
    const Reader& reader = state.At(match.share);
    // A match is there: looking whether it is would cost as much again.
    const auto document = reader.Database().get_document(match.document, Xapian::DOC_ASSUME_VALID);
    hits[rank] = HitOf(reader, match.share, match.document, Stored::Decode(document.get_data()));
    hits[rank].score = match.weight;
  }
  return hits;
}

/// Hands a block's matches to the ranking, with what they are boosted and sorted by.
class Ranker {
 public:
  Ranker(View::State& state, const SearchOptions& options)
      : state_(state),
        ranking_(options),
        slot_(SlotOf(options.sort_field)),
        boost_(options.boosts.begin()),
        boosts_end_(options.boosts.end()) {}

  void Take(std::size_t share, const MatchBlock& block) {
    const auto take = [&](DocumentId offset, double key) {
      const DocumentId id = block.first + offset;
      ranking_.Take({share, id, block.weights[offset] + BoostOf(share, id), key});
    };
    if (slot_ < 0) {
      ForEachBit(block.matches, [&](DocumentId offset) { take(offset, 0); });
    } else {
      const auto column = NumberColumn(static_cast<Xapian::valueno>(slot_));
      state_.At(share).ForEachValue(column, block.first, block.matches, take);
    }
  }
  std::vector<Ranked> Page() { return ranking_.Page(); }

 private:
  /// Documents come in ascending order, as the boosts do.
  double BoostOf(std::size_t share, DocumentId id) {
    const std::pair key(share, id);
    while (boost_ != boosts_end_ && boost_->first < key) ++boost_;
    return boost_ != boosts_end_ && boost_->first == key ? kBoostWeight * boost_->second : 0;
  }

  using Boost = decltype(SearchOptions::boosts)::const_iterator;
  View::State& state_;
  Ranking ranking_;
  const int slot_;
  Boost boost_;
  const Boost boosts_end_;
};

KindCounts CountKinds(View::State& state, const Query& query) {
  KindCounts counts{};
  state.ForEachSeen(PlanOf(state, query), nullptr, [&](std::size_t share, const MatchBlock& block) {
    state.At(share).ForEachValue(kPlaces, block.first, block.matches,
                                 [&](DocumentId, const Place& place) {
                                   if (place.kind < kKinds) ++counts[place.kind];
                                 });
    return true;
  });
  return counts;
}

bool SomeDocumentHas(View::State& state, const std::string& term) {
  bool some = false;
  state.ForEachSeen(Plan::Term(term), nullptr, [&](std::size_t, const MatchBlock& block) {
    some = CountBits(block.matches) > 0;
    return !some;
  });
  return some;
}

}  // namespace

View::View(std::unique_ptr<State> state) : state_(std::move(state)) {}
View::~View() = default;

SearchResult View::Search(const Query& query, const SearchOptions& options) {
  return state_->OnOneState("Cannot search", [&] {
    SearchResult result;
    if (state_->Shares() == 0) return result;
    const Plan plan = PlanOf(*state_, query);
    const Scorer scorer(state_->Readers());
    Ranker ranker(*state_, options);
    state_->ForEachSeen(plan, options.size > 0 ? &scorer : nullptr,
                        [&](std::size_t share, const MatchBlock& block) {
                          result.total += CountBits(block.matches);
                          if (options.size > 0) ranker.Take(share, block);
                          return true;
                        });
    result.hits = HitsOf(*state_, ranker.Page());
    return result;
  });
}

std::vector<std::uint64_t> View::Count(const Query& query, const std::vector<Query>& filters) {
  const auto counts =
      state_->OnOneState("Cannot count", [&] { return CountKinds(*state_, query); });
  std::vector<std::uint64_t> result;
  for (const Query& filter : filters) {
    std::uint64_t count = 0;
    if (const auto kinds = KindsKept(filter)) {
      for (std::size_t kind = 0; kind < kKinds; ++kind) count += (*kinds)[kind] ? counts[kind] : 0;
    } else {
      Query narrowed;
      narrowed.kind = Query::Kind::kFilter;
      narrowed.parts = {query, filter};
      count = Search(narrowed, {}).total;
    }
    result.push_back(count);
  }
  return result;
}

std::optional<Hit> View::Find(std::size_t share, DocumentId document) {
  return state_->OnOneState("Cannot read a document", [&]() -> std::optional<Hit> {
    if (share >= state_->Shares()) return std::nullopt;
    const Reader& reader = state_->At(share);
    auto stored = reader.Read(document);
    if (!stored || !state_->Sees(share, stored->place)) return std::nullopt;
    return HitOf(reader, share, document, std::move(*stored));
  });
}

std::optional<Hit> View::Find(std::size_t share, std::string_view path) {
  const auto entry = state_->OnOneState("Cannot find a path", [&]() -> std::optional<Entry> {
    if (share >= state_->Shares()) return std::nullopt;
    return state_->At(share).Resolve(path);
  });
  return entry ? Find(share, entry->document) : std::nullopt;
}

std::vector<std::string> View::Complete(const std::string& field, const std::string& prefix,
                                        std::size_t limit) {
  return state_->OnOneState("Cannot complete a word", [&] {
    std::vector<std::string> words;
    const std::string folded = Fold(prefix);
    if (folded.empty() || state_->Shares() == 0) return words;
    const Vocabulary vocabulary(state_->Readers());
    for (const Field& row : Fields()) {
      if (row.type != FieldType::kText || (!field.empty() && field != row.name)) continue;
      std::size_t found = 0;
      for (const auto& [word, documents] :
           vocabulary.MostFrequent(folded, row.prefix, limit * kCandidatesPerWord)) {
        if (found >= limit) break;
        if (!SomeDocumentHas(*state_, TermOf(row.prefix, word))) continue;
        ++found;
        if (std::find(words.begin(), words.end(), word) == words.end()) words.push_back(word);
      }
    }
    if (words.size() > limit) words.resize(limit);
    return words;
  });
}

std::vector<std::string> View::Correct(const std::string& word, std::size_t limit) {
  return state_->OnOneState("Cannot correct a word", [&] {
    std::vector<std::string> words;
    if (state_->Shares() == 0) return words;
    std::set<std::string> taken;
    std::size_t looked = 0;
    for (const Vocabulary::Near& near : Vocabulary(state_->Readers()).NearTo(Fold(word))) {
      if (words.size() >= limit || ++looked > limit * kCandidatesPerWord) break;
      if (taken.contains(near.word) || !SomeDocumentHas(*state_, near.term)) continue;
      taken.insert(near.word);
      words.push_back(near.word);
    }
    return words;
  });
}

std::uint64_t View::Documents() {
  std::uint64_t documents = 0;
  for (const Reader* reader : state_->Readers()) documents += reader->State().Documents();
  return documents;
}

}  // namespace maru::index
