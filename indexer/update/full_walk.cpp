#include "indexer/update/full_walk.h"

#include <algorithm>
#include <cerrno>

namespace maru::indexer {

void FullWalk::Visit(int dir_fd, index::DirectoryId id, std::vector<Child>& children) {
  Tree& tree = updater_.Indexed();
  const FolderHandle folder = tree.Enter(dir_fd, id);
  if (!listing_.Read(dir_fd)) return updater_.NoteUnreadable(Path());
  const std::span<const Found> found = listing_.Entries();
  const std::vector<Difference> differences = Compare(*folder, found);
  const auto changed = std::count_if(differences.begin(), differences.end(),
                                     [](const Difference& one) { return one.found != nullptr; });
  tree.Counted().unchanged += found.size() - static_cast<std::size_t>(changed);
  const MetFolders met = updater_.Update(dir_fd, folder, differences);
  for (const Found& unknown : met.unknown) Meet(dir_fd, *folder, unknown);
  folder->Merge();
  for (const index::Entry& entry : folder->entries) {
    if (entry.directory != 0 && !IsOrphan(entry)) children.push_back({entry.name, entry.directory});
  }
  updater_.Proceed();
}

void FullWalk::Unreadable(const Child& child) {
  if (!HasVanished(errno)) updater_.NoteUnreadable(child.name);
}

}  // namespace maru::indexer
