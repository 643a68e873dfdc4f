#pragma once

#include <xapian.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>

#include "index/bits.h"
#include "index/plan.h"

/// What matches a plan of terms, all of it, in one pass over the postings: a total has to look at
/// every one, so the weights are had on the way, where the engine's own matcher would go over the
/// best ones once more.
namespace maru::index {

/// The matches among kDocuments documents from `first` on, which is a multiple of that.
struct MatchBlock {
  static constexpr std::size_t kDocuments = 4096;
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

/// How many words each document of one database has, at one state; read when asked for.
/// Thread-safe.
class Lengths {
 public:
  explicit Lengths(DocumentId last)
      : blocks_(last / MatchBlock::kDocuments + 1), read_(blocks_.size()) {}

  /// Those of the block from `first` on; `database` is at that state.
  const std::uint32_t* Of(DocumentId first, const Xapian::Database& database) const;

 private:
  mutable std::mutex mutex_;
  mutable std::vector<std::vector<std::uint32_t>> blocks_;
  /// Which of them stand.
  mutable std::vector<std::atomic<bool>> read_;
};

/// Weighs terms as the engine does by default: BM25 with k1 = 1, k3 = 1, b = 0.5 and lengths of at
/// least half the average. Robertson et al., "Okapi at TREC-3", 1994. One thread.
class Weighing {
 public:
  /// `all` are the databases that are searched together.
  explicit Weighing(const Xapian::Database& all);

  /// What a document could at most get for the term.
  double Of(const std::string& term) const;
  /// What the count of a term is set against in a document of so many words.
  double Against(std::uint32_t length) const {
    return std::max(length * per_average_, 0.5) * 0.5 + 0.5;
  }

 private:
  const Xapian::Database& all_;
  double documents_;
  double per_average_ = 0;
  mutable std::unordered_map<std::string, double> known_;
};

/// The matches of a plan of terms in one database.
class Matches {
 public:
  /// Without `weighing` all weights are 0; with it `lengths` are the database's. `look` is called
  /// now and then and may throw. All outlive this object.
  Matches(const Xapian::Database& database, const Plan& plan, const Weighing* weighing,
          const Lengths* lengths, const std::function<void()>& look);
  ~Matches();

  /// Fills in the next block that may have matches; false when there are no more.
  bool Next(MatchBlock& block);

  class Node;

 private:
  const Xapian::Database& database_;
  const Weighing* weighing_;
  const Lengths* lengths_;
  const std::function<void()>& look_;
  std::unique_ptr<Node> root_;
  DocumentId last_;
  /// Of the block, where most documents may match.
  std::vector<double> against_;
  /// The block to come begins here or later.
  DocumentId next_ = 0;
};

}  // namespace maru::index
