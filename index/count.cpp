#include "index/count.h"

#include <algorithm>
#include <bit>

namespace maru::index {
namespace {

using Op = Xapian::Query;

/// A term with so many times the documents of a set is looked up for each of the set.
constexpr std::uint64_t kMuchMore = 8;
constexpr unsigned kPostingsBetweenLooks = 4096;

/// Thrown by a query that terms do not answer.
struct NotByTerms {};

class Evaluator {
 public:
  Evaluator(const Xapian::Database& database, const std::function<void()>& look)
      : database_(database), look_(look), last_(database.get_lastdocid()) {}

  /// What matches, of `within` when that is given.
  DocumentSet Evaluate(const Xapian::Query& query, const DocumentSet* within) {
    switch (query.get_type()) {
      case Op::LEAF_TERM:
        return Term(*query.get_terms_begin(), within);
      case Op::LEAF_MATCH_ALL:
        return Term({}, within);
      case Op::LEAF_MATCH_NOTHING:
        return DocumentSet(last_);
      case Op::OP_SCALE_WEIGHT:
      case Op::OP_AND_MAYBE:
        return Evaluate(query.get_subquery(0), within);
      case Op::OP_OR:
        return Any(query, within);
      case Op::OP_AND:
      case Op::OP_FILTER:
        return All(query, within);
      case Op::OP_AND_NOT:
        return Without(query, within);
      default:
        throw NotByTerms{};
    }
  }

 private:
  DocumentSet Term(const std::string& term, const DocumentSet* within) {
    DocumentSet set(last_);
    auto posting = database_.postlist_begin(term);
    const auto end = database_.postlist_end(term);
    if (within && within->Count() * kMuchMore < Frequency(term)) {
      within->ForEach([&](Xapian::docid id) {
        if (posting == end) return;
        posting.skip_to(id);
        if (posting != end && *posting == id) set.Add(id);
      });
      return set;
    }
    for (; posting != end; ++posting) {
      if (++postings_ % kPostingsBetweenLooks == 0) look_();
      set.Add(*posting);
    }
    if (within) set.Intersect(*within);
    return set;
  }

  DocumentSet Any(const Xapian::Query& query, const DocumentSet* within) {
    DocumentSet set(last_);
    for (std::size_t i = 0; i < query.get_num_subqueries(); ++i) {
      set.Unite(Evaluate(query.get_subquery(i), within));
    }
    return set;
  }

  /// The rarest first, so that the others are asked about little.
  DocumentSet All(const Xapian::Query& query, const DocumentSet* within) {
    std::vector<std::pair<std::uint64_t, std::size_t>> order;
    for (std::size_t i = 0; i < query.get_num_subqueries(); ++i) {
      order.emplace_back(Bound(query.get_subquery(i)), i);
    }
    std::sort(order.begin(), order.end());
    std::optional<DocumentSet> set;
    for (const auto& [bound, i] : order) {
      set = Evaluate(query.get_subquery(i), set ? &*set : within);
    }
    return set ? std::move(*set) : DocumentSet(last_);
  }

  DocumentSet Without(const Xapian::Query& query, const DocumentSet* within) {
    DocumentSet set = Evaluate(query.get_subquery(0), within);
    for (std::size_t i = 1; i < query.get_num_subqueries(); ++i) {
      set.Subtract(Evaluate(query.get_subquery(i), &set));
    }
    return set;
  }

  std::uint64_t Frequency(const std::string& term) const {
    return term.empty() ? database_.get_doccount() : database_.get_termfreq(term);
  }

  /// Of the number of matches, from above.
  std::uint64_t Bound(const Xapian::Query& query) const {
    if (query.get_type() == Op::LEAF_TERM) return Frequency(*query.get_terms_begin());
    if (query.get_type() == Op::LEAF_MATCH_ALL) return Frequency({});
    std::uint64_t sum = 0;
    for (std::size_t i = 0; i < query.get_num_subqueries(); ++i) {
      sum += Bound(query.get_subquery(i));
    }
    return sum;
  }

  const Xapian::Database& database_;
  const std::function<void()>& look_;
  Xapian::docid last_;
  unsigned postings_ = 0;
};

}  // namespace

std::uint64_t DocumentSet::Count() const {
  std::uint64_t count = 0;
  for (const std::uint64_t word : words_) count += static_cast<std::uint64_t>(std::popcount(word));
  return count;
}

void DocumentSet::Unite(const DocumentSet& other) {
  for (std::size_t i = 0; i < words_.size(); ++i) words_[i] |= other.words_[i];
}

void DocumentSet::Intersect(const DocumentSet& other) {
  for (std::size_t i = 0; i < words_.size(); ++i) words_[i] &= other.words_[i];
}

void DocumentSet::Subtract(const DocumentSet& other) {
  for (std::size_t i = 0; i < words_.size(); ++i) words_[i] &= ~other.words_[i];
}

std::optional<DocumentSet> Matching(const Xapian::Database& database, const Xapian::Query& query,
                                    const std::function<void()>& look) {
  try {
    return Evaluator(database, look).Evaluate(query, nullptr);
  } catch (const NotByTerms&) {
    return std::nullopt;
  }
}

}  // namespace maru::index
