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

/// The documents that have a term, ascending, and how often each has it.
struct Postings {
  std::vector<DocumentId> ids;
  std::vector<std::uint16_t> counts;
};

/// Lengths of documents, read when asked for, and postings of terms that are asked for again.
/// Thread-safe; every `database` given is at the one state.
class Decoded {
 public:
  /// `last`: the highest id.
  explicit Decoded(DocumentId last)
      : lengths_(last / kBlockDocuments + 1), read_(lengths_.size()) {}
  ~Decoded() { Forget(); }
  Decoded(const Decoded&) = delete;
  Decoded& operator=(const Decoded&) = delete;

  /// How many words each document has of the block from `first` on, a multiple of kBlockDocuments.
  const std::uint32_t* Lengths(DocumentId first, const Xapian::Database& database) const;
  /// The same when they have been read already, else null.
  const std::uint32_t* KnownLengths(DocumentId first) const {
    const std::size_t number = first / kBlockDocuments;
    return read_[number].load(std::memory_order_acquire) ? lengths_[number].data() : nullptr;
  }

  /// A term's postings: null when it has not been asked for before, and when they are too many. All
  /// that are kept, of all databases, take a bounded room.
  std::shared_ptr<const Postings> Of(const std::string& term,
                                     const Xapian::Database& database) const;

 private:
  std::shared_ptr<const Postings> Find(const std::string& term, bool& asked_before) const;
  void Keep(const std::string& term, const std::shared_ptr<const Postings>& postings) const;
  void Forget() const;

  mutable std::mutex mutex_;
  mutable std::vector<std::vector<std::uint32_t>> lengths_;
  /// Which of them stand.
  mutable std::vector<std::atomic<bool>> read_;
  /// Null for a term that was asked for once.
  mutable std::unordered_map<std::string, std::shared_ptr<const Postings>> postings_;
  mutable std::size_t kept_ = 0;
};

}  // namespace maru::index
