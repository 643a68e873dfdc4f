#pragma once

#include <string>

#include "indexer/follow/pending.h"
#include "indexer/follow/watcher.h"
#include "indexer/update/updater.h"

namespace maru::indexer {

/// Hears of the changes in one share's folders, each from when it was first looked into. One
/// thread.
class Follower : public FolderListener {
 public:
  using Clock = Pending::Clock;

  explicit Follower(std::string share) : share_(std::move(share)) {}

  void Entering(int dir_fd, index::DirectoryId id) override;
  void Removed(index::DirectoryId id) override { watcher_.Forget(id); }
  void MetElsewhere(int dir_fd, index::DirectoryId folder, const Found& file) override;

  /// Becomes readable when there is something to hear; -1: never.
  int Descriptor() const { return watcher_.Descriptor(); }
  /// Hears what has happened; never waits.
  void Hear();

  /// When the first names are due; time_point::max() when there are none.
  Clock::time_point NextDue() const { return pending_.NextDue(); }
  /// Takes out some names that have come to rest.
  NamesByFolder TakeDue();
  /// Compares them, and the folders in which they stand. `top` is the share's folder.
  void CatchUp(Updater& updater, int top, NamesByFolder due);

  /// A crawl begins, which finds all that was lost.
  void Renew();
  /// More has changed since Renew than could be heard.
  bool HasLost() const { return lost_; }
  /// Whether all folders that were looked into since Renew are watched.
  bool HearsAll() const { return watcher_.Complete(); }

 private:
  void Await(index::DirectoryId folder, const std::string& name, bool complete);
  void Lose();

  const std::string share_;
  Watcher watcher_;
  Pending pending_;
  bool lost_ = false;
  bool catching_up_ = false;
};

}  // namespace maru::indexer
