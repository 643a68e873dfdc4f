#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "index/store/writer.h"
#include "indexer/tree/counts.h"

namespace maru::indexer {

/// A folder of the index whose entries are at hand.
struct Folder {
  index::DirectoryId id = 0;
  /// In byte order of names. One whose document is 0 is gone with the next Merge.
  std::vector<index::Entry> entries;
  /// New ones, in no order, until the next Merge.
  std::vector<index::Entry> added;
  bool changed = false;

  void Add(index::Entry entry);
  void Merge();
  /// Among the merged ones. Null when there is none; holds until the next Merge.
  index::Entry* Find(std::string_view name);
};
/// Merges, commits and removals change what it points to. Of the tree's thread, though others may
/// carry it.
using FolderHandle = std::shared_ptr<Folder>;

/// A folder that is gone from its place stays under a name that no file can have until it is known
/// where it went.
inline bool IsOrphan(const index::Entry& entry) {
  return entry.name.find('/') != std::string::npos;
}

/// Names to look at, by folder.
using NamesByFolder = std::map<index::DirectoryId, std::vector<std::string>>;

struct Found;

/// Hears what becomes of folders, to follow them.
class FolderListener {
 public:
  virtual ~FolderListener() = default;
  /// About to look into a folder, which is open.
  virtual void Entering(int dir_fd, index::DirectoryId id) = 0;
  virtual void Removed(index::DirectoryId id) = 0;
  /// Found in such a folder: a file that changes elsewhere too.
  virtual void MetElsewhere(int dir_fd, index::DirectoryId folder, const Found& file) = 0;
};

/// One share's tree as it is indexed, and its only owner: names and stamps stand in the index's
/// lists of entries, in memory only while a folder is in use; beyond that each folder's parent is
/// known. Keeps documents and lists of entries in step: every commit holds both, so that a run
/// after a crash neither forgets nor doubles a file. One thread. Throws maruseeker::Error when the
/// index cannot be read or written.
class Tree {
 public:
  /// A commit is due when this much waits, or when it has waited this long.
  static constexpr std::size_t kCommitBytes = 96u << 20;
  static constexpr std::chrono::seconds kCommitAge{30};
  /// A fresh index is built fastest in one go; what is lost with the process is at most this.
  static constexpr std::chrono::minutes kFirstCommit{15};
  /// Between two commits, so that readers can follow.
  static constexpr std::chrono::milliseconds kCommitGap{200};

  Tree(const std::string& index_folder, Counts& counts, FolderListener* listener);
  /// Commits what was done, as far as the index takes it.
  ~Tree();
  Tree(const Tree&) = delete;
  Tree& operator=(const Tree&) = delete;

  Counts& Counted() { return counts_; }

  /// The folder, the same for all who have it open; merged.
  FolderHandle Open(index::DirectoryId id);
  /// The same for one that is about to be looked into.
  FolderHandle Enter(int dir_fd, index::DirectoryId id);
  /// Tells the listener of the files among `found` that change elsewhere too.
  void Met(int dir_fd, const Folder& folder, std::span<const Found> found);
  /// 0: it is the share's own, is gone, or lies where nobody has looked yet.
  index::DirectoryId ParentOf(index::DirectoryId id) const;
  /// How many folders lie above it on the way from the share's own, which has 0.
  std::size_t DepthOf(index::DirectoryId id) const;

  index::Entry Root() const { return writer_.Root(); }
  bool HasRoot() const { return writer_.HasRoot(); }
  void SetRoot(const index::Document& document, const index::Stamp& stamp);

  void AddFile(Folder& folder, index::Prepared prepared, const std::string& name,
               const index::Stamp& stamp);
  void ReplaceFile(Folder& folder, index::Entry& entry, index::Prepared prepared,
                   const index::Stamp& stamp);
  /// A new folder in `folder`.
  void AddFolder(Folder& folder, const index::Document& document, const index::Stamp& stamp);
  /// Name, rights or times of an entry whose content stays, taken from the document. The caller
  /// keeps the order when the name changes.
  void Update(Folder& folder, index::Entry& entry, const index::Document& document,
              const index::Stamp& stamp);
  /// The entry is gone with the next Merge.
  void RemoveFile(Folder& folder, index::Entry& entry);
  /// A folder's entry with all that lies in it. May commit.
  void RemoveFolder(Folder& folder, const std::string& name);
  /// Takes a folder's entry to another place; its own row and document are then to be brought up to
  /// date by Update. False, and nothing done, when it is not there or `to_name` is taken.
  bool Move(Folder& from, const std::string& name, Folder& to, const std::string& to_name);

  /// Commits when the bounds say so; of a fresh index the first time after kFirstCommit.
  void CommitIfDue();
  /// Commits now; waits for kCommitGap since the last.
  void Commit();
  std::uint32_t Documents() const { return writer_.Documents(); }

 private:
  void SetParent(index::DirectoryId id, index::DirectoryId parent);
  void Write(Folder& folder);
  void CloseUnused();
  void Forget(index::DirectoryId id);

  index::Writer writer_;
  Counts& counts_;
  FolderListener* listener_;
  std::unordered_map<index::DirectoryId, FolderHandle> open_;
  std::vector<index::DirectoryId> parents_;
  std::chrono::steady_clock::time_point last_commit_;
  bool is_fresh_;
};

}  // namespace maru::indexer
