#pragma once

#include <xapian.h>

#include <algorithm>
#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "index/search/planner.h"
#include "index/search/ranking.h"
#include "index/search/share.h"
#include "index/search/sight.h"

namespace maru::index::test {

/// What the engine's own matcher answers over databases that hold just what an identity sees of
/// some indices' newest commits: all matches are asked for, and put in order here.
class Oracle {
 public:
  Oracle(const std::string& root, std::vector<std::string> ids, const Identity& who)
      : ids_(std::move(ids)) {
    sights_.reserve(ids_.size());
    for (const std::string& id : ids_) {
      shares_.push_back(std::make_unique<Share>(root + "/" + id, std::make_shared<Cache>(1 << 20)));
      const Share::Handle handle = shares_.back()->Take();
      Reader reader(handle.snapshot, handle.database, shares_.back()->Texts());
      auto eyes = who.unrestricted ? nullptr : Eyes::Of(reader, who);
      sights_.emplace_back(std::move(reader), std::move(eyes), [] {});
      all_.add_database(SeenOf(handle.database, sights_.back()));
    }
  }

  /// The page's matches, and the total.
  std::pair<std::vector<Ranked>, std::uint64_t> Search(const Query& query,
                                                       const SearchOptions& options) {
    Xapian::Enquire enquire(all_);
    enquire.set_query(QueryOf(Planner(sights_, ids_).PlanOf(query)));
    const Xapian::MSet set = enquire.get_mset(0, all_.get_doccount());
    std::vector<Ranked> found;
    for (auto match = set.begin(); match != set.end(); ++match) {
      const std::size_t share = (*match - 1) % ids_.size();
      const auto id = static_cast<DocumentId>((*match - 1) / ids_.size() + 1);
      double weight = match.get_weight();
      const auto boost = options.boosts.find({share, id});
      if (boost != options.boosts.end()) weight += 10 * boost->second;
      found.push_back({share, id, weight, KeyOf(match.get_document(), options)});
    }
    std::stable_sort(found.begin(), found.end(), [](const Ranked& a, const Ranked& b) {
      return std::tie(b.key, b.weight) < std::tie(a.key, a.weight);
    });
    const std::size_t total = found.size();
    found.erase(found.begin(),
                found.begin() + std::min<std::ptrdiff_t>(options.from, std::ssize(found)));
    if (found.size() > options.size) found.resize(options.size);
    return {found, total};
  }

 private:
  static Xapian::Database SeenOf(const Xapian::Database& from, const Sight& sight) {
    Xapian::WritableDatabase to(std::string(), Xapian::DB_BACKEND_INMEMORY);
    for (auto id = from.postlist_begin({}); id != from.postlist_end({}); ++id) {
      const Xapian::Document document = from.get_document(*id);
      if (sight.Sees(Place::Decode(document.get_value(kPlaceSlot)))) {
        to.replace_document(*id, document);
      }
    }
    return to;
  }

  static double KeyOf(const Xapian::Document& document, const SearchOptions& options) {
    if (options.sort_field.empty()) return 0;
    const double key = Xapian::sortable_unserialise(
        document.get_value(static_cast<Xapian::valueno>(FindField(options.sort_field)->slot)));
    return options.ascending ? -key : key;
  }

  static Xapian::Query QueryOf(const Plan& plan) {
    using Op = Xapian::Query;
    const auto joined = [&](Op::op op) {
      std::vector<Op> parts;
      for (const Plan& part : plan.parts) parts.push_back(QueryOf(part));
      return Op(op, parts.begin(), parts.end());
    };
    Op query;
    switch (plan.kind) {
      case Plan::Kind::kNothing:
        break;
      case Plan::Kind::kEverything:
        query = Op::MatchAll;
        break;
      case Plan::Kind::kTerm:
        query = Op(plan.term);
        break;
      case Plan::Kind::kPrefix:
        query = Op(Op::OP_WILDCARD, plan.term);
        break;
      case Plan::Kind::kPositions:
        query = Op(Op::OP_PHRASE, plan.words.begin(), plan.words.end(),
                   static_cast<Xapian::termcount>(plan.words.size()));
        break;
      case Plan::Kind::kRange:
        query = Op(Op::OP_VALUE_RANGE, plan.slot, Xapian::sortable_serialise(plan.low),
                   Xapian::sortable_serialise(plan.high));
        break;
      case Plan::Kind::kOr:
        query = joined(Op::OP_OR);
        break;
      case Plan::Kind::kAnd:
        query = joined(Op::OP_AND);
        break;
      case Plan::Kind::kFilter:
        query = joined(Op::OP_FILTER);
        break;
      case Plan::Kind::kAndNot:
        query = joined(Op::OP_AND_NOT);
        break;
      default:
        throw std::logic_error("a plan that the engine does not answer");
    }
    return plan.factor == 1 ? query : Op(Op::OP_SCALE_WEIGHT, query, plan.factor);
  }

  const std::vector<std::string> ids_;
  std::vector<std::unique_ptr<Share>> shares_;
  std::vector<Sight> sights_;
  Xapian::Database all_;
};

}  // namespace maru::index::test
