#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "indexer/keeper.h"
#include "indexer/update/workers.h"

namespace maru::indexer {

/// All shares followed, as the settings have them at each moment. One thread.
class Service {
 public:
  Service(Workers& workers, const Keeper::Settings& settings)
      : workers_(workers), settings_(settings) {}

  /// Brings the keepers in line with the settings: shares that came, went, or have another folder
  /// now (a disk was mounted). Removes the indices of shares that are gone.
  void Reconcile();
  /// A crawl of every share, one after another.
  void CrawlSoon();

 private:
  Workers& workers_;
  const Keeper::Settings settings_;
  std::mutex turn_;
  std::vector<std::unique_ptr<Keeper>> keepers_;
  std::vector<std::string> missing_;
};

/// Runs the service until SIGTERM or SIGINT, which the caller has blocked in all threads along with
/// SIGHUP.
void Serve(Workers& workers, const Keeper::Settings& settings);

}  // namespace maru::indexer
