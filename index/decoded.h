#pragma once

#include <xapian.h>

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>

#include "index/bits.h"

/// What is kept of one database at one state, so that searches need not decode it again and again.
namespace maru::index {

/// Documents that are gone through together, and whose lengths are read together.
constexpr std::size_t kBlockDocuments = 4096;

/// The documents that have a term, ascending, and how often each has it. All that there are in the
/// process, in use or kept, share a bounded room.
class Postings {
 public:
  /// Null when there is no room.
  static std::shared_ptr<const Postings> Of(const std::string& term,
                                            const Xapian::Database& database);
  ~Postings();
  Postings(const Postings&) = delete;
  Postings& operator=(const Postings&) = delete;

  std::vector<DocumentId> ids;
  std::vector<std::uint32_t> counts;

 private:
  Postings() = default;

  std::size_t room_ = 0;
};

/// Lengths of documents, read when asked for, and postings of terms that the engine has decoded
/// once. Thread-safe; every `database` given is at the one state.
class Decoded {
 public:
  /// `last`: the highest id.
  explicit Decoded(DocumentId last);
  ~Decoded();
  Decoded(const Decoded&) = delete;
  Decoded& operator=(const Decoded&) = delete;

  /// How many words each document has of the block from `first` on, a multiple of kBlockDocuments.
  const std::uint32_t* Lengths(DocumentId first, const Xapian::Database& database) const;
  /// The same when they have been read already, else null.
  const std::uint32_t* KnownLengths(DocumentId first) const {
    const std::size_t number = first / kBlockDocuments;
    return read_[number].load(std::memory_order_acquire) ? lengths_[number].data() : nullptr;
  }

  /// A term's postings; null as long as the engine has walked over fewer than there are, and when
  /// they are too many. When there is no room all that is kept, of all databases, is forgotten.
  std::shared_ptr<const Postings> Of(const std::string& term,
                                     const Xapian::Database& database) const;
  /// To be told of how many of a term's postings, of `all` of them, the engine has walked over.
  void Walked(const std::string& term, std::uint64_t steps, std::uint64_t all) const noexcept;

 private:
  struct Row {
    std::shared_ptr<const Postings> postings;
    /// To walk over before it is worth keeping them.
    std::int64_t left;
  };
  struct Everybody;

  static Everybody& All();
  static void MakeRoom(bool all);

  mutable std::mutex mutex_;
  mutable std::vector<std::vector<std::uint32_t>> lengths_;
  /// Which of them stand.
  mutable std::vector<std::atomic<bool>> read_;
  /// With Everybody's lock.
  mutable std::unordered_map<std::string, Row> rows_;
};

}  // namespace maru::index
