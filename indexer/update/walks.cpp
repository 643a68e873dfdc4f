#include "indexer/update/walks.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace maru::indexer {
namespace {

using index::DirectoryId;
using index::Entry;
using index::Writer;

/// To the folders that waited, and into them.
class ArrivalsWalk : public PartialWalk {
 public:
  explicit ArrivalsWalk(Updater& updater) : PartialWalk(updater) {}

 private:
  void Reach(int dir_fd, const FolderHandle& folder, std::vector<std::string> names) override {
    for (const std::string& name : names) {
      if (!updater_.Stopped()) Arrive(dir_fd, *folder, name);
    }
  }

  void Arrive(int dir_fd, Folder& folder, const std::string& name) {
    const std::optional<Found> found = Look(dir_fd, name.c_str());
    if (!found || !found->IsFolder() || !updater_.Selects(*found, folder.id)) return;
    if (!folder.Find(name)) updater_.TakeIn(dir_fd, folder, *found);
    folder.Merge();
    const Entry* entry = folder.Find(name);
    const DirectoryId id = entry ? entry->directory : 0;
    const UniqueFd inside = OpenFolder(dir_fd, name.c_str());
    if (id == 0 || !inside) return;
    updater_.Finish();
    FullWalk(updater_).Run(inside.Get(), id);
  }
};

}  // namespace

void FullWalk::Visit(int dir_fd, DirectoryId id, std::vector<Child>& children) {
  Tree& tree = updater_.Indexed();
  const FolderHandle folder = tree.Enter(dir_fd, id);
  if (!listing_.Read(dir_fd)) return updater_.NoteUnreadable(Path());
  updater_.Select(listing_, id);
  const std::span<const Found> found = listing_.Entries();
  tree.Met(dir_fd, *folder, found);
  const std::vector<Difference> differences = Compare(*folder, found);
  const auto changed = std::count_if(differences.begin(), differences.end(),
                                     [](const Difference& one) { return one.found != nullptr; });
  tree.Counted().unchanged += found.size() - static_cast<std::size_t>(changed);
  for (const Found& new_folder : updater_.Update(dir_fd, folder, differences)) {
    Meet(dir_fd, *folder, new_folder);
  }
  folder->Merge();
  for (const Entry& entry : folder->entries) {
    if (entry.directory != 0 && !IsOrphan(entry)) children.push_back({entry.name, entry.directory});
  }
  updater_.Proceed();
}

void FullWalk::Unreadable(const Child& child) {
  if (!HasVanished(errno)) updater_.NoteUnreadable(child.name);
}

void PartialWalk::Run(int top, NamesByFolder& names) {
  if (names.empty()) return;
  const Tree& tree = updater_.Indexed();
  passed_.clear();
  // Up from each folder until the way of another is met; names are met on the walk down.
  for (const auto& [folder, wanted] : names) {
    DirectoryId id = folder;
    while (id != 0 && passed_.emplace(id, 0).second) id = tree.ParentOf(id);
  }
  passed_[Writer::kRoot] = tree.Root().stamp.inode;
  names_ = &names;
  Walk::Run(top, Writer::kRoot);
}

void PartialWalk::Visit(int dir_fd, DirectoryId id, std::vector<Child>& children) {
  if (IdOf(dir_fd).inode != passed_[id]) return;
  const FolderHandle folder = updater_.Indexed().Enter(dir_fd, id);
  auto wanted = names_->extract(id);
  Reach(dir_fd, folder, wanted ? std::move(wanted.mapped()) : std::vector<std::string>());
  folder->Merge();
  for (const Entry& entry : folder->entries) {
    const auto next = passed_.find(entry.directory);
    if (entry.directory == 0 || next == passed_.end() || IsOrphan(entry)) continue;
    next->second = entry.stamp.inode;
    children.push_back({entry.name, entry.directory});
  }
  updater_.Proceed();
}

void Settle(Updater& updater, int top) {
  NamesByFolder arrivals = updater.Moved().TakeArrivals();
  ArrivalsWalk(updater).Run(top, arrivals);
  updater.Finish();
  while (!updater.Stopped() && updater.Moved().RemoveOrphan()) continue;
}

}  // namespace maru::indexer
