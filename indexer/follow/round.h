#pragma once

#include <string>
#include <unordered_set>
#include <vector>

#include "indexer/tree/listing.h"
#include "indexer/update/partial_walk.h"

namespace maru::indexer {

/// Stands for the folder above the share's own: its only name, "", is that folder itself.
inline constexpr index::DirectoryId kAboveRoot = 0;

/// One round of following: compares names that have changed, and the folders in which they stand.
class Round : private PartialWalk {
 public:
  explicit Round(Updater& updater) : PartialWalk(updater) {}

  /// `top` is the share's folder. What is left of `names` stands in folders of whose way is more to
  /// be heard.
  void Run(int top, const std::string& share_name, NamesByFolder& names);

 private:
  void Reach(int dir_fd, const FolderHandle& folder, std::vector<std::string> names) override;
  void Go(int top, NamesByFolder& names);

  Listing listing_;
  /// Folders in which something changed, and so their own times.
  std::unordered_set<index::DirectoryId> changed_;
};

}  // namespace maru::indexer
