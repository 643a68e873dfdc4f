#include "indexer/update/settle.h"

#include "indexer/update/full_walk.h"
#include "indexer/update/partial_walk.h"

namespace maru::indexer {
namespace {

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
    if (!found || !found->IsFolder()) return;
    if (!folder.Find(name)) updater_.TakeIn(dir_fd, folder, *found);
    folder.Merge();
    const index::Entry* entry = folder.Find(name);
    const index::DirectoryId id = entry ? entry->directory : 0;
    const UniqueFd inside = OpenFolder(dir_fd, name.c_str());
    if (id == 0 || !inside) return;
    updater_.Finish();
    NewTree(updater_).Run(inside.Get(), id);
  }
};

}  // namespace

void Settle(Updater& updater, int top) {
  NamesByFolder arrivals = updater.Moved().TakeArrivals();
  ArrivalsWalk(updater).Run(top, arrivals);
  updater.Finish();
  while (!updater.Stopped() && updater.Moved().RemoveOrphan()) continue;
}

}  // namespace maru::indexer
