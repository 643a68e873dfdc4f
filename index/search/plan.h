#pragma once

#include <cstddef>
#include <string>
#include <utility>
#include <vector>

#include "index/store/document.h"

namespace maru::index {

/// The documents under one folder of a share, and the folder's own.
struct FolderSet {
  /// Of all folders of the share, a bit an id.
  std::vector<bool> folders;
  DocumentId self = 0;
  /// Everything in the share.
  bool whole = false;
};

/// A query in the index's terms: what the Planner makes of a Query's tree, and the Matcher answers.
struct Plan {
  enum class Kind {
    kNothing,
    kEverything,
    kTerm,        // documents with `term`
    kPrefix,      // documents with a term that begins with `term`, as one
    kPositions,   // `words`, terms, one behind the other by the engine's positions
    kTextPhrase,  // `words` one behind the other in the stored text
    kRange,       // the number in value slot `slot` is in [low, high]
    kUnder,       // in the folder that `under` tells for each share
    kOr,          // any of the parts
    kAnd,         // all of the parts
    kFilter,      // all of the parts; the first tells the order
    kAndNot,      // the first without any of the others
  };

  Plan() = default;
  Plan(Kind what, std::vector<Plan> of) : kind(what), parts(std::move(of)) {}
  static Plan Term(std::string term) {
    Plan plan(Kind::kTerm, {});
    plan.term = std::move(term);
    return plan;
  }
  static Plan Prefix(std::string prefix) {
    Plan plan(Kind::kPrefix, {});
    plan.term = std::move(prefix);
    return plan;
  }
  static Plan Words(Kind what, std::vector<std::string> words) {
    Plan plan(what, {});
    plan.words = std::move(words);
    return plan;
  }
  static Plan Range(unsigned slot, double low, double high) {
    Plan plan(Kind::kRange, {});
    plan.slot = slot;
    plan.low = low;
    plan.high = high;
    return plan;
  }
  Plan Scaled(double by) && {
    factor *= by;
    return std::move(*this);
  }

  Kind kind = Kind::kNothing;
  std::string term;
  std::vector<std::string> words;
  unsigned slot = 0;
  double low = 0;
  double high = 0;
  std::vector<FolderSet> under;
  /// By which the weight of what matches is multiplied.
  double factor = 1;
  std::vector<Plan> parts;
};

}  // namespace maru::index
