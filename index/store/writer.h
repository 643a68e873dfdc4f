#pragma once

#include <memory>
#include <string>
#include <vector>

#include "index/store/document.h"

namespace maru::index {

/// A document made ready for the index: words, positions, stored text. The costly half of indexing,
/// free of the index itself.
class Prepared {
 public:
  /// Any thread. Pure: no files, no index.
  explicit Prepared(Document document);
  ~Prepared();
  Prepared(Prepared&&) noexcept;
  Prepared& operator=(Prepared&&) noexcept;

  /// Bytes it holds, about; for bounding queues.
  std::size_t Size() const;

 private:
  friend class Writer;
  struct Parts;
  std::unique_ptr<Parts> parts_;
};

/// The only writer of one share's index. One thread; throws Error (121: the index cannot be opened,
/// locked or written). Nothing is visible to readers, or kept after a crash, before Commit.
///
/// Folders: the share's own folder is directory kRoot. Every folder has a row (parent, name,
/// rights) in the directory table, a document (so that it can be found), and a list of its entries.
class Writer {
 public:
  static constexpr DirectoryId kRoot = 1;

  /// Opens or makes the index folder `path`, and takes its lock. An index of another format version
  /// is emptied (the caller then finds no entries and crawls anew).
  explicit Writer(const std::string& path);
  ~Writer();
  Writer(const Writer&) = delete;
  Writer& operator=(const Writer&) = delete;

  /// Whether this index has the row of its root, so was crawled before.
  bool HasRoot() const;
  /// The document of the root folder; 0 before it was set.
  Entry Root() const;
  void SetRoot(const Entry& entry);

  /// The entries of a folder as last set, in byte order of names; empty for an unknown one.
  std::vector<Entry> Entries(DirectoryId directory) const;
  void SetEntries(DirectoryId directory, const std::vector<Entry>& entries);

  /// A new row; ids of removed folders are used again only after a Commit.
  DirectoryId AddDirectory(DirectoryId parent, const std::string& name, const FileRights& rights);
  /// Moved, renamed, or rights changed: one row, no document.
  void SetDirectory(DirectoryId id, DirectoryId parent, const std::string& name,
                    const FileRights& rights);
  /// The row and the list of entries; documents and folders inside are the caller's to remove
  /// first.
  void RemoveDirectory(DirectoryId id);

  DocumentId Add(Prepared prepared);
  void Replace(DocumentId id, Prepared prepared);
  /// New place, name, rights or times of a document whose content is as it was. Cheap.
  void Update(DocumentId id, const Document& document_without_text);
  void Remove(DocumentId id);

  /// All since the last Commit becomes visible at once. Not more often than 5 times a second. The
  /// documents of a fresh index are built in parts, on threads of the writer's own, and put
  /// together by the first Commit (or Replace, Update, Remove): best once, at the end of a first
  /// crawl.
  void Commit();
  /// Bytes in memory waiting for a Commit, about; the caller commits when this passes its bound.
  std::size_t Pending() const;
  /// Documents in the index.
  std::uint32_t Documents() const;

 private:
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace maru::index
