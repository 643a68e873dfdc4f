#include "index/matches.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <stdexcept>
#include <utility>

namespace maru::index {
namespace {

constexpr std::size_t kWords = MatchBlock::kWords;
constexpr DocumentId kNone = std::numeric_limits<DocumentId>::max();
/// A term with so many times the documents of a set is looked up for each of the set.
constexpr std::uint64_t kMuchMore = 8;

constexpr std::size_t kPartsBetweenLooks = 64;
/// Where a block may have so many matches, its lengths are read together.
constexpr std::uint64_t kManyMatches = 16;
/// Terms whose weights are kept.
constexpr std::size_t kMostKnown = 16384;

using Set = std::array<Bits, kWords>;

/// Documents of a block, and how many they are.
struct Counted {
  Set set{};
  std::uint64_t count = 0;

  void Count() {
    count = 0;
    for (const Bits bits : set) count += CountBits(bits);
  }
};

}  // namespace

Weighing::Weighing(const Xapian::Database& all) : all_(all), documents_(all.get_doccount()) {
  const double average = all.get_average_length();
  if (average > 0) half_per_average_ = 0.5 / average;
}

double Weighing::Of(const std::string& term) const {
  const auto known = known_.find(term);
  if (known != known_.end()) return known->second;
  if (known_.size() >= kMostKnown) known_.clear();
  const double frequency = all_.get_termfreq(term);
  double rarity = (documents_ - frequency + 0.5) / (frequency + 0.5);
  if (rarity < 2) rarity = rarity * 0.5 + 1;
  return known_[term] = 2 * std::log(rarity);
}

/// Adds to blocks, which it is asked for in ascending order.
class Matches::Node {
 public:
  /// The block that is being filled in.
  struct Place {
    MatchBlock& block;
    const Weighing* weighing;
    /// Of each document; null where so few may match that each is asked for by itself.
    const std::uint32_t* lengths;
    /// What counts are set against in each; null where fewer may match than there are documents.
    const double* against;
    const std::function<void()>& look;
  };

  virtual ~Node() = default;
  /// No match that has not been asked for lies before it.
  virtual DocumentId Bound() const = 0;
  /// Of the number of matches, from above.
  virtual std::uint64_t Most() const = 0;
  /// Adds the matches to `set`, only those in `within` when that is given, and weights to the
  /// place's block, also to documents that do not match.
  virtual void Add(const Place& place, const Counted* within, Set& set) = 0;
};

namespace {

using Node = Matches::Node;
using NodePtr = std::unique_ptr<Node>;

/// What the two kinds of terms have in common.
class TermNode : public Node {
 public:
  /// Until then its documents get no weight.
  void Weigh(double weight) { weight_ = weight; }
  std::uint64_t Most() const override { return documents_; }

 protected:
  TermNode(std::uint64_t documents, DocumentId last)
      : documents_(documents), per_block_(documents * MatchBlock::kDocuments / (last + 1ull)) {}

  /// Whether the term is better looked up for each document of the set.
  bool IsMuchMoreThan(const Counted* within) const {
    return within && within->count * kMuchMore < per_block_;
  }
  static bool IsIn(const Counted* within, DocumentId offset) {
    return !within || within->set[offset / 64] >> (offset % 64) & 1;
  }

  /// Takes a document; `count` and `length` are asked for what they say when that is needed.
  template <class CountOf, class LengthOf>
  void Take(const Place& place, DocumentId offset, Set& set, CountOf&& count_of,
            LengthOf&& length_of) const {
    set[offset / 64] |= Bits{1} << (offset % 64);
    if (weight_ == 0) return;
    const double count = count_of();
    const double against =
        place.against
            ? place.against[offset]
            : place.weighing->Against(place.lengths ? place.lengths[offset] : length_of());
    place.block.weights[offset] += weight_ * count / (against + count);
  }

 private:
  std::uint64_t documents_, per_block_;
  double weight_ = 0;
};

/// A term whose postings the engine decodes.
class EngineTerm : public TermNode {
 public:
  /// An empty term is in every document.
  EngineTerm(const Xapian::Database& database, const Decoded& decoded, const std::string& term)
      : TermNode(term.empty() ? database.get_doccount() : database.get_termfreq(term),
                 database.get_lastdocid()),
        decoded_(decoded),
        term_(term),
        at_(database.postlist_begin(term)),
        end_(database.postlist_end(term)) {
    Look();
  }
  ~EngineTerm() override {
    if (!term_.empty()) decoded_.Walked(term_, steps_, Most());
  }

  DocumentId Bound() const override { return id_; }

  void Add(const Place& place, const Counted* within, Set& set) override {
    const DocumentId first = place.block.first;
    const auto take = [&](DocumentId offset) {
      Take(
          place, offset, set, [&] { return at_.get_wdf(); }, [&] { return at_.get_doclength(); });
    };
    if (id_ < first) SkipTo(first);
    if (IsMuchMoreThan(within)) {
      for (std::size_t i = 0; i < kWords; ++i) {
        ForEachBit(i, within->set[i], [&](DocumentId offset) {
          if (id_ < first + offset) SkipTo(first + offset);
          if (id_ == first + offset) take(offset);
        });
      }
      return;
    }
    for (; id_ - first < MatchBlock::kDocuments; Step()) {
      if (IsIn(within, id_ - first)) take(id_ - first);
    }
  }

 private:
  void Look() { id_ = at_ == end_ ? kNone : *at_; }
  void Step() {
    ++steps_;
    ++at_;
    Look();
  }
  void SkipTo(DocumentId id) {
    if (id_ == kNone) return;
    ++steps_;
    at_.skip_to(id);
    Look();
  }

  const Decoded& decoded_;
  const std::string term_;
  std::uint64_t steps_ = 0;
  Xapian::PostingIterator at_, end_;
  DocumentId id_ = kNone;
};

/// A term whose postings are kept decoded.
class KnownTerm : public TermNode {
 public:
  KnownTerm(const Xapian::Database& database, std::shared_ptr<const Postings> postings)
      : TermNode(postings->ids.size(), database.get_lastdocid()),
        database_(database),
        postings_(std::move(postings)) {}

  DocumentId Bound() const override {
    return at_ == postings_->ids.size() ? kNone : postings_->ids[at_];
  }

  void Add(const Place& place, const Counted* within, Set& set) override {
    const DocumentId first = place.block.first;
    const DocumentId* const ids = postings_->ids.data();
    const std::size_t end = postings_->ids.size();
    std::size_t at = at_;
    const auto skip_to = [&](DocumentId id) {
      if (at < end && ids[at] < id) {
        at = static_cast<std::size_t>(std::lower_bound(ids + at, ids + end, id) - ids);
      }
    };
    const auto take = [&] {
      Take(
          place, ids[at] - first, set, [&] { return postings_->counts[at]; },
          [&] { return database_.get_doclength(ids[at]); });
    };
    skip_to(first);
    if (IsMuchMoreThan(within)) {
      for (std::size_t i = 0; i < kWords; ++i) {
        ForEachBit(i, within->set[i], [&](DocumentId offset) {
          skip_to(first + offset);
          if (at < end && ids[at] == first + offset) take();
        });
      }
    } else {
      for (; at < end && ids[at] - first < MatchBlock::kDocuments; ++at) {
        if (IsIn(within, ids[at] - first)) take();
      }
    }
    at_ = at;
  }

 private:
  const Xapian::Database& database_;
  std::shared_ptr<const Postings> postings_;
  std::size_t at_ = 0;
};

class OrNode : public Node {
 public:
  explicit OrNode(std::vector<NodePtr> parts, std::vector<NodePtr> mixed)
      : parts_(std::move(parts)), mixed_(std::move(mixed)) {
    if (!mixed_.empty()) own_ = std::make_unique<MatchBlock>();
  }

  DocumentId Bound() const override {
    DocumentId bound = kNone;
    for (const auto* list : {&parts_, &mixed_}) {
      for (const NodePtr& part : *list) bound = std::min(bound, part->Bound());
    }
    return bound;
  }
  std::uint64_t Most() const override {
    std::uint64_t most = 0;
    for (const auto* list : {&parts_, &mixed_}) {
      for (const NodePtr& part : *list) most += part->Most();
    }
    return most;
  }
  void Add(const Place& place, const Counted* within, Set& set) override {
    for (std::size_t i = 0; i < parts_.size(); ++i) {
      if (i % kPartsBetweenLooks == kPartsBetweenLooks - 1) place.look();
      parts_[i]->Add(place, within, set);
    }
    for (const NodePtr& part : mixed_) {
      own_->Begin(place.block.first);
      part->Add({*own_, place.weighing, place.lengths, place.against, place.look}, within,
                own_->bits);
      for (std::size_t i = 0; i < kWords; ++i) {
        set[i] |= own_->bits[i];
        ForEachBit(i, own_->bits[i], [&](DocumentId offset) {
          place.block.weights[offset] += own_->weights[offset];
        });
      }
    }
  }

 private:
  std::vector<NodePtr> parts_;
  /// Those that weigh documents which they do not match.
  std::vector<NodePtr> mixed_;
  std::unique_ptr<MatchBlock> own_;
};

class AndNode : public Node {
 public:
  /// The rarest first, so that the others are asked about little.
  explicit AndNode(std::vector<NodePtr> parts) : parts_(std::move(parts)) {
    std::sort(parts_.begin(), parts_.end(),
              [](const NodePtr& a, const NodePtr& b) { return a->Most() < b->Most(); });
  }

  DocumentId Bound() const override {
    DocumentId bound = 0;
    for (const NodePtr& part : parts_) bound = std::max(bound, part->Bound());
    return bound;
  }
  std::uint64_t Most() const override { return parts_.front()->Most(); }
  void Add(const Place& place, const Counted* within, Set& set) override {
    Counted so_far;
    Set next;
    for (const NodePtr& part : parts_) {
      next.fill(0);
      part->Add(place, within, next);
      so_far.set = next;
      so_far.Count();
      within = &so_far;
      if (so_far.count == 0) return;
    }
    for (std::size_t i = 0; i < kWords; ++i) set[i] |= so_far.set[i];
  }

 private:
  std::vector<NodePtr> parts_;
};

class AndNotNode : public Node {
 public:
  AndNotNode(NodePtr wanted, NodePtr unwanted)
      : wanted_(std::move(wanted)), unwanted_(std::move(unwanted)) {}

  DocumentId Bound() const override { return wanted_->Bound(); }
  std::uint64_t Most() const override { return wanted_->Most(); }
  void Add(const Place& place, const Counted* within, Set& set) override {
    Counted wanted;
    Set unwanted{};
    wanted_->Add(place, within, wanted.set);
    wanted.Count();
    unwanted_->Add(place, &wanted, unwanted);
    for (std::size_t i = 0; i < kWords; ++i) set[i] |= wanted.set[i] & ~unwanted[i];
  }

 private:
  NodePtr wanted_, unwanted_;
};

class Builder {
 public:
  Builder(const Xapian::Database& database, const Decoded& decoded, const Weighing* weighing,
          const std::function<void()>& look)
      : database_(database), decoded_(decoded), weighing_(weighing), look_(look) {}

  NodePtr Build(const Plan& plan, double factor) const {
    factor *= plan.factor;
    switch (plan.kind) {
      case Plan::Kind::kNothing:
        return Any({}, factor);
      case Plan::Kind::kEverything:
        return std::make_unique<EngineTerm>(database_, decoded_, std::string());
      case Plan::Kind::kTerm:
        return Term(plan.term, factor);
      case Plan::Kind::kOr:
        return Any(plan.parts, factor);
      case Plan::Kind::kAnd:
        return All(plan.parts, factor, factor);
      case Plan::Kind::kFilter:
        return All(plan.parts, factor, 0);
      case Plan::Kind::kAndNot:
        return std::make_unique<AndNotNode>(Build(plan.parts.at(0), factor),
                                            Any({plan.parts.begin() + 1, plan.parts.end()}, 0));
      case Plan::Kind::kOther:
        break;
    }
    throw std::logic_error("a plan that terms do not answer");
  }

 private:
  NodePtr Term(const std::string& term, double factor) const {
    look_();
    std::unique_ptr<TermNode> node;
    if (auto postings = decoded_.Of(term, database_)) {
      node = std::make_unique<KnownTerm>(database_, std::move(postings));
    } else {
      node = std::make_unique<EngineTerm>(database_, decoded_, term);
    }
    if (weighing_ && factor != 0 && node->Most() > 0) node->Weigh(factor * weighing_->Of(term));
    return node;
  }
  NodePtr Any(const std::vector<Plan>& plans, double factor) const {
    std::vector<NodePtr> parts, mixed;
    for (const Plan& plan : plans) {
      const bool simple = plan.kind == Plan::Kind::kTerm || plan.kind == Plan::Kind::kOr;
      (simple || factor == 0 ? parts : mixed).push_back(Build(plan, factor));
    }
    return std::make_unique<OrNode>(std::move(parts), std::move(mixed));
  }
  NodePtr All(const std::vector<Plan>& plans, double first, double others) const {
    std::vector<NodePtr> parts;
    for (const Plan& plan : plans) parts.push_back(Build(plan, parts.empty() ? first : others));
    if (parts.empty()) return Any({}, 0);
    return std::make_unique<AndNode>(std::move(parts));
  }

  const Xapian::Database& database_;
  const Decoded& decoded_;
  const Weighing* weighing_;
  const std::function<void()>& look_;
};

}  // namespace

Matches::Matches(const Xapian::Database& database, const Decoded& decoded, const Plan& plan,
                 const Weighing* weighing, const std::function<void()>& look)
    : database_(database),
      decoded_(decoded),
      weighing_(weighing),
      look_(look),
      root_(Builder(database, decoded, weighing, look).Build(plan, 1)),
      last_(database.get_lastdocid()) {
  if (!weighing) return;
  many_ = root_->Most() * MatchBlock::kDocuments >= kManyMatches * (last_ + 1ull);
  if (root_->Most() > last_) against_.resize(MatchBlock::kDocuments);
}

Matches::~Matches() = default;

bool Matches::Next(MatchBlock& block) {
  const DocumentId bound = std::max(root_->Bound(), next_);
  if (bound > last_) return false;
  look_();
  block.Begin(bound / MatchBlock::kDocuments * MatchBlock::kDocuments);
  next_ = block.first + MatchBlock::kDocuments;
  const std::uint32_t* lengths =
      many_ ? decoded_.Lengths(block.first, database_) : decoded_.KnownLengths(block.first);
  if (!against_.empty()) {
    std::transform(lengths, lengths + MatchBlock::kDocuments, against_.begin(),
                   [&](std::uint32_t length) { return weighing_->Against(length); });
  }
  root_->Add({block, weighing_, lengths, against_.empty() ? nullptr : against_.data(), look_},
             nullptr, block.bits);
  return true;
}

}  // namespace maru::index
