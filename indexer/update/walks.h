#pragma once

#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "indexer/tree/listing.h"
#include "indexer/tree/walk.h"
#include "indexer/update/updater.h"

/// Walks that bring folders up to date: all of them, or some.
namespace maru::indexer {

/// Compares a folder and all that lies below it, entry by entry.
class FullWalk : public Walk {
 public:
  explicit FullWalk(Updater& updater) : updater_(updater) {}

 protected:
  /// A new folder; the walk goes on into what is in the tree afterwards. To be taken in at once
  /// befits a new tree, in which nothing comes from where the walk has yet to go.
  virtual void Meet(int dir_fd, Folder& folder, const Found& found) {
    updater_.TakeIn(dir_fd, folder, found);
  }

  Updater& updater_;
  Listing listing_;

 private:
  void Visit(int dir_fd, index::DirectoryId id, std::vector<Child>& children) override;
  void Unreadable(const Child& child) override;
  bool Stopped() override { return updater_.Stopped(); }
};

/// Goes to some folders of the tree only, through those above them.
class PartialWalk : private Walk {
 public:
  /// Goes to the folders of `names`, from `top`, the share's own. What is left of `names`
  /// afterwards stands in folders that do not lie where the tree has them: they were moved, or are
  /// gone.
  void Run(int top, NamesByFolder& names);

 protected:
  explicit PartialWalk(Updater& updater) : updater_(updater) {}

  /// A folder that is passed, open; `names` are those asked for in it, if any.
  virtual void Reach(int dir_fd, const FolderHandle& folder, std::vector<std::string> names) = 0;

  Updater& updater_;

 private:
  void Visit(int dir_fd, index::DirectoryId id, std::vector<Child>& children) override;
  bool Stopped() override { return updater_.Stopped(); }

  NamesByFolder* names_ = nullptr;
  /// The folders to pass, and their inodes once the folder above has been reached.
  std::unordered_map<index::DirectoryId, std::uint64_t> passed_;
};

/// All folders that are gone from their place or new at one are known: takes in and walks those
/// that waited, removes what is gone for good, and waits for all that is under way. `top` is the
/// share's folder.
void Settle(Updater& updater, int top);

}  // namespace maru::indexer
