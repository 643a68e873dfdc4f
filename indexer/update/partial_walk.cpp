#include "indexer/update/partial_walk.h"

#include <utility>

namespace maru::indexer {

using index::DirectoryId;

void PartialWalk::Run(int top, NamesByFolder& names) {
  if (names.empty()) return;
  const Tree& tree = updater_.Indexed();
  way_.clear();
  for (const auto& [folder, wanted] : names) {
    DirectoryId id = folder;
    while (id != 0 && way_.emplace(id, 0).second) id = tree.ParentOf(id);
  }
  way_[index::Writer::kRoot] = tree.Root().stamp.inode;
  names_ = &names;
  Walk::Run(top, index::Writer::kRoot);
}

void PartialWalk::Visit(int dir_fd, DirectoryId id, std::vector<Child>& children) {
  if (IdOf(dir_fd).inode != way_[id]) return;
  const FolderHandle folder = updater_.Indexed().Enter(dir_fd, id);
  const auto wanted = names_->extract(id);
  Reach(dir_fd, folder, wanted ? std::move(wanted.mapped()) : std::vector<std::string>());
  folder->Merge();
  for (const index::Entry& entry : folder->entries) {
    const auto next = entry.directory != 0 ? way_.find(entry.directory) : way_.end();
    if (next == way_.end() || IsOrphan(entry)) continue;
    next->second = entry.stamp.inode;
    children.push_back({entry.name, entry.directory});
  }
  updater_.Proceed();
}

}  // namespace maru::indexer
