#pragma once

#include <xapian.h>

#include <functional>
#include <optional>
#include <vector>

/// Exact totals. The engine finds the best few of many matches without looking at most of them; to
/// count them all it would weigh each. Here sets of documents are put together as bits.
namespace maru::index {

/// A set of documents of one database.
class DocumentSet {
 public:
  explicit DocumentSet(Xapian::docid last) : words_(last / 64 + 1) {}

  void Add(Xapian::docid id) {
    if (id / 64 < words_.size()) words_[id / 64] |= std::uint64_t{1} << (id % 64);
  }
  bool Has(Xapian::docid id) const {
    return id / 64 < words_.size() && words_[id / 64] >> (id % 64) & 1;
  }
  std::uint64_t Count() const;
  void Unite(const DocumentSet& other);
  /// Calls `use(id)` for each, ascending.
  template <class Use>
  void ForEach(Use&& use) const {
    for (std::size_t i = 0; i < words_.size(); ++i) {
      for (std::uint64_t left = words_[i]; left; left &= left - 1) {
        use(static_cast<Xapian::docid>(i * 64 + static_cast<unsigned>(__builtin_ctzll(left))));
      }
    }
  }

 private:
  std::vector<std::uint64_t> words_;
};

/// The documents that match; nothing for a query that terms alone do not answer (phrases, ranges,
/// sources). `look` is called now and then and may throw.
std::optional<DocumentSet> Matching(const Xapian::Database& database, const Xapian::Query& query,
                                    const std::function<void()>& look);

}  // namespace maru::index
