#pragma once

#include <functional>
#include <memory>
#include <vector>

#include "index/search/node.h"

namespace maru::index {

/// What matches a plan in one share, all of it, in one pass over the postings: a total has to look
/// at every one, so the weights are had on the way. One thread.
class Matcher {
 public:
  /// `number` is the share's in the plan. Without `scorer` all weights are 0. All
  /// outlive this object.
  Matcher(Sight& share, std::size_t number, const Plan& plan, const Scorer* scorer);

  /// Fills in the next block that may have matches; false when there are no more.
  bool Next(MatchBlock& block);

 private:
  Sight& share_;
  const Scorer* scorer_;
  NodePtr root_;
  DocumentId last_;
  /// Matches of a block, from above, on the average.
  std::uint64_t per_block_;
  /// Of the block, where most documents may match.
  std::vector<double> against_;
  /// The block to come begins here or later.
  DocumentId next_ = 0;
};

}  // namespace maru::index
