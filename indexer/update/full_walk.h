#pragma once

#include <vector>

#include "indexer/tree/listing.h"
#include "indexer/tree/walk.h"
#include "indexer/update/updater.h"

namespace maru::indexer {

/// Compares a folder and all that lies below it, entry by entry.
class FullWalk : public Walk {
 protected:
  explicit FullWalk(Updater& updater) : updater_(updater) {}

  /// A new folder; the walk goes on into what is in the tree afterwards.
  virtual void Meet(int dir_fd, Folder& folder, const Found& found) = 0;

  Updater& updater_;
  Listing listing_;

 private:
  void Visit(int dir_fd, index::DirectoryId id, std::vector<Child>& children) override;
  void Unreadable(const Child& child) override;
  bool Stopped() override { return updater_.Stopped(); }
};

/// Of a tree of which nothing is elsewhere in the index, but for what is known to be gone there:
/// all is taken in on the way.
class NewTree : public FullWalk {
 public:
  explicit NewTree(Updater& updater) : FullWalk(updater) {}

 private:
  void Meet(int dir_fd, Folder& folder, const Found& found) override {
    updater_.TakeIn(dir_fd, folder, found);
  }
};

}  // namespace maru::indexer
