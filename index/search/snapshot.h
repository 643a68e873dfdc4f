#pragma once

#include <xapian.h>

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "index/search/cache.h"
#include "index/store/aliases.h"
#include "index/store/change_log.h"
#include "index/store/directory_table.h"

namespace maru::index {

/// One share's index at one commit, and the owner of everything derived from it. Made from the
/// snapshot before by what changed: what is kept of an earlier commit is set right when it is asked
/// for, at the cost of the documents changed since. Immutable, thread-safe.
class Snapshot {
 public:
  /// Of the state `database` is at. `before` (or null) is of the same database at an earlier one.
  Snapshot(const Xapian::Database& database, const Snapshot* before, std::shared_ptr<Cache> cache);

  /// The commit `database` is at.
  static std::uint32_t CommitOf(const Xapian::Database& database);

  std::uint32_t Commit() const { return table_.Commit(); }
  std::uint64_t Documents() const { return documents_; }
  DocumentId LastDocument() const { return last_document_; }
  /// Words in all documents.
  std::uint64_t TotalLength() const { return total_length_; }
  const DirectoryTable& Table() const { return table_; }
  const Aliases& Outside() const { return aliases_; }

  /// The value that is kept of this kind and name, set right for this commit by `advance(value,
  /// changes)`, which returns null when it cannot; else null.
  template <class Value, class Name, class Advance>
  std::shared_ptr<const Value> Find(char kind, const Name& name, Advance&& advance) const {
    const std::string key = CacheKey(kind, owner_, name);
    const Cache::Entry entry = cache_->Find(key);
    auto value = std::static_pointer_cast<const Value>(entry.value);
    if (!value || entry.commit == Commit()) return value;
    const std::shared_ptr<const CommitChanges> changes = ChangesSince(entry.commit);
    if (!changes) return nullptr;
    value = advance(value, *changes);
    if (value) Keep(kind, name, value);
    return value;
  }
  template <class Value, class Name>
  void Keep(char kind, const Name& name, const std::shared_ptr<const Value>& value) const {
    cache_->Keep(CacheKey(kind, owner_, name), {value, Commit()}, BytesOf<Value>()(*value));
  }
  template <class Name>
  bool Spend(char kind, const Name& name, std::uint64_t cost, std::uint64_t price) const {
    return cache_->Spend(CacheKey(kind, owner_, name), cost, price);
  }

 private:
  /// What changed after a commit, up to this one; null when that is not known.
  std::shared_ptr<const CommitChanges> ChangesSince(std::uint32_t commit) const;
  void Follow(const Snapshot& before, const MetadataReader& read);

  std::shared_ptr<Cache> cache_;
  /// The same for all snapshots made from each other.
  std::uint32_t owner_;
  DirectoryTable table_;
  Aliases aliases_;
  std::uint64_t documents_;
  DocumentId last_document_;
  std::uint64_t total_length_;
  /// Of the last commits, this one's last, without a gap.
  std::vector<std::shared_ptr<const CommitChanges>> history_;
  mutable std::mutex mutex_;
  /// By the commit before.
  mutable std::map<std::uint32_t, std::shared_ptr<const CommitChanges>> together_;
};

}  // namespace maru::index
