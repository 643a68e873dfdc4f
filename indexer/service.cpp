#include "indexer/service.h"

#include <signal.h>
#include <time.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "indexer/tree/shares.h"
#include "system/log.h"
#include "system/share_table.h"

namespace maru::indexer {
namespace {

/// Between two looks at the settings and the shares' folders.
constexpr timespec kLook{10, 0};

sigset_t Signals() {
  sigset_t signals;
  sigemptyset(&signals);
  for (const int signal : {SIGTERM, SIGINT, SIGHUP}) sigaddset(&signals, signal);
  return signals;
}

bool Contains(const std::vector<std::string>& names, const std::string& name) {
  return std::find(names.begin(), names.end(), name) != names.end();
}

/// All shares followed, as the settings have them at each moment.
class Service {
 public:
  Service(Workers& workers, const Keeper::Settings& settings)
      : workers_(workers), settings_(settings) {}

  /// Brings the keepers in line with the settings: shares that came, went, or have another folder
  /// now (a disk was mounted). Removes the indices of shares that are gone.
  void Reconcile();
  /// A crawl of every share, one after another.
  void CrawlSoon() {
    for (const auto& keeper : keepers_) keeper->CrawlSoon();
  }

 private:
  Workers& workers_;
  const Keeper::Settings& settings_;
  std::mutex turn_;
  std::vector<std::unique_ptr<Keeper>> keepers_;
  std::vector<std::string> missing_;
};

void Service::Reconcile() {
  const std::shared_ptr<const ShareTable> table = ShareTable::Current();
  const Targets targets = FindTargets(*table);
  std::erase_if(keepers_, [&](const std::unique_ptr<Keeper>& keeper) {
    return std::find(targets.present.begin(), targets.present.end(), keeper->Keeps()) ==
           targets.present.end();
  });
  std::vector<std::string> used;
  for (const auto& keeper : keepers_) used.push_back(keeper->Keeps().index_folder);
  RemoveForeignIndices(*table, used);
  for (const Target& target : targets.present) {
    if (Contains(used, target.index_folder)) continue;
    keepers_.push_back(std::make_unique<Keeper>(target, workers_, turn_, settings_));
  }
  for (const std::string& share : targets.missing) {
    errno = 0;
    if (!Contains(missing_, share)) MARU_LOG("Share %s: its folder is not there", share.c_str());
  }
  missing_ = targets.missing;
}

}  // namespace

void Serve(Workers& workers, const Keeper::Settings& settings) {
  const sigset_t signals = Signals();
  Service service(workers, settings);
  while (true) {
    service.Reconcile();
    const int signal = sigtimedwait(&signals, nullptr, &kLook);
    if (signal == SIGTERM || signal == SIGINT) return;
    if (signal == SIGHUP) service.CrawlSoon();
  }
}

}  // namespace maru::indexer
