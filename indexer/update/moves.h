#pragma once

#include <cstdint>
#include <string>
#include <unordered_map>

#include "indexer/tree/tree.h"

namespace maru::indexer {

/// Folders that are gone from their place and folders that are new at one, until it is known which
/// of them are the same: a folder that was moved keeps its documents. Throws as the tree does.
class Moves {
 public:
  explicit Moves(Tree& tree) : tree_(tree) {}

  /// The folder of an entry is gone from its place: the entry becomes an orphan's. A run that ends
  /// before RemoveOrphan leaves it to the next, to which it is gone as well.
  void AddOrphan(Folder& folder, index::Entry& entry);
  /// Takes the orphan of this inode, if there is one, into `folder` under `name`.
  bool Adopt(std::uint64_t inode, Folder& folder, const std::string& name);
  /// One with all that lies in it. False when there are none.
  bool RemoveOrphan();

  /// A new folder is to wait until all orphans are known. False: there is no room for more.
  bool AddArrival(const Folder& folder, std::string_view name);
  NamesByFolder TakeArrivals();

 private:
  /// Arrivals beyond this are taken as new at once.
  static constexpr std::size_t kMaxArrivals = 10'000;

  struct Orphan {
    index::DirectoryId parent;
    std::string name;
    index::DirectoryId id;
  };

  Tree& tree_;
  /// By inode.
  std::unordered_map<std::uint64_t, Orphan> orphans_;
  NamesByFolder arrivals_;
  std::size_t arrivals_count_ = 0;
};

}  // namespace maru::indexer
