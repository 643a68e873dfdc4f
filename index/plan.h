#pragma once

#include <xapian.h>

#include <string>
#include <utility>
#include <vector>

namespace maru::index {

/// A query in the index's terms: what a Compiler makes of a Query's tree.
struct Plan {
  enum class Kind {
    kNothing,
    kEverything,
    kTerm,    // documents with `term`
    kOther,   // `other`: a phrase, a range or a source, which only the engine's own matcher answers
    kOr,      // any of the parts
    kAnd,     // all of the parts
    kFilter,  // all of the parts; the first tells the order
    kAndNot,  // the first without any of the others
  };

  Plan() = default;
  Plan(Kind what, std::vector<Plan> of) : kind(what), parts(std::move(of)) {}
  static Plan Term(std::string term) {
    Plan plan(Kind::kTerm, {});
    plan.term = std::move(term);
    return plan;
  }
  static Plan Other(Xapian::Query query) {
    Plan plan(Kind::kOther, {});
    plan.other = std::move(query);
    return plan;
  }
  Plan Scaled(double by) && {
    factor *= by;
    return std::move(*this);
  }

  /// Whether there is no kOther in it.
  bool IsOfTerms() const;
  Xapian::Query ForEngine() const;

  Kind kind = Kind::kNothing;
  std::string term;
  Xapian::Query other;
  /// By which the weight of what matches is multiplied.
  double factor = 1;
  std::vector<Plan> parts;
};

}  // namespace maru::index
