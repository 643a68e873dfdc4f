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
  /// `share` is the reader's number in the plan. Without `scorer` all weights are 0. `poll` is
  /// called now and then and may throw. All outlive this object.
  Matcher(Reader& reader, std::size_t share, const Plan& plan, const Scorer* scorer,
          const std::function<void()>& poll);

  /// Fills in the next block that may have matches; false when there are no more.
  bool Next(MatchBlock& block);

 private:
  Reader& reader_;
  const Scorer* scorer_;
  const std::function<void()>& poll_;
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
