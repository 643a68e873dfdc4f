#include "indexer/follow/round.h"

#include <algorithm>

#include "indexer/update/settle.h"

namespace maru::indexer {

using index::Writer;

void Round::Run(int top, const std::string& share_name, NamesByFolder& names) {
  if (names.erase(kAboveRoot) > 0 || names.contains(Writer::kRoot)) {
    updater_.UpdateTop(top, share_name);
  }
  Go(top, names);
  // What was not where it was may have been moved along with what has just been settled.
  if (!names.empty()) Go(top, names);
}

void Round::Go(int top, NamesByFolder& names) {
  const Tree& tree = updater_.Indexed();
  std::erase_if(names, [&](const auto& item) {
    return item.first != Writer::kRoot && tree.ParentOf(item.first) == 0;
  });
  changed_.clear();
  for (const auto& [folder, wanted] : names) changed_.insert(folder);
  PartialWalk::Run(top, names);
  Settle(updater_, top);
}

void Round::Reach(int dir_fd, const FolderHandle& folder, std::vector<std::string> names) {
  for (const index::Entry& entry : folder->entries) {
    if (changed_.contains(entry.directory) && !IsOrphan(entry)) names.push_back(entry.name);
  }
  std::sort(names.begin(), names.end());
  names.erase(std::unique(names.begin(), names.end()), names.end());
  listing_.LookAt(dir_fd, names);
  const MetFolders met =
      updater_.Update(dir_fd, folder, Compare(*folder, names, listing_.Entries()));
  // All of them are walked when the round is settled: what has happened in them before their new
  // place was known went unseen. There is room for as many as a round has names.
  Moves& moves = updater_.Moved();
  for (const Found& found : met.unknown) moves.AddArrival(folder->id, std::string(found.name));
  for (const std::string& name : met.renamed) moves.AddArrival(folder->id, name);
}

}  // namespace maru::indexer
