#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "index/search/bits.h"
#include "index/search/plan.h"
#include "index/search/scorer.h"
#include "index/search/sight.h"

/// What the Matcher is built of: each node of a plan adds its matches to blocks of documents.
namespace maru::index {

/// The matches among kBlockDocuments documents from `first` on, which is a multiple of that.
struct MatchBlock {
  DocumentId first = 0;
  BlockSet matches;
  /// By document less `first`; without meaning for one that does not match.
  std::array<double, kBlockDocuments> weights;

  void Begin(DocumentId id) {
    first = id;
    matches.fill(0);
    weights.fill(0);
  }
};

/// Documents of a block, and how many they are.
struct CountedSet {
  BlockSet set{};
  std::uint64_t count = 0;

  void Count() { count = CountBits(set); }
};

inline constexpr DocumentId kNoDocument = std::numeric_limits<DocumentId>::max();

class Node {
 public:
  /// The block that is being filled in.
  struct Target {
    MatchBlock& block;
    const Scorer* scorer;
    /// Of each document; null where so few may match that each is asked for by itself.
    const std::uint32_t* lengths;
    /// What counts are set against in each; null where fewer may match than there are documents.
    const double* against;
    /// Called now and then; throws when nobody waits any more.
    const std::function<void()>& poll;
  };

  virtual ~Node() = default;
  /// No match that has not been asked for lies before it.
  virtual DocumentId Bound() const = 0;
  /// Of the number of matches, from above.
  virtual std::uint64_t Most() const = 0;
  /// Adds the matches of the target's block to `set`, only those in `within` when that is given,
  /// and weights to the block, also to documents that do not match. Blocks come in ascending order.
  virtual void Add(const Target& target, const CountedSet* within, BlockSet& set) = 0;
};

using NodePtr = std::unique_ptr<Node>;

/// Documents with a term (empty: all documents); with a scorer's `weight` when that is not 0.
NodePtr MakeTerm(Reader& reader, const std::string& term, double weight);
/// Documents with a term that begins with `prefix`, as one term.
NodePtr MakePrefix(Sight& share, const std::string& prefix, double weight);
/// Any of `parts`; `mixed` are those that weigh documents which they do not match.
NodePtr MakeOr(std::vector<NodePtr> parts, std::vector<NodePtr> mixed);
NodePtr MakeAnd(std::vector<NodePtr> parts);
NodePtr MakeAndNot(NodePtr wanted, NodePtr unwanted);
/// Documents that a plan of kind kRange, kUnder (`folder` of this share), kPositions or kTextPhrase
/// takes; without weight. The last two look at each document that they are asked for and that is
/// seen: what is not, they leave out.
NodePtr MakeRange(Reader& reader, const Plan& plan);
NodePtr MakeUnder(Reader& reader, const FolderSet& folder);
NodePtr MakePositions(Sight& share, const Plan& plan);
NodePtr MakeText(Sight& share, const Plan& plan);

}  // namespace maru::index
