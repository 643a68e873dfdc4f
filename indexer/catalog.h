#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "index/store/writer.h"
#include "indexer/counts.h"

namespace maru::indexer {

/// A folder of the index whose entries are at hand.
struct Folder {
  index::DirectoryId id = 0;
  /// In byte order of names.
  std::vector<index::Entry> entries;
  /// New ones, in no order, until they are merged in.
  std::vector<index::Entry> added;
  bool changed = false;
  unsigned users = 0;

  /// Null when there is none; the pointer holds until `entries` changes.
  index::Entry* Find(std::string_view name);
  /// Merges `added` in.
  void Settle();
};

/// Hears what becomes of folders, to follow them.
class FolderListener {
 public:
  virtual ~FolderListener() = default;
  /// About to look into a folder, which is open.
  virtual void Entering(int folder, index::DirectoryId id) = 0;
  virtual void Placed(index::DirectoryId id, index::DirectoryId parent,
                      const std::string& name) = 0;
  virtual void Removed(index::DirectoryId id) = 0;
};

/// One share's index as folders with entries. Keeps documents and lists of entries in step: every
/// commit holds both, so that a run after a crash neither forgets nor doubles a file. One thread.
/// Throws maruseeker::Error when the index cannot be read or written.
class Catalog {
 public:
  /// A commit is due when this much waits, or when it has waited this long.
  struct Bounds {
    std::size_t bytes = 96u << 20;
    std::chrono::milliseconds time{30'000};
  };
  /// A fresh index is built fastest in one go; what is lost with the process is at most this.
  static constexpr std::chrono::minutes kFirstCommit{15};
  /// Between two commits, so that readers can follow.
  static constexpr std::chrono::milliseconds kCommitGap{200};

  Catalog(const std::string& index_folder, Counts& counts, FolderListener* listener);
  /// Commits what was done, as far as the index takes it.
  ~Catalog();
  Catalog(const Catalog&) = delete;
  Catalog& operator=(const Catalog&) = delete;

  /// The folder, read from the index unless somebody uses it already. One Close for each Open.
  Folder& Open(index::DirectoryId id);
  void Close(Folder& folder);

  index::Entry Root() const { return writer_.Root(); }
  void AddRoot(const index::Document& document, const index::Stamp& stamp);
  void UpdateRoot(const index::Document& document, const index::Stamp& stamp);

  void AddFile(Folder& folder, index::Prepared prepared, const std::string& name,
               const index::Stamp& stamp);
  void ReplaceFile(Folder& folder, index::Entry& entry, index::Prepared prepared,
                   const index::Stamp& stamp);
  /// A new folder in `folder`.
  index::DirectoryId AddFolder(Folder& folder, const index::Document& document,
                               const index::Stamp& stamp);
  /// Name, rights or times of an entry whose content stays, taken from the document. The caller
  /// keeps the order when the name changes.
  void Update(Folder& folder, index::Entry& entry, const index::Document& document,
              const index::Stamp& stamp);
  /// The document only; the caller takes the entry away.
  void RemoveFile(Folder& folder, const index::Entry& entry);
  /// A folder's entry with all that lies in it. May commit.
  void RemoveTree(Folder& folder, const std::string& name);
  /// Takes a folder's or file's entry to another place; its own row and document are then to be
  /// brought up to date by Update. False, and nothing done, when it is not there or `to_name` is
  /// taken.
  bool Move(Folder& from, const std::string& name, Folder& to, const std::string& to_name);

  /// Commits when the bounds say so; of a fresh index the first time after kFirstCommit.
  void CommitIfDue(const Bounds& bounds);
  /// Commits now; waits for kCommitGap since the last.
  void Commit();
  std::uint32_t Documents() const { return writer_.Documents(); }

 private:
  void Write(Folder& folder);
  void RemoveStep(std::vector<Folder*>& way);

  index::Writer writer_;
  Counts& counts_;
  FolderListener* listener_;
  std::unordered_map<index::DirectoryId, std::unique_ptr<Folder>> open_;
  std::chrono::steady_clock::time_point last_commit_;
  bool is_fresh_;
};

}  // namespace maru::indexer
