#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "index/store/document.h"
#include "system/unique_fd.h"

namespace maru::indexer {

/// The folders of a share by their ids: where they lie, and a watch (inotify) on each as far as the
/// system's limits allow. One thread.
class Watcher {
 public:
  struct Event {
    index::DirectoryId folder = 0;
    /// IN_CREATE and so on; IN_Q_OVERFLOW: events were lost, anywhere.
    std::uint32_t mask = 0;
    /// Empty: the folder itself.
    std::string name;
  };

  Watcher();

  void Place(index::DirectoryId id, index::DirectoryId parent, const std::string& name);
  /// Watches an open folder, if that is not done already.
  void Watch(int folder, index::DirectoryId id);
  void Forget(index::DirectoryId id);

  /// "a/b" below the share's folder, "" for that itself.
  std::string Path(index::DirectoryId id) const;
  index::DirectoryId Parent(index::DirectoryId id) const;
  /// Of the folder that was watched under this id.
  std::uint64_t Inode(index::DirectoryId id) const;
  std::string Name(index::DirectoryId id) const;

  /// Becomes readable when there are events; -1 when the system gives no watches at all.
  int Descriptor() const { return inotify_.Get(); }
  /// Appends what has happened, or a part of it; never waits.
  void Read(std::vector<Event>& events);
  /// Whether every folder since Renew has its watch.
  bool Complete() const { return complete_; }
  /// A crawl begins, which will ask again for the watches that were not to be had.
  void Renew() { complete_ = static_cast<bool>(inotify_); }

 private:
  struct Spot {
    index::DirectoryId parent = 0;
    int watch = -1;
    std::uint64_t inode = 0;
    std::string name;
  };

  void Unlink(index::DirectoryId id);

  UniqueFd inotify_;
  bool complete_ = true;
  bool noted_limit_ = false;
  std::vector<Spot> spots_;
  /// More than one where the same folder is mounted at several places.
  std::unordered_multimap<int, index::DirectoryId> ids_;
};

}  // namespace maru::indexer
