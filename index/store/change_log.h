#pragma once

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "index/store/directory_table.h"
#include "index/store/document.h"

/// What each of the last commits changed, kept in the database's metadata: a reader that derived
/// something from an earlier state sets right what these documents changed of it, instead of
/// deriving it anew.
namespace maru::index {

struct CommitChanges {
  /// So much that it is not told.
  bool everything = false;
  /// Rows of the directory table.
  bool table = false;
  /// Documents added, removed, or with other terms; ascending.
  std::vector<DocumentId> terms;
  /// All of those, and documents with other values (place, size, time); ascending.
  std::vector<DocumentId> values;
};

/// Of a commit, as `read` tells; none when it is not kept any more.
std::optional<CommitChanges> ReadChanges(const MetadataReader& read, std::uint32_t commit);

/// Collects what the next commit changes.
class ChangeLog {
 public:
  void AddTerms(DocumentId id) {
    Add(terms_, id);
    Add(values_, id);
  }
  void AddValues(DocumentId id) { Add(values_, id); }
  void AddEverything() { everything_ = true; }

  /// Writes what was collected as that of `commit`. Collected on until Clear: the commit may fail.
  void Save(const MetadataWriter& write, std::uint32_t commit, bool table_changed) const;
  void Clear() { *this = {}; }

 private:
  void Add(std::set<DocumentId>& ids, DocumentId id);

  bool everything_ = false;
  std::set<DocumentId> terms_, values_;
};

}  // namespace maru::index
