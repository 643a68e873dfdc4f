#pragma once

#include <algorithm>
#include <array>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "index/store/record.h"
#include "system/rights.h"

/// The directory table of one index: folder -> (parent, name, rights), and the distinct rights that
/// documents and folders have. A chmod, rename or move of a folder changes one row here and the
/// folder's own document, and none that lies in it.
///
/// It is kept in the database's metadata, in blocks of kBlockRows rows, so that it changes together
/// with the documents; "stamps" tells in which commit each block last changed, so that a reader
/// follows a commit by reading what changed.
namespace maru::index {

inline constexpr std::uint32_t kBlockRows = 128;
/// A folder's way up is no longer than this; a longer one, or a ring, counts as not connected.
inline constexpr unsigned kMaxDepth = 100'000;

struct DirectoryRow {
  /// 0 for a free row and for the root.
  DirectoryId parent = 0;
  RightsId rights = 0;
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
  /// Whether there is something to save.
  bool Changed() const {
    return std::find(changed_.begin(), changed_.end(), true) != changed_.end();
  }

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
  std::uint32_t DirectoryCount() const { return directories_.Count(); }
  std::uint32_t RightsCount() const { return rights_.Count(); }
  const DirectoryRow& Directory(DirectoryId id) const { return directories_[id]; }
  const FileRights& Rights(RightsId id) const { return rights_[id]; }

  /// Path within the share: "" for the root, else "/a/b". Empty also for an unknown folder.
  std::string PathOf(DirectoryId id) const;

  DirectoryId AddDirectory();
  void SetDirectory(DirectoryId id, DirectoryRow row) { directories_.Change(id) = std::move(row); }
  void RemoveDirectory(DirectoryId id);
  /// The id of these rights, made when they are new.
  RightsId RightsIdOf(const FileRights& rights);

  void Load(const MetadataReader& read);
  void Save(const MetadataWriter& write);
  /// Whether a row changed since the last Save.
  bool Changed() const { return directories_.Changed() || rights_.Changed(); }

 private:
  RowTable<DirectoryRow, 'd'> directories_;
  RowTable<FileRights, 'c'> rights_;
  std::uint32_t commit_ = 0;
  std::vector<DirectoryId> free_, freed_;
  std::map<FileRights, RightsId> known_;
};

}  // namespace maru::index
