#include "index/count.h"

#include <algorithm>
#include <optional>
#include <stdexcept>
#include <vector>

namespace maru::index {
namespace {

using Op = Xapian::Query;

/// A term with so many times the documents of a set is looked up for each of the set.
constexpr std::uint64_t kMuchMore = 8;
constexpr unsigned kPostingsBetweenLooks = 4096;

/// A set that the answer lies in.
struct Within {
  explicit Within(DocumentSet documents) : set(std::move(documents)), count(set.Count()) {}
  DocumentSet set;
  std::uint64_t count;
};

class Evaluator {
 public:
  Evaluator(const Xapian::Database& database, const std::function<void()>& look)
      : database_(database), look_(look), last_(database.get_lastdocid()) {}

  /// Adds what matches, of `within` when that is given, to `set`.
  void Add(const Xapian::Query& query, const Within* within, DocumentSet& set) {
    switch (query.get_type()) {
      case Op::LEAF_TERM:
        return AddTerm(*query.get_terms_begin(), within, set);
      case Op::LEAF_MATCH_ALL:
        return AddTerm({}, within, set);
      case Op::LEAF_MATCH_NOTHING:
        return;
      case Op::OP_SCALE_WEIGHT:
      case Op::OP_AND_MAYBE:
        return Add(query.get_subquery(0), within, set);
      case Op::OP_OR:
        for (std::size_t i = 0; i < query.get_num_subqueries(); ++i) {
          Add(query.get_subquery(i), within, set);
        }
        return;
      case Op::OP_AND:
      case Op::OP_FILTER:
        return AddAll(query, within, set);
      case Op::OP_AND_NOT:
        return AddWithout(query, within, set);
      default:
        throw std::logic_error("a query that terms do not answer");
    }
  }

 private:
  void AddTerm(const std::string& term, const Within* within, DocumentSet& set) {
    auto posting = database_.postlist_begin(term);
    const auto end = database_.postlist_end(term);
    if (posting == end) return;
    if (within && within->count * kMuchMore < Frequency(term)) {
      within->set.ForEach([&](Xapian::docid id) {
        if (posting == end) return;
        posting.skip_to(id);
        if (posting != end && *posting == id) set.Add(id);
      });
      return;
    }
    for (; posting != end; ++posting) {
      if (++postings_ % kPostingsBetweenLooks == 0) look_();
      if (!within || within->set.Has(*posting)) set.Add(*posting);
    }
  }

  /// The rarest first, so that the others are asked about little.
  void AddAll(const Xapian::Query& query, const Within* within, DocumentSet& set) {
    std::vector<std::pair<std::uint64_t, std::size_t>> order;
    for (std::size_t i = 0; i < query.get_num_subqueries(); ++i) {
      order.emplace_back(Bound(query.get_subquery(i)), i);
    }
    std::sort(order.begin(), order.end());
    std::optional<Within> so_far;
    for (const auto& [bound, i] : order) {
      DocumentSet next(last_);
      Add(query.get_subquery(i), so_far ? &*so_far : within, next);
      so_far.emplace(std::move(next));
    }
    if (so_far) set.Unite(so_far->set);
  }

  void AddWithout(const Xapian::Query& query, const Within* within, DocumentSet& set) {
    DocumentSet left(last_);
    Add(query.get_subquery(0), within, left);
    const Within wanted(std::move(left));
    DocumentSet unwanted(last_);
    for (std::size_t i = 1; i < query.get_num_subqueries(); ++i) {
      Add(query.get_subquery(i), &wanted, unwanted);
    }
    wanted.set.ForEach([&](Xapian::docid id) {
      if (!unwanted.Has(id)) set.Add(id);
    });
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

bool IsOfTerms(const Xapian::Query& query) {
  switch (query.get_type()) {
    case Op::LEAF_TERM:
    case Op::LEAF_MATCH_ALL:
    case Op::LEAF_MATCH_NOTHING:
    case Op::OP_SCALE_WEIGHT:
    case Op::OP_AND_MAYBE:
    case Op::OP_OR:
    case Op::OP_AND:
    case Op::OP_FILTER:
    case Op::OP_AND_NOT:
      break;
    default:
      return false;
  }
  for (std::size_t i = 0; i < query.get_num_subqueries(); ++i) {
    if (!IsOfTerms(query.get_subquery(i))) return false;
  }
  return true;
}

DocumentSet Matching(const Xapian::Database& database, const Xapian::Query& query,
                     const std::function<void()>& look) {
  DocumentSet set(database.get_lastdocid());
  Evaluator(database, look).Add(query, nullptr, set);
  return set;
}

}  // namespace maru::index
