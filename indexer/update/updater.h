#pragma once

#include <atomic>
#include <optional>
#include <string>
#include <vector>

#include "indexer/tree/selection.h"
#include "indexer/update/compare.h"
#include "indexer/update/moves.h"
#include "indexer/update/workers.h"

namespace maru::indexer {

/// Brings folders of a tree up to date with what lies on the disk, one by one; which, and when, is
/// for a walk to say. What has the same stamp as before is left alone unopened; new rights, names
/// and places cost a row; new content is read. For one crawl, or one round of following. One
/// thread. Throws maruseeker::Error when the index cannot be read or written.
class Updater {
 public:
  /// `stop` ends it early; what it did by then stays. `selection` stays the caller's.
  Updater(Tree& tree, const Selection& selection, Workers& workers, const std::atomic<bool>& stop)
      : tree_(tree), selection_(selection), stop_(stop), moves_(tree), lane_(workers, tree) {}

  Tree& Indexed() { return tree_; }
  Moves& Moved() { return moves_; }
  bool Stopped() const { return stop_; }

  /// The row of the share's own folder. False when it cannot be examined.
  bool UpdateTop(int top, const std::string& share_name);
  /// Makes good the differences in one open folder, but for the new folders in it: these it
  /// returns, for the caller to take in or to let wait.
  std::vector<Found> Update(int dir_fd, const FolderHandle& folder,
                            std::vector<Difference> differences);

  /// Leaves of a listing of this folder what is to be indexed.
  void Select(Listing& listing, index::DirectoryId folder) const;
  bool Selects(const Found& found, index::DirectoryId folder) const;

  /// Takes a new folder from where it is known to be gone. False when it is gone nowhere.
  bool Adopt(int dir_fd, Folder& folder, const Found& found);
  /// Takes a new folder in, from there or as one with entries yet to be found.
  void TakeIn(int dir_fd, Folder& folder, const Found& found);

  /// Puts into the tree what is finished, and commits when that is due.
  void Proceed();
  /// Waits for all that is under way: a file that is seen again meanwhile is taken for new.
  void Finish() { lane_.Finish(); }

  /// A folder could not be read (errno); the first is logged, further ones are counted.
  void NoteUnreadable(const std::string& path);

 private:
  void MatchRenames(int dir_fd, Folder& folder, std::vector<Difference>& differences);
  bool UpdateEntry(int dir_fd, Folder& folder, const Difference& difference);
  bool Refresh(int dir_fd, Folder& folder, index::Entry& entry, const Found& found);
  void Submit(int dir_fd, const FolderHandle& folder, const Found& found);

  std::optional<index::Document> Describe(int dir_fd, index::DirectoryId parent,
                                          const Found& found) const;

  Tree& tree_;
  const Selection& selection_;
  const std::atomic<bool>& stop_;
  Moves moves_;
  Lane lane_;
  bool noted_unreadable_ = false;
};

}  // namespace maru::indexer
