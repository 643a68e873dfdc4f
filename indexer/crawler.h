#pragma once

#include <atomic>
#include <string>
#include <unordered_map>
#include <vector>

#include "indexer/catalog.h"
#include "indexer/pipeline.h"
#include "indexer/walk.h"

namespace maru::indexer {

/// Brings a share's index up to date with what lies on the disk. What has the same stamp as before
/// is left alone unopened; new rights, names and places cost a row; new content is read. One
/// thread. Throws maruseeker::Error when the index cannot be read or written.
class Crawler : private Walk {
 public:
  /// `stop` ends a crawl early; what it did by then stays.
  Crawler(Catalog& catalog, Workers& workers, Counts& counts, const std::atomic<bool>& stop,
          FolderListener* listener, const Catalog::Bounds& bounds);

  /// Compares the whole share: its folder, opened, and its name. False when it was not compared:
  /// the folder cannot be read, or it is an empty one in place of another (a disk that is not
  /// mounted). Commits.
  bool CrawlShare(UniqueFd top, const std::string& share_name);

  /// Compares some names, sorted, in one open folder that lies at `path` ("a/b") in the share.
  /// Settle must follow before new or vanished folders are dealt with.
  void CrawlNames(int folder, const std::string& path, index::DirectoryId id,
                  const std::vector<std::string>& names);

  /// Tells what was moved from what is gone or new, walks what is new, and waits for all that is
  /// under way. `top` is the share's folder.
  void Settle(int top);

  /// Brings the row of the share's own folder up to date. False when it cannot be examined.
  bool RefreshRoot(int top, const std::string& share_name);

 private:
  /// An entry that differs from what is on the disk. Either side may be absent.
  struct Difference {
    static constexpr std::size_t kNone = static_cast<std::size_t>(-1);
    std::size_t entry = kNone;
    const Found* found = nullptr;
  };
  struct Orphan {
    index::DirectoryId parent;
    std::string name;
    index::DirectoryId id;
  };
  struct Arrival {
    std::string path;
    index::DirectoryId parent;
    std::string name;
  };

  void Visit(int folder, index::DirectoryId id, std::vector<Child>& children) override;
  void Unreadable(const Child& child) override;
  bool Stopped() override { return stop_; }

  std::vector<Difference> Compare(const Folder& folder, std::span<const Found> found);
  void Apply(int place, const std::string& path, Folder& folder,
             std::vector<Difference>& differences);
  bool ApplyInPlace(int place, Folder& folder, Difference& difference);
  static void SplitReplaced(const Folder& folder, std::vector<Difference>& differences);
  void MatchRenames(int place, const std::string& path, Folder& folder,
                    std::vector<Difference>& differences);
  void Orphaned(Folder& folder, const index::Entry& entry);
  void Refresh(int place, Folder& folder, index::Entry& entry, const Found& found);
  bool Describe(int place, index::DirectoryId parent, const Found& found,
                index::Document& document) const;
  void SubmitFile(int place, Folder& folder, const Found& found);
  void MeetFolder(int place, const std::string& path, Folder& folder, const Found& found);
  bool Adopt(int place, Folder& folder, const Found& found);
  void WalkFrom(UniqueFd folder, index::DirectoryId id);
  void Arrive(int top, const Arrival& arrival);
  bool LooksUnmounted(int top);
  void NoteUnreadable(const std::string& folder);
  void Complete(Result result);
  void DrainAll();

  Catalog& catalog_;
  Counts& counts_;
  const std::atomic<bool>& stop_;
  FolderListener* listener_;
  const Catalog::Bounds bounds_;
  Lane lane_;
  Listing listing_;
  /// Folders that are gone from their place, by inode, and folders that are new, until it is known
  /// which of them are the same.
  std::unordered_map<std::uint64_t, Orphan> orphans_;
  std::vector<Arrival> arrivals_;
  bool defer_ = false;
  bool walking_ = false;
  bool noted_unreadable_ = false;
  std::uint64_t read_since_trim_ = 0;
};

}  // namespace maru::indexer
