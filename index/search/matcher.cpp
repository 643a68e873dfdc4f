#include "index/search/matcher.h"

#include <algorithm>
#include <span>

namespace maru::index {
namespace {

/// Where a block may have so many matches, its lengths are read together.
constexpr std::uint64_t kManyMatches = 16;

class Builder {
 public:
  Builder(Sight& share, std::size_t number, const Scorer* scorer)
      : share_(share), reader_(share.Source()), number_(number), scorer_(scorer) {}

  /// `factor` is what the weights of the plan's parts are multiplied with; at 0 they have none.
  NodePtr Build(const Plan& plan, double factor) const {
    factor *= plan.factor;
    switch (plan.kind) {
      case Plan::Kind::kNothing:
        break;
      case Plan::Kind::kEverything:
        return MakeTerm(reader_, {}, 0);
      case Plan::Kind::kTerm:
        share_.Poll();
        return MakeTerm(reader_, plan.term, WeightOf(plan, factor));
      case Plan::Kind::kPrefix:
        return MakePrefix(share_, plan.term, WeightOf(plan, factor));
      case Plan::Kind::kPositions:
        return MakePositions(share_, plan);
      case Plan::Kind::kTextPhrase:
        return MakeText(share_, plan);
      case Plan::Kind::kRange:
        return MakeRange(reader_, plan);
      case Plan::Kind::kUnder:
        return MakeUnder(reader_, plan.under.at(number_));
      case Plan::Kind::kOr:
        return Any(plan.parts, factor);
      case Plan::Kind::kAnd:
        return All(plan.parts, factor, factor);
      case Plan::Kind::kFilter:
        return All(plan.parts, factor, 0);
      case Plan::Kind::kAndNot:
        return MakeAndNot(Build(plan.parts.at(0), factor),
                          Any(std::span(plan.parts).subspan(1), 0));
    }
    return MakeOr({}, {});
  }

 private:
  double WeightOf(const Plan& plan, double factor) const {
    if (!scorer_ || factor == 0) return 0;
    return factor * scorer_->WeightOf(plan.term, plan.kind == Plan::Kind::kPrefix);
  }
  NodePtr Any(std::span<const Plan> plans, double factor) const {
    std::vector<NodePtr> parts, mixed;
    for (const Plan& plan : plans) {
      const bool simple = plan.kind == Plan::Kind::kTerm || plan.kind == Plan::Kind::kPrefix ||
                          plan.kind == Plan::Kind::kOr;
      (simple || factor == 0 ? parts : mixed).push_back(Build(plan, factor));
    }
    return MakeOr(std::move(parts), std::move(mixed));
  }
  NodePtr All(const std::vector<Plan>& plans, double first, double others) const {
    std::vector<NodePtr> parts;
    for (const Plan& plan : plans) parts.push_back(Build(plan, parts.empty() ? first : others));
    return parts.empty() ? MakeOr({}, {}) : MakeAnd(std::move(parts));
  }

  Sight& share_;
  Reader& reader_;
  const std::size_t number_;
  const Scorer* scorer_;
};

}  // namespace

Matcher::Matcher(Sight& share, std::size_t number, const Plan& plan, const Scorer* scorer)
    : share_(share),
      scorer_(scorer),
      root_(Builder(share, number, scorer).Build(plan, 1)),
      last_(share.State().LastDocument()),
      per_block_(root_->Most() * kBlockDocuments / (last_ + 1ull)) {
  if (scorer && root_->Most() > last_) against_.resize(kBlockDocuments);
}

bool Matcher::Next(MatchBlock& block) {
  const DocumentId bound = std::max(root_->Bound(), next_);
  if (bound > last_) return false;
  share_.Poll();
  block.Begin(bound / kBlockDocuments * kBlockDocuments);
  next_ = block.first + kBlockDocuments;
  std::shared_ptr<const ColumnBlock<std::uint32_t>> lengths;
  if (scorer_) {
    const bool many = per_block_ >= kManyMatches || !against_.empty();
    lengths = share_.Source().Block(LengthColumn(), block.first, many ? kBlockPrice : 0);
  }
  if (!against_.empty()) {
    std::transform(lengths->begin(), lengths->end(), against_.begin(),
                   [&](std::uint32_t length) { return scorer_->Against(length); });
  }
  root_->Add({block, scorer_, lengths ? lengths->data() : nullptr,
              against_.empty() ? nullptr : against_.data(), share_.Poller()},
             nullptr, block.matches);
  return true;
}

}  // namespace maru::index
