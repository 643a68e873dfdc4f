#pragma once

#include <atomic>
#include <string>
#include <vector>

#include "indexer/crawl/progress.h"
#include "indexer/tree/shares.h"
#include "indexer/update/workers.h"

namespace maru::indexer {

struct OnceOptions {
  /// Empty the indices first.
  bool full = false;
};

/// Crawls the shares one after another, showing progress, until all are done or `stop` is set.
/// False when a share could not be crawled.
bool CrawlOnce(const std::vector<Target>& targets, Workers& workers, const OnceOptions& options,
               Progress& progress, const std::atomic<bool>& stop);

}  // namespace maru::indexer
