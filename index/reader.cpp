#include <algorithm>
#include <cmath>
#include <numeric>
#include <tuple>

#include "index/engine.h"
#include "index/fields.h"
#include "index/fragments.h"
#include "index/matches.h"
#include "index/reader_impl.h"
#include "index/tokenizer.h"
#include "system/index_id.h"
#include "system/share_table.h"

namespace maru::index {
namespace {

/// The weight that a boost of 1 adds: about that of a rare word.
constexpr double kBoostWeight = 10;
constexpr std::size_t kFewChunks = 4;
constexpr std::size_t kFewWords = 16;

/// Sees what the eyes of each share see.
class EyesRule : public PlaceRule {
 public:
  explicit EyesRule(std::vector<std::shared_ptr<const Eyes>> eyes) : eyes_(std::move(eyes)) {}
  bool Judges(std::size_t share) const override { return share >= eyes_.size() || eyes_[share]; }
  bool Accepts(std::size_t share, DocumentId document, const PlaceOf& place) const override {
    return share < eyes_.size() && eyes_[share]->SeesDocument(document, place);
  }

 private:
  std::vector<std::shared_ptr<const Eyes>> eyes_;
};

/// Accepts what lies under one folder of some shares, and the folder's own document.
class FolderRule : public PlaceRule {
 public:
  struct Share {
    std::vector<bool> folders;
    DocumentId self = 0;
    bool whole = false;
  };
  explicit FolderRule(std::vector<Share> shares) : shares_(std::move(shares)) {}
  bool Judges(std::size_t share) const override {
    return share >= shares_.size() || !shares_[share].whole;
  }
  bool Accepts(std::size_t share, DocumentId document, const PlaceOf& place) const override {
    if (share >= shares_.size()) return false;
    const Share& here = shares_[share];
    if (document == here.self) return true;
    const DirectoryId parent = place().parent;
    return parent < here.folders.size() && here.folders[parent];
  }

 private:
  std::vector<Share> shares_;
};

/// Finds the entry with a path within a share, by the lists of entries.
std::optional<Entry> Resolve(const Xapian::Database& database, std::string_view path) {
  const std::string root = database.get_metadata(kRootKey);
  if (root.empty()) return std::nullopt;
  Decoder root_in(root);
  Entry at = DecodeEntry(root_in);
  while (!path.empty()) {
    if (path[0] == '/') {
      path.remove_prefix(1);
      continue;
    }
    const std::string_view name = path.substr(0, path.find('/'));
    path.remove_prefix(name.size());
    if (at.directory == 0) return std::nullopt;
    const std::string entries = database.get_metadata(EntriesKey(at.directory));
    bool found = false;
    for (Decoder in(entries); !found && !in.AtEnd();) {
      Entry entry = DecodeEntry(in);
      found = entry.name == name;
      if (found) at = std::move(entry);
    }
    if (!found) return std::nullopt;
  }
  return at;
}

/// The places of documents, asked for in ascending order.
class Places {
 public:
  explicit Places(const Xapian::Database& database)
      : at_(database.valuestream_begin(kPlaceSlot)), end_(database.valuestream_end(kPlaceSlot)) {}

  /// None for a document that is gone.
  Place Of(DocumentId id) {
    if (at_ != end_) at_.skip_to(id);
    return at_ != end_ && at_.get_docid() == id ? Place::Decode(*at_) : Place();
  }

 private:
  Xapian::ValueIterator at_, end_;
};

/// Counts matches by kind.
class KindSpy : public Xapian::MatchSpy {
 public:
  void operator()(const Xapian::Document& document, double) override {
    const Place place = Place::Decode(document.get_value(kPlaceSlot));
    if (place.kind < kKinds) ++counts[place.kind];
  }
  KindCounts counts{};
};

/// The kinds a filter keeps, when that is all it asks.
std::optional<std::array<bool, kKinds>> KindsKept(const Query& filter) {
  std::array<bool, kKinds> kinds{};
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

}  // namespace

EngineReader::~EngineReader() {
  if (indices_) give_back_(std::move(indices_));
}

void EngineReader::SetEyes(const Identity& who) {
  who_ = who;
  blind_ = false;
  eyes_.clear();
  for (std::size_t share = 0; share < indices_->Count(); ++share) {
    eyes_.push_back(who.unrestricted ? nullptr : indices_->EyesOf(share, who));
  }
}

bool EngineReader::Sees(std::size_t share, const Place& place) const {
  return !blind_ && (!eyes_[share] || eyes_[share]->Sees(place.parent, place.condition));
}

Xapian::Query EngineReader::Gated(const Xapian::Query& query) {
  if (blind_) return Xapian::Query::MatchNothing;
  auto* gate = new PlaceSource(std::make_shared<EyesRule>(eyes_), indices_->Numbers(), cancelled_);
  return Xapian::Query(Xapian::Query::OP_FILTER, query, Xapian::Query(gate->release()));
}

Xapian::Query EngineReader::Under(const std::string& full_path) {
  std::string_view wanted = full_path;
  while (wanted.ends_with('/')) wanted.remove_suffix(1);
  std::vector<FolderRule::Share> shares(indices_->Count());
  for (std::size_t i = 0; i < shares.size(); ++i) {
    const std::string& folder = indices_->Index(i).Folder();
    const std::string_view id = std::string_view(folder).substr(folder.rfind('/') + 1);
    const std::string share = std::string(kVolume) + "/" + std::string(ShareOfIndexId(id));
    shares[i].whole = share == wanted || share.starts_with(std::string(wanted) + "/");
    if (shares[i].whole || !wanted.starts_with(share + "/")) continue;
    const auto entry = Resolve(indices_->Database(i), wanted.substr(share.size()));
    if (!entry) continue;
    shares[i].self = entry->document;
    if (entry->directory) shares[i].folders = FoldersUnder(indices_->Table(i), entry->directory);
  }
  auto* source = new PlaceSource(std::make_shared<FolderRule>(std::move(shares)),
                                 indices_->Numbers(), nullptr);
  return Xapian::Query(Xapian::Query::OP_FILTER, Xapian::Query::MatchAll,
                       Xapian::Query(source->release()));
}

Xapian::Query EngineReader::Phrase(const std::vector<std::string>& words) {
  PhraseSource::Texts texts;
  for (std::size_t i = 0; i < indices_->Count(); ++i) texts.push_back(&indices_->Index(i).texts);
  auto* source = new PhraseSource(words, std::move(texts), indices_->Numbers(), cancelled_);
  return Xapian::Query(source->release());
}

Plan EngineReader::Compile(const Query& query, const SearchOptions& options) {
  cancelled_ = options.cancelled;
  return Compiler(indices_->All(), *this, indices_->Widened()).Compile(query);
}

void EngineReader::LookUp() const {
  if (cancelled_ && cancelled_()) throw Cancelled{};
}

template <class Use>
void EngineReader::ForEachSeen(const Plan& plan, const Weighing* weighing, Use&& use) const {
  if (blind_) return;
  const auto block = std::make_unique<MatchBlock>();
  const std::function<void()> look = [this] { LookUp(); };
  for (std::size_t share = 0; share < indices_->Count(); ++share) {
    const Xapian::Database& database = indices_->Database(share);
    const auto decoded = indices_->DecodedOf(share);
    Matches matches(database, *decoded, plan, weighing, look);
    Places places(database);
    const auto place = [&](DocumentId id) { return places.Of(id); };
    while (matches.Next(*block)) {
      for (std::size_t i = 0; i < MatchBlock::kWords; ++i) {
        const std::size_t word = block->first / 64 + i;
        const Bits bits = block->bits[i];
        if (bits)
          use(share, *block, i, eyes_[share] ? eyes_[share]->SeenOf(word, bits, place) : bits);
      }
    }
  }
}

std::uint64_t EngineReader::CountOf(const Plan& plan) const {
  std::uint64_t total = 0;
  ForEachSeen(plan, nullptr, [&](std::size_t, const MatchBlock&, std::size_t, Bits seen) {
    total += CountBits(seen);
  });
  return total;
}

KindCounts EngineReader::KindsOf(const Plan& plan) const {
  KindCounts counts{};
  std::vector<Places> places;
  for (std::size_t share = 0; share < indices_->Count(); ++share) {
    places.emplace_back(indices_->Database(share));
  }
  ForEachSeen(plan, nullptr,
              [&](std::size_t share, const MatchBlock& block, std::size_t i, Bits seen) {
                ForEachBit(block.first / 64 + i, seen, [&](DocumentId id) {
                  const Place place = places[share].Of(id);
                  if (place.kind < kKinds) ++counts[place.kind];
                });
              });
  return counts;
}

EngineReader::Found EngineReader::Best(const Plan& plan, const SearchOptions& options) const {
  Found found;
  const std::size_t wanted = std::size_t{options.from} + options.size;
  // Of equals the first document is the better one, as for the engine.
  const auto better = [](const Weighed& a, const Weighed& b) {
    return a.weight != b.weight ? a.weight > b.weight
                                : std::tie(a.document, a.share) < std::tie(b.document, b.share);
  };
  std::vector<Weighed>& best = found.best;
  const auto take = [&](const Weighed& match) {
    if (best.size() == wanted) {
      if (wanted == 0 || !better(match, best.front())) return;
      std::pop_heap(best.begin(), best.end(), better);
      best.pop_back();
    }
    best.push_back(match);
    std::push_heap(best.begin(), best.end(), better);
  };
  auto boost = options.boosts.begin();
  ForEachSeen(plan, &indices_->Weights(),
              [&](std::size_t share, const MatchBlock& block, std::size_t i, Bits seen) {
                found.total += CountBits(seen);
                ForEachBit(i, seen, [&](DocumentId offset) {
                  const DocumentId id = block.first + offset;
                  double weight = block.weights[offset];
                  const std::pair key(share, id);
                  while (boost != options.boosts.end() && boost->first < key) ++boost;
                  if (boost != options.boosts.end() && boost->first == key) {
                    weight += kBoostWeight * boost->second;
                  }
                  take({share, id, weight});
                });
              });
  std::sort_heap(best.begin(), best.end(), better);
  best.erase(best.begin(), best.begin() + static_cast<std::ptrdiff_t>(
                                              std::min<std::size_t>(options.from, best.size())));
  return found;
}

Xapian::Enquire EngineReader::Enquire(const Plan& plan, const SearchOptions& options) {
  Xapian::Query compiled = plan.ForEngine();
  if (!options.boosts.empty()) {
    auto boosts = std::make_shared<BoostSource::Boosts>(options.boosts);
    for (auto& [place, boost] : *boosts) boost *= kBoostWeight;
    auto* source = new BoostSource(std::move(boosts), indices_->Numbers());
    compiled =
        Xapian::Query(Xapian::Query::OP_AND_MAYBE, compiled, Xapian::Query(source->release()));
  }
  Xapian::Enquire enquire(indices_->All());
  enquire.set_query(Gated(compiled));
  if (options.sort_field.empty()) return enquire;
  const Field* field = FindField(options.sort_field);
  if (!field || field->slot < 0) {
    throw maruseeker::Error(maruseeker::kErrorBadParameter, "Cannot sort by " + options.sort_field);
  }
  enquire.set_sort_by_value_then_relevance(static_cast<Xapian::valueno>(field->slot),
                                           !options.ascending);
  return enquire;
}

Hit EngineReader::HitOf(std::size_t share, DocumentId id, Stored stored) const {
  const DirectoryTable& table = indices_->Table(share);
  Hit hit;
  hit.share = share;
  hit.document = id;
  hit.record = std::move(stored.record);
  hit.owner = table.Condition(stored.place.condition).uid;
  const DirectoryId parent = stored.place.parent;
  if (parent != 0) hit.path = table.PathOf(parent) + "/" + hit.record.name;
  return hit;
}

EngineReader::Found EngineReader::Enquired(const Plan& plan, const SearchOptions& options) {
  const bool of_terms = plan.IsOfTerms();
  const Xapian::MSet set =
      Enquire(plan, options)
          .get_mset(options.from, options.size, of_terms ? 0 : indices_->All().get_doccount());
  Found found;
  for (auto match = set.begin(); match != set.end(); ++match) {
    found.best.push_back(
        {indices_->ShareOf(*match), indices_->DocumentOf(*match), match.get_weight()});
  }
  found.total = of_terms ? CountOf(plan) : set.get_matches_estimated();
  return found;
}

/// Documents are read in their own order, in which the engine reads each block once.
std::vector<Hit> EngineReader::HitsOf(const std::vector<Weighed>& matches) {
  std::vector<std::size_t> order(matches.size());
  std::iota(order.begin(), order.end(), 0);
  std::sort(order.begin(), order.end(), [&](auto a, auto b) {
    return std::tie(matches[a].share, matches[a].document) <
           std::tie(matches[b].share, matches[b].document);
  });
  std::vector<Hit> hits(matches.size());
  for (const std::size_t rank : order) {
    const auto& [share, document, weight] = matches[rank];
    const Xapian::Database& database = indices_->Database(share);
    // A match is there: looking whether it is would cost as much again.
    std::string data = database.get_document(document, Xapian::DOC_ASSUME_VALID).get_data();
    hits[rank] = HitOf(share, document, Stored::Decode(data));
    hits[rank].score = weight;
    found_.insert_or_assign({share, document}, std::move(data));
  }
  return hits;
}

SearchResult EngineReader::Search(const Query& query, const SearchOptions& options) {
  return OnOneState("Cannot search", [&] {
    SearchResult result;
    if (indices_->Count() == 0) return result;
    const Plan plan = Compile(query, options);
    const bool by_weight = plan.IsOfTerms() && options.sort_field.empty();
    const Found found = by_weight ? Best(plan, options) : Enquired(plan, options);
    result.total = found.total;
    result.hits = HitsOf(found.best);
    return result;
  });
}

std::vector<std::uint64_t> EngineReader::Count(const Query& query,
                                               const std::vector<Query>& filters,
                                               const std::function<bool()>& cancelled) {
  SearchOptions options;
  options.cancelled = cancelled;
  std::vector<std::optional<std::array<bool, kKinds>>> kinds;
  for (const Query& filter : filters) kinds.push_back(KindsKept(filter));
  const auto counts = OnOneState("Cannot count", [&] {
    KindSpy spy;
    if (indices_->Count() == 0) return spy.counts;
    const Plan plan = Compile(query, options);
    if (plan.IsOfTerms()) return KindsOf(plan);
    Xapian::Enquire enquire = Enquire(plan, options);
    enquire.set_weighting_scheme(Xapian::BoolWeight());
    enquire.add_matchspy(&spy);
    enquire.get_mset(0, 0, indices_->All().get_doccount());
    return spy.counts;
  });
  std::vector<std::uint64_t> result;
  for (std::size_t i = 0; i < filters.size(); ++i) {
    std::uint64_t count = 0;
    for (std::size_t kind = 0; kinds[i] && kind < kKinds; ++kind) {
      if ((*kinds[i])[kind]) count += counts[kind];
    }
    if (!kinds[i]) {
      Query narrowed;
      narrowed.kind = Query::Kind::kFilter;
      narrowed.parts = {query, filters[i]};
      count = Search(narrowed, options).total;
    }
    result.push_back(count);
  }
  return result;
}

FragmentFinder& EngineReader::FinderOf(const Query& query, const std::string& field) {
  if (!(finders_query_ == query)) {
    finders_.clear();
    finders_query_ = query;
  }
  const auto known = finders_.find(field);
  if (known != finders_.end()) return known->second;
  auto groups = Compiler(indices_->All(), *this, indices_->Widened()).Marks(query);
  std::erase_if(groups, [&](const MarkGroup& group) { return group.field != field; });
  return finders_.emplace(field, FragmentFinder(std::move(groups))).first->second;
}

/// Which words of the groups the document has; of phrases: all.
PresentWords EngineReader::InDocument(std::size_t share, DocumentId document,
                                      const FragmentFinder& finder) const {
  const std::string prefix(FindField(kText)->prefix);
  const Xapian::Database& database = indices_->Database(share);
  const auto decoded = indices_->DecodedOf(share);
  const auto has_document = [&](const std::string& term) {
    if (const auto postings = decoded->Of(term, database)) {
      return std::binary_search(postings->ids.begin(), postings->ids.end(), document);
    }
    auto at = database.postlist_begin(term);
    if (at != database.postlist_end(term)) at.skip_to(document);
    return at != database.postlist_end(term) && *at == document;
  };
  PresentWords present = finder.AllWords();
  for (std::size_t i = 0; i < present.size(); ++i) {
    const std::vector<std::string>& words = finder.Groups()[i].words;
    if (finder.Groups()[i].phrase || words.size() == 1) continue;
    // Of many words, the document's list of terms tells sooner than theirs of documents.
    const bool few = words.size() <= kFewWords;
    auto here = few ? Xapian::TermIterator() : database.termlist_begin(document);
    const auto in_list = [&](const std::string& term) {
      if (here != database.termlist_end(document)) here.skip_to(term);
      return here != database.termlist_end(document) && *here == term;
    };
    std::vector<std::uint64_t> there;
    for (std::size_t word = 0; word < words.size(); ++word) {
      const std::string term = prefix + words[word];
      if (few ? has_document(term) : in_list(term)) there.push_back(present[i][word]);
    }
    present[i] = std::move(there);
  }
  return present;
}

std::vector<Fragment> EngineReader::Fragments(std::size_t share, DocumentId document,
                                              const Query& query, const FragmentOptions& options) {
  const Field* field = FindField(options.field);
  if (!field || field->type != FieldType::kText) {
    throw maruseeker::Error(maruseeker::kErrorBadParameter, "No fragments of " + options.field);
  }
  return OnOneState("Cannot read a text", [&]() -> std::vector<Fragment> {
    const auto stored = Read(share, document);
    if (!stored) return {};
    FragmentFinder& finder = FinderOf(query, options.field);
    if (finder.Groups().empty()) return {};
    if (options.field == kText) {
      if (!text_.Open(indices_->Index(share).texts, stored->text)) return {};
      // A few chunks are looked through faster than the index.
      const bool many = text_.Chunks() > kFewChunks;
      return finder.In(text_, many ? InDocument(share, document, finder) : finder.AllWords(),
                       options);
    }
    const Record& record = stored->record;
    std::string text = options.field == kName ? record.name : record.title;
    if (options.field == kAuthors) {
      for (const std::string& author : record.authors) text += (text.empty() ? "" : "; ") + author;
    }
    return finder.Whole(text);
  });
}

/// Nothing for a document that is gone or these eyes do not see.
std::optional<Stored> EngineReader::Read(std::size_t share, DocumentId document) const {
  if (share >= indices_->Count() || document == 0) return std::nullopt;
  try {
    const auto found = found_.find({share, document});
    Stored stored = Stored::Decode(
        found != found_.end() ? found->second
                              : indices_->Database(share).get_document(document).get_data());
    return Sees(share, stored.place) ? std::optional(std::move(stored)) : std::nullopt;
  } catch (const Xapian::DocNotFoundError&) {
    return std::nullopt;
  }
}

std::optional<Hit> EngineReader::Find(std::size_t share, DocumentId document) {
  return OnOneState("Cannot read a document", [&]() -> std::optional<Hit> {
    auto stored = Read(share, document);
    if (!stored) return std::nullopt;
    return HitOf(share, document, std::move(*stored));
  });
}

std::optional<Hit> EngineReader::Find(std::size_t share, std::string_view path) {
  const auto entry = OnOneState("Cannot find a path", [&]() -> std::optional<Entry> {
    if (share >= indices_->Count()) return std::nullopt;
    return Resolve(indices_->Database(share), path);
  });
  return entry ? Find(share, entry->document) : std::nullopt;
}

std::uint64_t EngineReader::Documents() const {
  return WithEngine("Cannot read the index", [&] {
    return indices_->Count() == 0 ? std::uint64_t{0} : indices_->All().get_doccount();
  });
}

}  // namespace maru::index
