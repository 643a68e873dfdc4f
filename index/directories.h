#pragma once

#include <algorithm>
#include <array>
#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "index/bits.h"
#include "index/record.h"
#include "system/rights.h"

/// The directory table of one index: folder -> (parent, name, rights), and the distinct rights that
/// documents and folders have. A chmod, rename or move of a folder changes one row here and no
/// document.
///
/// It is kept in the database's metadata, in blocks of kBlockRows rows, so that it changes together
/// with the documents; "stamps" tells in which commit each block last changed, so that a reader
/// follows a commit by reading what changed.
namespace maru::index {

inline constexpr std::uint32_t kBlockRows = 128;

struct DirectoryRow {
  /// 0 for a free row and for the root.
  DirectoryId parent = 0;
  ConditionId condition = 0;
  std::string name;
};

template <class Row>
using Block = std::array<Row, kBlockRows>;

/// Reads one metadata value; empty when there is none.
using MetadataReader = std::function<std::string(const std::string& key)>;
using MetadataWriter = std::function<void(const std::string& key, const std::string& value)>;

/// Rows with ids from 1, in shared immutable blocks. `Prefix` names the metadata keys.
template <class Row, char Prefix>
class RowTable {
 public:
  std::uint32_t Count() const { return count_; }
  const Row& operator[](std::uint32_t id) const {
    static const Row none{};
    const std::uint32_t index = id - 1;
    if (id == 0 || index >= count_ || !blocks_[index / kBlockRows]) return none;
    return (*blocks_[index / kBlockRows])[index % kBlockRows];
  }
  /// Changes a row (or makes the table longer); copies its block when others share it.
  Row& Change(std::uint32_t id);

  /// Takes over the blocks that changed after commit `since`.
  void Load(const MetadataReader& read, std::uint32_t since);
  /// Writes the blocks changed since the last Save, stamped with `commit`.
  void Save(const MetadataWriter& write, std::uint32_t commit);

 private:
  std::uint32_t count_ = 0;
  std::vector<std::shared_ptr<Block<Row>>> blocks_;
  std::vector<std::uint32_t> stamps_;
  std::vector<bool> changed_;
};

class DirectoryTable {
 public:
  /// Of the newest commit it has seen.
  std::uint32_t Commit() const { return commit_; }
  std::uint32_t Directories() const { return directories_.Count(); }
  std::uint32_t Conditions() const { return conditions_.Count(); }
  const DirectoryRow& Directory(DirectoryId id) const { return directories_[id]; }
  const FileRights& Condition(ConditionId id) const { return conditions_[id]; }

  /// Path within the share: "" for the root, else "/a/b". Empty also for an unknown folder.
  std::string PathOf(DirectoryId id) const;

  DirectoryId AddDirectory();
  void SetDirectory(DirectoryId id, DirectoryRow row) { directories_.Change(id) = std::move(row); }
  void RemoveDirectory(DirectoryId id);
  /// The id of these rights, made when they are new.
  ConditionId ConditionOf(const FileRights& rights);

  void Load(const MetadataReader& read);
  void Save(const MetadataWriter& write);

 private:
  RowTable<DirectoryRow, 'd'> directories_;
  RowTable<FileRights, 'c'> conditions_;
  std::uint32_t commit_ = 0;
  std::vector<DirectoryId> free_, freed_;
  std::map<FileRights, ConditionId> known_;
};

/// What one identity can reach and read of one index at one commit. Thread-safe.
class Eyes {
 public:
  /// `last` is the last document id of that commit.
  Eyes(const DirectoryTable& table, const Identity& who, DocumentId last);

  bool Sees(DirectoryId parent, ConditionId condition) const {
    return Bit(reachable_, parent) && Bit(readable_, condition);
  }
  /// A document at the place that `place()` tells; asked once for each.
  template <class PlaceOf>
  bool SeesDocument(DocumentId id, PlaceOf&& place) const {
    if (id / 64 >= asked_.size()) return false;
    const Bits bit = Bits{1} << (id % 64);
    if (Asked(id / 64) & bit) return Seen(id / 64) & bit;
    const Place here = place();
    const bool sees = Sees(here.parent, here.condition);
    if (sees) seen_[id / 64].fetch_or(bit, std::memory_order_relaxed);
    asked_[id / 64].fetch_or(bit, std::memory_order_release);
    return sees;
  }
  /// Those that they see of the documents of one word of bits. `place(id)` as above, ascending.
  template <class PlaceOf>
  Bits SeenOf(std::size_t word, Bits documents, PlaceOf&& place) const {
    if (word >= asked_.size()) return 0;
    const Bits asked = Asked(word);
    Bits seen = documents & asked & Seen(word);
    ForEachBit(word, documents & ~asked, [&](DocumentId id) {
      if (SeesDocument(id, [&] { return place(id); })) seen |= Bits{1} << (id % 64);
    });
    return seen;
  }
  bool Reaches(DirectoryId directory) const { return Bit(reachable_, directory); }

 private:
  static bool Bit(const std::vector<bool>& bits, std::uint32_t id) {
    return id < bits.size() && bits[id];
  }
  /// What was found out; a bit of `seen_` is valid once that of `asked_` is set.
  Bits Asked(std::size_t word) const { return asked_[word].load(std::memory_order_acquire); }
  Bits Seen(std::size_t word) const { return seen_[word].load(std::memory_order_relaxed); }

  std::vector<bool> reachable_, readable_;
  /// Words of bits.
  mutable std::vector<std::atomic<Bits>> asked_, seen_;
};

/// The folders that lie under `top` (and `top`), as a bit an id.
std::vector<bool> FoldersUnder(const DirectoryTable& table, DirectoryId top);

}  // namespace maru::index
