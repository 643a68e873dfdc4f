#include "indexer/update/moves.h"

#include <utility>

namespace maru::indexer {

using index::Entry;

void Moves::AddOrphan(Folder& folder, Entry& entry) {
  Entry orphan = entry;
  if (!IsOrphan(entry)) orphan.name += '/' + std::to_string(entry.stamp.inode);
  orphans_[entry.stamp.inode] = {folder.id, orphan.name, entry.directory};
  folder.Add(std::move(orphan));
  entry.document = 0;
}

bool Moves::Adopt(std::uint64_t inode, Folder& folder, const std::string& name) {
  const auto known = orphans_.extract(inode);
  if (!known) return false;
  const Orphan& orphan = known.mapped();
  const FolderHandle from = tree_.Open(orphan.parent);
  const Entry* entry = from->Find(orphan.name);
  return entry && entry->directory == orphan.id && tree_.Move(*from, orphan.name, folder, name);
}

bool Moves::RemoveOrphan() {
  if (orphans_.empty()) return false;
  const auto known = orphans_.extract(orphans_.begin());
  const Orphan& orphan = known.mapped();
  const FolderHandle folder = tree_.Open(orphan.parent);
  const Entry* entry = folder->Find(orphan.name);
  if (entry && entry->directory == orphan.id) tree_.RemoveFolder(*folder, orphan.name);
  return true;
}

bool Moves::AddArrival(const Folder& folder, std::string_view name) {
  if (arrivals_count_ == kMaxArrivals) return false;
  ++arrivals_count_;
  arrivals_[folder.id].emplace_back(name);
  return true;
}

NamesByFolder Moves::TakeArrivals() {
  arrivals_count_ = 0;
  return std::exchange(arrivals_, {});
}

}  // namespace maru::indexer
