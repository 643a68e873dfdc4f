#pragma once

#include <deque>
#include <string>
#include <vector>

#include "index/store/document.h"
#include "indexer/tree/listing.h"
#include "system/unique_fd.h"

namespace maru::indexer {

/// Goes through a tree of folders, each before what lies in it, without recursion, without paths,
/// and with a bounded number of open folders however deep the tree is. Mounts inside are crossed,
/// but for the kernel's own file systems (proc, sysfs and the like).
class Walk {
 public:
  struct Child {
    std::string name;
    index::DirectoryId id = 0;
  };

  virtual ~Walk() = default;
  /// Walks from `top`, which stays the caller's; ends early when Stopped says so.
  void Run(int top, index::DirectoryId id);

 protected:
  /// Looks into one open folder and adds those of its folders to go into.
  virtual void Visit(int dir_fd, index::DirectoryId id, std::vector<Child>& children) = 0;
  /// A folder could not be opened (errno); one that has vanished is not worth a word.
  virtual void Unreadable(const Child&) {}
  virtual bool Stopped() = 0;

  /// The folder being visited, below the top: "" or "a/b".
  std::string Path() const;

 private:
  struct Frame {
    UniqueFd folder;
    FileId id;
    std::vector<Child> children;
    std::size_t next = 0;
  };

  void Enter(UniqueFd folder, index::DirectoryId id);
  void Leave();
  bool Descend(Frame& frame);

  std::deque<Frame> frames_;
};

}  // namespace maru::indexer
