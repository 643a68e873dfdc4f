#pragma once

#include <xapian.h>

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "index/search/bits.h"
#include "index/search/columns.h"
#include "index/search/snapshot.h"
#include "index/store/texts.h"

namespace maru::index {

/// The documents that have a term, ascending, and how often each has it.
struct Postings {
  std::vector<DocumentId> ids;
  std::vector<std::uint32_t> counts;
};

template <>
struct BytesOf<Postings> {
  std::size_t operator()(const Postings& postings) const {
    return postings.ids.size() * (sizeof(DocumentId) + sizeof(std::uint32_t));
  }
};

/// One share's index at one commit, as one thread reads it: what is kept of the snapshot when there
/// is something, else the engine. Throws the engine's errors.
class Reader {
 public:
  /// `database` is at the snapshot's commit.
  Reader(std::shared_ptr<const Snapshot> snapshot, Xapian::Database database, TextReader& texts)
      : snapshot_(std::move(snapshot)), database_(std::move(database)), texts_(&texts) {}

  const Snapshot& State() const { return *snapshot_; }
  const Xapian::Database& Database() const { return database_; }
  TextReader& Texts() const { return *texts_; }

  /// A term's postings when they are kept, or worth it now; else null.
  std::shared_ptr<const Postings> PostingsOf(const std::string& term) const;
  /// The same, worth it or not.
  std::shared_ptr<const Postings> AllPostingsOf(const std::string& term) const;
  /// Those of all terms that begin with `prefix`, as if they were one term. Where they are not kept
  /// that takes a look at each posting of each of these terms; `poll` is called meanwhile.
  std::shared_ptr<const Postings> Beginning(const std::string& prefix,
                                            const std::function<void()>& poll) const;
  /// How many documents have the term, whoever may see them.
  std::uint64_t FrequencyOf(const std::string& term) const;
  /// To be told of how many of a term's postings, of `all` of them, the engine has walked over:
  /// when it has walked over as many as there are, they are worth being kept.
  void Walked(const std::string& term, std::uint64_t steps, std::uint64_t all) const noexcept;

  /// The block of a column from document `first` on, a multiple of kBlockDocuments, when it is kept
  /// or worth it because `wanted` of it are asked for; else null.
  template <class Column>
  std::shared_ptr<const ColumnBlock<typename Column::Value>> Block(const Column& column,
                                                                   DocumentId first,
                                                                   std::uint64_t wanted) const;
  /// One value of a slot; cheapest in ascending order.
  template <class Value>
  Value ValueOf(const SlotColumn<Value>& column, DocumentId id);
  /// Calls `use(offset, value)` for each document of a set of the block from `first` on.
  template <class Value, class Use>
  void ForEachValue(const SlotColumn<Value>& column, DocumentId first, const BlockSet& set,
                    Use&& use);

  /// What the engine has of a document; none when it is gone.
  std::optional<Stored> Read(DocumentId id) const;
  /// The entry with a path within the share ("" is the share itself).
  std::optional<Entry> Resolve(std::string_view path) const;

 private:
  struct Cursor {
    Xapian::ValueIterator at, end;
    DocumentId asked = 0;
  };

  std::shared_ptr<const Postings> KeptPostings(const std::string& term) const;
  std::shared_ptr<const Postings> Decode(const std::string& term) const;

  std::shared_ptr<const Snapshot> snapshot_;
  Xapian::Database database_;
  TextReader* texts_;
  std::map<Xapian::valueno, Cursor> cursors_;
};

/// Reading so many values one by one costs as much as reading a block.
inline constexpr std::uint64_t kBlockPrice = 512;

/// Calls `use(id)` for those of `ids`, which ascend, that lie in the block from `first` on.
template <class Use>
void ForEachInBlock(const std::vector<DocumentId>& ids, DocumentId first, Use&& use) {
  for (auto id = std::lower_bound(ids.begin(), ids.end(), first);
       id != ids.end() && *id - first < kBlockDocuments; ++id) {
    use(*id);
  }
}

template <class Column>
std::shared_ptr<const ColumnBlock<typename Column::Value>> Reader::Block(
    const Column& column, DocumentId first, std::uint64_t wanted) const {
  using Values = ColumnBlock<typename Column::Value>;
  const DocumentId number = first / kBlockDocuments;
  const auto advance = [&](const std::shared_ptr<const Values>& old, const CommitChanges& changes) {
    std::shared_ptr<Values> block;
    ForEachInBlock(changes.values, first, [&](DocumentId id) {
      if (!block) block = std::make_shared<Values>(*old);
      (*block)[id - first] = column.Of(database_, id);
    });
    return block ? block : old;
  };
  auto kept = snapshot_->template Find<Values>(column.Kind(), number, advance);
  if (kept || wanted == 0) return kept;
  if (!snapshot_->Spend(column.Kind(), number, wanted, kBlockPrice)) return nullptr;
  auto block = std::make_shared<Values>();
  column.Fill(database_, first, *block);
  kept = block;
  snapshot_->Keep(column.Kind(), number, kept);
  return kept;
}

template <class Value>
Value Reader::ValueOf(const SlotColumn<Value>& column, DocumentId id) {
  Cursor& cursor = cursors_[column.slot];
  if (cursor.asked == 0 || id < cursor.asked) {
    cursor.at = database_.valuestream_begin(column.slot);
    cursor.end = database_.valuestream_end(column.slot);
  }
  cursor.asked = id;
  if (cursor.at != cursor.end) cursor.at.skip_to(id);
  const bool found = cursor.at != cursor.end && cursor.at.get_docid() == id;
  return found ? column.decode(*cursor.at) : column.none;
}

template <class Value, class Use>
void Reader::ForEachValue(const SlotColumn<Value>& column, DocumentId first, const BlockSet& set,
                          Use&& use) {
  const auto block = Block(column, first, CountBits(set));
  ForEachBit(set, [&](DocumentId offset) {
    use(offset, block ? (*block)[offset] : ValueOf(column, first + offset));
  });
}

}  // namespace maru::index
