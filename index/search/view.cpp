#include "index/search/view.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <map>
#include <numeric>
#include <tuple>

#include "index/search/planner.h"
#include "index/search/ranking.h"
#include "index/search/view_state.h"
#include "index/search/vocabulary.h"
#include "index/store/fields.h"
#include "index/text/signature.h"
#include "index/text/tokenizer.h"

namespace maru::index {
namespace {

/// The weight that a boost of 1 adds: about that of a rare word.
constexpr double kBoostWeight = 10;

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

Plan PlanOf(View::State& state, const Query& query) {
  return Planner(state.Sights(), state.Ids()).PlanOf(query);
}

Hit HitOf(const Reader& reader, std::size_t share, DocumentId id, Stored stored) {
  const DirectoryTable& table = reader.State().Table();
  Hit hit;
  hit.share = share;
  hit.document = id;
  hit.alias = reader.State().Outside().Of(id);
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
    const Reader& reader = state.At(match.share).Source();
    // A match is there: looking whether it is would cost as much again.
    const auto document = reader.Database().get_document(match.document, Xapian::DOC_ASSUME_VALID);
    hits[rank] = HitOf(reader, match.share, match.document, Stored::Decode(document.get_data()));
    hits[rank].score = match.weight;
  }
  return hits;
}

/// Hands a block's matches to the ranking, with what they are ranked by: of those that cannot be
/// among the best no more is looked up than that takes.
class Ranker {
 public:
  Ranker(View::State& state, const SearchOptions& options)
      : state_(state),
        ranking_(options),
        slot_(SlotOf(options.sort_field)),
        none_(options.ascending ? HUGE_VAL : -HUGE_VAL),
        boost_(options.boosts.begin()),
        boosts_end_(options.boosts.end()) {}

  void Take(std::size_t share, const MatchBlock& block) {
    Reader& reader = state_.At(share).Source();
    BlockSet wanted{};
    const auto look = [&](DocumentId offset, double key) {
      const DocumentId id = block.first + offset;
      // A document without a value comes last.
      keys_[offset] = std::isnan(key) ? none_ : key;
      weights_[offset] = block.weights[offset] + BoostOf(share, id);
      if (ranking_.Wants({share, id, weights_[offset], keys_[offset], HUGE_VAL})) {
        SetBit(wanted, offset);
      }
    };
    if (slot_ < 0) {
      ForEachBit(block.matches, [&](DocumentId offset) { look(offset, 0); });
    } else {
      reader.ForEachValue(NumberColumn(static_cast<Xapian::valueno>(slot_)), block.first,
                          block.matches, look);
    }
    static const auto time_slot = static_cast<Xapian::valueno>(FindField(kModTime)->slot);
    reader.ForEachValue(
        NumberColumn(time_slot), block.first, wanted, [&](DocumentId offset, double time) {
          Take(reader, {share, block.first + offset, weights_[offset], keys_[offset], time});
        });
  }
  std::vector<Ranked> Page() { return ranking_.Page(); }

 private:
  void Take(Reader& reader, Ranked match) {
    if (!ranking_.Wants(match)) return;
    const DocumentId first = match.document / kBlockDocuments * kBlockDocuments;
    BlockSet one{};
    SetBit(one, match.document - first);
    reader.ForEachValue(kPlaces, first, one, [&](DocumentId, const Place& place) {
      match.order = HashPair(FolderHash(reader, match.share, place.parent), place.name_hash);
    });
    ranking_.Take(match);
  }
  std::uint64_t FolderHash(const Reader& reader, std::size_t share, DirectoryId folder) {
    const auto [known, added] = folders_.try_emplace({share, folder});
    if (added) known->second = HashWord(reader.State().Table().PathOf(folder));
    return known->second;
  }
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
  const double none_;
  Boost boost_;
  const Boost boosts_end_;
  std::array<double, kBlockDocuments> keys_, weights_;
  std::map<std::pair<std::size_t, DirectoryId>, std::uint64_t> folders_;
};

KindCounts CountKinds(View::State& state, const Query& query) {
  KindCounts counts{};
  state.ForEachSeen(PlanOf(state, query), nullptr, [&](std::size_t share, const MatchBlock& block) {
    state.At(share).Source().ForEachValue(kPlaces, block.first, block.matches,
                                          [&](DocumentId, const Place& place) {
                                            if (place.kind < kKinds) ++counts[place.kind];
                                          });
    return true;
  });
  return counts;
}

}  // namespace

View::View(std::unique_ptr<State> state) : state_(std::move(state)) {}
View::~View() = default;

SearchResult View::Search(const Query& query, const SearchOptions& options) {
  return state_->OnOneState("Cannot search", [&] {
    SearchResult result;
    if (state_->Shares() == 0) return result;
    const Plan plan = PlanOf(*state_, query);
    const Scorer scorer(state_->Sights());
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
    const Sight& sight = state_->At(share);
    auto stored = sight.Source().Read(document);
    if (!stored || !sight.Sees(stored->place)) return std::nullopt;
    return HitOf(sight.Source(), share, document, std::move(*stored));
  });
}

std::optional<Hit> View::FindAlias(std::size_t share, std::uint32_t alias) {
  if (share >= state_->Shares()) return std::nullopt;
  return Find(share, state_->At(share).State().Outside().DocumentOf(alias));
}

std::optional<Hit> View::Find(std::size_t share, std::string_view path) {
  const auto entry = state_->OnOneState("Cannot find a path", [&]() -> std::optional<Entry> {
    if (share >= state_->Shares()) return std::nullopt;
    return state_->At(share).Source().Resolve(path);
  });
  return entry ? Find(share, entry->document) : std::nullopt;
}

std::vector<std::string> View::Complete(const std::string& field, const std::string& prefix,
                                        std::size_t limit) {
  return state_->OnOneState("Cannot complete a word", [&] {
    std::vector<std::string> words;
    const std::string folded = Fold(prefix);
    if (folded.empty() || state_->Shares() == 0) return words;
    Vocabulary vocabulary(state_->Sights());
    for (const Field& row : Fields()) {
      if (row.type != FieldType::kText || (!field.empty() && field != row.name)) continue;
      for (std::string& word : vocabulary.Beginning(folded, row.prefix, limit)) {
        const bool taken = std::find(words.begin(), words.end(), word) != words.end();
        if (!taken && words.size() < limit) words.push_back(std::move(word));
      }
    }
    return words;
  });
}

std::vector<std::string> View::Correct(const std::string& word, std::size_t limit) {
  return state_->OnOneState("Cannot correct a word", [&] {
    if (state_->Shares() == 0) return std::vector<std::string>();
    return Vocabulary(state_->Sights()).Near(Fold(word), limit);
  });
}

std::uint64_t View::Documents() {
  std::uint64_t documents = 0;
  for (const Sight& sight : state_->Sights()) documents += sight.State().Documents();
  return documents;
}

}  // namespace maru::index
