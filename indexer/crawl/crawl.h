#pragma once

#include <string>

#include "indexer/tree/shares.h"
#include "indexer/update/walks.h"

namespace maru::indexer {

/// Brings a whole share up to date: everything on the disk is compared with the index.
class Crawl : private FullWalk {
 public:
  explicit Crawl(Updater& updater) : FullWalk(updater) {}

  /// `top` is the share's folder, open. False when it was not compared: it cannot be read, or is an
  /// empty one in place of another (a disk that is not mounted). Commits.
  bool Run(int top, const std::string& share_name);

 private:
  void Meet(int dir_fd, Folder& folder, const Found& found) override;
  bool LooksUnmounted(int top);
};

/// Before the share's tree is opened: an index whose personal folders were others is made anew.
void PrepareIndex(const Target& target);

/// Crawls the target's open folder as Crawl::Run. While the index is between its old terms and the
/// target's it is of no use to anybody. Throws also std::system_error.
bool CrawlByTerms(Updater& updater, const Target& target, int top);

}  // namespace maru::indexer
