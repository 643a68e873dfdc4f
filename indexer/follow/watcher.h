#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "index/store/document.h"
#include "system/unique_fd.h"

namespace maru::indexer {

/// A watch (inotify) on each folder of a share, and on files that change elsewhere too, as far as
/// the system's limits allow. One thread.
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

  /// Watches an open folder, if that is not done already.
  void Watch(int dir_fd, index::DirectoryId id);
  void Forget(index::DirectoryId id);
  /// Watches a file itself, for what happens to it under other names; until it is gone. Whether
  /// that is new.
  bool WatchFile(int dir_fd, index::DirectoryId folder, const std::string& name);

  /// Becomes readable when there are events; -1 when the system gives no watches at all.
  int Descriptor() const { return inotify_.Get(); }
  /// Appends what has happened, or a part of it; never waits.
  void Read(std::vector<Event>& events);
  /// Whether every folder since Renew has its watch.
  bool Complete() const { return complete_; }
  /// A crawl begins, which will ask again for the watches that were not to be had.
  void Renew() { complete_ = static_cast<bool>(inotify_); }

 private:
  int Add(const std::string& path, std::uint32_t mask);

  UniqueFd inotify_;
  bool complete_ = true;
  bool noted_limit_ = false;
  /// Watch descriptors by folder, -1 for none, and the other way round: more than one folder where
  /// the same is mounted at several places.
  std::vector<int> watches_;
  std::unordered_multimap<int, index::DirectoryId> folders_;
  struct FileName {
    index::DirectoryId folder;
    std::string name;
    friend bool operator==(const FileName&, const FileName&) = default;
  };
  std::unordered_multimap<int, FileName> files_;
};

}  // namespace maru::indexer
