#pragma once

#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "indexer/tree/walk.h"
#include "indexer/update/updater.h"

namespace maru::indexer {

/// Goes to some folders of the tree only, by way of those above them.
class PartialWalk : private Walk {
 public:
  /// Goes to the folders of `names`, from `top`, the share's own. What is left of `names`
  /// afterwards stands in folders that do not lie where the tree has them: they were moved, or are
  /// gone.
  void Run(int top, NamesByFolder& names);

 protected:
  explicit PartialWalk(Updater& updater) : updater_(updater) {}

  /// A folder on the way, open; `names` are those asked for in it, if any.
  virtual void Reach(int dir_fd, const FolderHandle& folder, std::vector<std::string> names) = 0;

  Updater& updater_;

 private:
  void Visit(int dir_fd, index::DirectoryId id, std::vector<Child>& children) override;
  void Unreadable(const Child&) override {}
  bool Stopped() override { return updater_.Stopped(); }

  NamesByFolder* names_ = nullptr;
  /// The folders to go through, and their inodes once the folder above has been reached.
  std::unordered_map<index::DirectoryId, std::uint64_t> way_;
};

}  // namespace maru::indexer
