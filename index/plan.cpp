#include "index/plan.h"

#include <algorithm>

namespace maru::index {
namespace {

using Op = Xapian::Query;

Xapian::Query Joined(Op::op op, const std::vector<Plan>& parts) {
  std::vector<Xapian::Query> queries;
  for (const Plan& part : parts) queries.push_back(part.ForEngine());
  return Xapian::Query(op, queries.begin(), queries.end());
}

Xapian::Query Unscaled(const Plan& plan) {
  switch (plan.kind) {
    case Plan::Kind::kNothing:
      return Op::MatchNothing;
    case Plan::Kind::kEverything:
      return Op::MatchAll;
    case Plan::Kind::kTerm:
      return Xapian::Query(plan.term);
    case Plan::Kind::kOther:
      return plan.other;
    case Plan::Kind::kOr:
      return Joined(Op::OP_OR, plan.parts);
    case Plan::Kind::kAnd:
      return Joined(Op::OP_AND, plan.parts);
    case Plan::Kind::kFilter:
      return Joined(Op::OP_FILTER, plan.parts);
    case Plan::Kind::kAndNot:
      return Joined(Op::OP_AND_NOT, plan.parts);
  }
  return Op::MatchNothing;
}

}  // namespace

bool Plan::IsOfTerms() const {
  return kind != Kind::kOther &&
         std::all_of(parts.begin(), parts.end(), [](const Plan& part) { return part.IsOfTerms(); });
}

Xapian::Query Plan::ForEngine() const {
  Xapian::Query query = Unscaled(*this);
  return factor == 1 ? query : Xapian::Query(Op::OP_SCALE_WEIGHT, query, factor);
}

}  // namespace maru::index
