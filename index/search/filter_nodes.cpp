#include <algorithm>

#include "index/search/node.h"
#include "index/search/phrase_finder.h"

namespace maru::index {
namespace {

constexpr unsigned kTextsBetweenPolls = 32;

/// Takes documents by what is known of each, without weight.
class FilterNode : public Node {
 public:
  DocumentId Bound() const override { return next_ > last_ ? kNoDocument : next_; }
  std::uint64_t Most() const override { return most_; }
  void Add(const Target& target, const CountedSet* within, BlockSet& set) override {
    const DocumentId first = target.block.first;
    next_ = first + kBlockDocuments;
    Filter(target, first, within ? within->set : Everything(first), set);
  }

 protected:
  /// `dear`: looks at each document, and is better asked after everything else.
  FilterNode(Reader& reader, bool dear)
      : reader_(reader),
        last_(reader.State().LastDocument()),
        most_(reader.State().Documents() + dear) {}

  /// Adds those of the documents `asked` that it takes to `set`.
  virtual void Filter(const Target& target, DocumentId first, const BlockSet& asked,
                      BlockSet& set) = 0;

  Reader& reader_;

 private:
  BlockSet Everything(DocumentId first) const {
    BlockSet all{};
    for (DocumentId offset = first == 0; offset < kBlockDocuments; ++offset) {
      if (first + offset <= last_) SetBit(all, offset);
    }
    return all;
  }

  const DocumentId last_;
  const std::uint64_t most_;
  DocumentId next_ = 0;
};

class RangeNode : public FilterNode {
 public:
  RangeNode(Reader& reader, const Plan& plan)
      : FilterNode(reader, false),
        column_(NumberColumn(plan.slot)),
        low_(plan.low),
        high_(plan.high) {}

 private:
  void Filter(const Target&, DocumentId first, const BlockSet& asked, BlockSet& set) override {
    reader_.ForEachValue(column_, first, asked, [&](DocumentId offset, double value) {
      if (value >= low_ && value <= high_) SetBit(set, offset);
    });
  }

  const SlotColumn<double> column_;
  const double low_, high_;
};

class UnderNode : public FilterNode {
 public:
  UnderNode(Reader& reader, const FolderSet& folder) : FilterNode(reader, false), folder_(folder) {}

 private:
  void Filter(const Target&, DocumentId first, const BlockSet& asked, BlockSet& set) override {
    reader_.ForEachValue(kPlaces, first, asked, [&](DocumentId offset, const Place& place) {
      const bool inside = place.parent < folder_.folders.size() && folder_.folders[place.parent];
      if (inside || first + offset == folder_.self) SetBit(set, offset);
    });
  }

  const FolderSet& folder_;
};

/// Looks into each of the documents that are seen: others could not be read, or tell by an error.
class LookNode : public FilterNode {
 protected:
  explicit LookNode(Sight& share) : FilterNode(share.Source(), true), share_(share) {}

  virtual bool Takes(DocumentId id) = 0;

 private:
  void Filter(const Target& target, DocumentId first, const BlockSet& asked,
              BlockSet& set) override {
    BlockSet seen = asked;
    share_.Screen(first, seen);
    ForEachBit(seen, [&](DocumentId offset) {
      if (++looks_ % kTextsBetweenPolls == 0) target.poll();
      if (Takes(first + offset)) SetBit(set, offset);
    });
  }

  Sight& share_;
  unsigned looks_ = 0;
};

/// Terms one behind the other by the positions that the engine has of them.
class PositionsNode : public LookNode {
 public:
  PositionsNode(Sight& share, const Plan& plan) : LookNode(share), terms_(plan.words) {}

 private:
  bool Takes(DocumentId id) override {
    std::vector<Xapian::termpos> begins = PositionsOf(id, terms_[0]);
    for (std::size_t i = 1; i < terms_.size() && !begins.empty(); ++i) {
      const std::vector<Xapian::termpos> here = PositionsOf(id, terms_[i]);
      std::erase_if(begins, [&](Xapian::termpos begin) {
        return !std::binary_search(here.begin(), here.end(),
                                   begin + static_cast<Xapian::termpos>(i));
      });
    }
    return !begins.empty();
  }
  std::vector<Xapian::termpos> PositionsOf(DocumentId id, const std::string& term) const {
    const Xapian::Database& database = reader_.Database();
    return {database.positionlist_begin(id, term), database.positionlist_end(id, term)};
  }

  const std::vector<std::string>& terms_;
};

/// A phrase, looked for in the documents' stored texts.
class TextNode : public LookNode {
 public:
  TextNode(Sight& share, const Plan& plan) : LookNode(share), finder_(plan.words) {}

 private:
  bool Takes(DocumentId id) override {
    return text_.Open(reader_.Texts(), reader_.ValueOf(kTexts, id)) && finder_.IsIn(text_);
  }

  PhraseFinder finder_;
  StoredText text_;
};

}  // namespace

NodePtr MakeRange(Reader& reader, const Plan& plan) {
  return std::make_unique<RangeNode>(reader, plan);
}

NodePtr MakeUnder(Reader& reader, const FolderSet& folder) {
  if (folder.whole) return MakeTerm(reader, {}, 0);
  if (folder.folders.empty() && folder.self == 0) return MakeOr({}, {});
  return std::make_unique<UnderNode>(reader, folder);
}

NodePtr MakePositions(Sight& share, const Plan& plan) {
  return std::make_unique<PositionsNode>(share, plan);
}

NodePtr MakeText(Sight& share, const Plan& plan) {
  return std::make_unique<TextNode>(share, plan);
}

}  // namespace maru::index
