#include <algorithm>

#include "index/search/node.h"

namespace maru::index {
namespace {

/// A term with so many times the documents of a set is looked up for each of the set.
constexpr std::uint64_t kMuchMore = 8;

/// To a multiple of 2^-24: sums of such weights are exact up to 2^29, which no query reaches, so
/// that a score is the same in whatever order terms are gone through, which follows from how many
/// documents have them, seen or not.
double Rounded(double weight) {
  constexpr double kUnits = 3 << 27;
  return (weight + kUnits) - kUnits;
}

/// What the two kinds of terms have in common.
class TermNode : public Node {
 public:
  std::uint64_t Most() const override { return documents_; }

 protected:
  TermNode(std::uint64_t documents, DocumentId last, double weight)
      : documents_(documents),
        per_block_(documents * kBlockDocuments / (last + 1ull)),
        weight_(weight) {}

  /// Whether the term is better looked up for each document of the set.
  bool IsMuchMoreThan(const CountedSet* within) const {
    return within && within->count * kMuchMore < per_block_;
  }
  static bool IsIn(const CountedSet* within, DocumentId offset) {
    return !within || HasBit(within->set, offset);
  }

  /// Takes a document; `count` and `length` are asked for what they say when that is needed.
  template <class CountOf, class LengthOf>
  void Take(const Target& target, DocumentId offset, BlockSet& set, CountOf&& count_of,
            LengthOf&& length_of) const {
    SetBit(set, offset);
    if (weight_ == 0) return;
    const double count = count_of();
    const double against =
        target.against
            ? target.against[offset]
            : target.scorer->Against(target.lengths ? target.lengths[offset] : length_of());
    target.block.weights[offset] += Rounded(weight_ * count / (against + count));
  }

 private:
  std::uint64_t documents_, per_block_;
  double weight_;
};

/// A term whose postings the engine decodes.
class EngineTerm : public TermNode {
 public:
  EngineTerm(const Reader& reader, const std::string& term, double weight)
      : TermNode(term.empty() ? reader.State().Documents() : reader.Database().get_termfreq(term),
                 reader.State().LastDocument(), weight),
        reader_(reader),
        term_(term),
        at_(reader.Database().postlist_begin(term)),
        end_(reader.Database().postlist_end(term)) {
    Look();
  }
  ~EngineTerm() override {
    if (!term_.empty()) reader_.Walked(term_, steps_, Most());
  }

  DocumentId Bound() const override { return id_; }

  void Add(const Target& target, const CountedSet* within, BlockSet& set) override {
    const DocumentId first = target.block.first;
    const auto take = [&](DocumentId offset) {
      Take(
          target, offset, set, [&] { return at_.get_wdf(); }, [&] { return at_.get_doclength(); });
    };
    if (id_ < first) SkipTo(first);
    if (IsMuchMoreThan(within)) {
      ForEachBit(within->set, [&](DocumentId offset) {
        if (id_ < first + offset) SkipTo(first + offset);
        if (id_ == first + offset) take(offset);
      });
      return;
    }
    for (; id_ - first < kBlockDocuments; Step()) {
      if (IsIn(within, id_ - first)) take(id_ - first);
    }
  }

 private:
  void Look() { id_ = at_ == end_ ? kNoDocument : *at_; }
  void Step() {
    ++steps_;
    ++at_;
    Look();
  }
  void SkipTo(DocumentId id) {
    if (id_ == kNoDocument) return;
    ++steps_;
    at_.skip_to(id);
    Look();
  }

  const Reader& reader_;
  const std::string term_;
  std::uint64_t steps_ = 0;
  Xapian::PostingIterator at_, end_;
  DocumentId id_ = kNoDocument;
};

/// A term whose postings are kept decoded.
class KeptTerm : public TermNode {
 public:
  KeptTerm(const Reader& reader, std::shared_ptr<const Postings> postings, double weight)
      : TermNode(postings->ids.size(), reader.State().LastDocument(), weight),
        database_(reader.Database()),
        postings_(std::move(postings)) {}

  DocumentId Bound() const override {
    return at_ == postings_->ids.size() ? kNoDocument : postings_->ids[at_];
  }

  void Add(const Target& target, const CountedSet* within, BlockSet& set) override {
    const DocumentId first = target.block.first;
    const DocumentId* const ids = postings_->ids.data();
    const std::size_t end = postings_->ids.size();
    // A copy that the compiler may keep in a register.
    std::size_t at = at_;
    const auto skip_to = [&](DocumentId id) {
      if (at < end && ids[at] < id) {
        at = static_cast<std::size_t>(std::lower_bound(ids + at, ids + end, id) - ids);
      }
    };
    const auto take = [&] {
      Take(
          target, ids[at] - first, set, [&] { return postings_->counts[at]; },
          [&] { return database_.get_doclength(ids[at]); });
    };
    skip_to(first);
    if (IsMuchMoreThan(within)) {
      ForEachBit(within->set, [&](DocumentId offset) {
        skip_to(first + offset);
        if (at < end && ids[at] == first + offset) take();
      });
    } else {
      for (; at < end && ids[at] - first < kBlockDocuments; ++at) {
        if (IsIn(within, ids[at] - first)) take();
      }
    }
    at_ = at;
  }

 private:
  const Xapian::Database& database_;
  std::shared_ptr<const Postings> postings_;
  std::size_t at_ = 0;
};

}  // namespace

NodePtr MakeTerm(Reader& reader, const std::string& term, double weight) {
  if (!term.empty()) {
    if (auto postings = reader.PostingsOf(term)) {
      return std::make_unique<KeptTerm>(reader, std::move(postings), weight);
    }
  }
  return std::make_unique<EngineTerm>(reader, term, weight);
}

NodePtr MakePrefix(Sight& share, const std::string& prefix, double weight) {
  return std::make_unique<KeptTerm>(share.Source(), share.Beginning(prefix), weight);
}

}  // namespace maru::index
