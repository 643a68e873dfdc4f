#pragma once

#include <xapian.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "index/bits.h"
#include "index/decoded.h"
#include "index/plan.h"

/// What matches a plan of terms, all of it, in one pass over the postings: a total has to look at
/// every one, so the weights are had on the way, where the engine's own matcher would go over the
/// best ones once more.
namespace maru::index {

/// The matches among kDocuments documents from `first` on, which is a multiple of that.
struct MatchBlock {
  static constexpr std::size_t kDocuments = kBlockDocuments;
  static constexpr std::size_t kWords = kDocuments / 64;

  DocumentId first = 0;
  std::array<Bits, kWords> bits;
  /// By document less `first`; without meaning for one that does not match.
  std::array<double, kDocuments> weights;

  void Begin(DocumentId id) {
    first = id;
    bits.fill(0);
    weights.fill(0);
  }
};

/// Weighs terms as the engine does by default: BM25 with k1 = 1, k3 = 1, b = 0.5 and lengths of at
/// least half the average. Robertson et al., "Okapi at TREC-3", 1994. One thread.
class Weighing {
 public:
  /// `all` are the databases that are searched together, at one state; they outlive this object.
  explicit Weighing(const Xapian::Database& all);

  /// What a document could at most get for the term.
  double Of(const std::string& term) const;
  /// What the count of a term is set against in a document of so many words.
  double Against(std::uint32_t length) const {
    return std::max(length * half_per_average_ + 0.5, 0.75);
  }

 private:
  const Xapian::Database& all_;
  double documents_;
  double half_per_average_ = 0;
  mutable std::unordered_map<std::string, double> known_;
};

/// The matches of a plan of terms in one database.
class Matches {
 public:
  /// `decoded` is the database's. Without `weighing` all weights are 0. `look` is called now and
  /// then and may throw. All outlive this object.
  Matches(const Xapian::Database& database, const Decoded& decoded, const Plan& plan,
          const Weighing* weighing, const std::function<void()>& look);
  ~Matches();

  /// Fills in the next block that may have matches; false when there are no more.
  bool Next(MatchBlock& block);

  class Node;

 private:
  const Xapian::Database& database_;
  const Decoded& decoded_;
  const Weighing* weighing_;
  const std::function<void()>& look_;
  std::unique_ptr<Node> root_;
  DocumentId last_;
  /// Whether so many match that the lengths of a block are worth reading.
  bool many_ = false;
  /// Of the block, where most documents may match.
  std::vector<double> against_;
  /// The block to come begins here or later.
  DocumentId next_ = 0;
};

}  // namespace maru::index
