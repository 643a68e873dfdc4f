#pragma once

#include <xapian.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
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

/// How long the documents of one database are at one state, as the weighing needs it; read when
/// asked for. Thread-safe.
class Lengths {
 public:
  /// `average` is that of all databases that are searched together, in words.
  Lengths(DocumentId last, double average)
      : average_(average),
        blocks_(last / MatchBlock::kDocuments + 1),
        read_(std::make_unique<std::once_flag[]>(blocks_.size())) {}

  double Average() const { return average_; }
  /// What the count of a term is set against, for each document of the block from `first` on;
  /// `database` is at that state.
  const double* Of(DocumentId first, const Xapian::Database& database) const;

 private:
  const double average_;
  mutable std::vector<std::vector<double>> blocks_;
  std::unique_ptr<std::once_flag[]> read_;
};

/// Weighs terms as the engine does by default: BM25 with k1 = 1, k3 = 1, b = 0.5 and lengths of at
/// least half the average. Robertson et al., "Okapi at TREC-3", 1994.
class Weighing {
 public:
  /// `all` are the databases that are searched together.
  explicit Weighing(const Xapian::Database& all) : all_(all), documents_(all.get_doccount()) {}

  /// What a document could at most get for the term.
  double Of(const std::string& term) const;

 private:
  const Xapian::Database& all_;
  double documents_;
};

/// The matches of a plan of terms in one database.
class Matches {
 public:
  /// Without `weighing` all weights are 0; with it `lengths` are the database's. All outlive this
  /// object.
  Matches(const Xapian::Database& database, const Plan& plan, const Weighing* weighing = nullptr,
          const Lengths* lengths = nullptr);
  ~Matches();

  /// Fills in the next block that may have matches; false when there are no more.
  bool Next(MatchBlock& block);

  class Node;

 private:
  const Xapian::Database& database_;
  const Lengths* lengths_;
  std::unique_ptr<Node> root_;
  DocumentId last_;
  /// The block to come begins here or later.
  DocumentId next_ = 0;
};

}  // namespace maru::index
