#include "indexer/crawl/crawl.h"

#include <cerrno>

#include "system/indexed_shares.h"
#include "system/log.h"

namespace maru::indexer {

using index::Writer;

bool Crawl::Run(int top, const std::string& share_name) {
  if (LooksUnmounted(top)) {
    errno = 0;
    MARU_LOG("Share %s is empty and not the folder it was: left as it was indexed",
             share_name.c_str());
    return false;
  }
  Tree& tree = updater_.Indexed();
  const bool is_first = !tree.HasRoot();
  if (!updater_.UpdateTop(top, share_name)) return false;
  if (is_first) {
    FullWalk(updater_).Run(top, Writer::kRoot);
  } else {
    Walk::Run(top, Writer::kRoot);
  }
  Settle(updater_, top);
  tree.Commit();
  return true;
}

void PrepareIndex(const Target& target) {
  constexpr const char* kPersonal = "personal";
  const std::string before = RecordedCrawlTerms(target.index_folder);
  const bool depends = before.starts_with(kPersonal) || target.terms.starts_with(kPersonal);
  if (depends && before != target.terms) RemoveIndex(target.index_folder);
}

bool CrawlByTerms(Updater& updater, const Target& target, int top) {
  const bool settled = RecordedCrawlTerms(target.index_folder) == target.terms;
  const bool is_first = !updater.Indexed().HasRoot();
  if (!settled) RecordCrawlTerms(target.index_folder, is_first ? target.terms : kUnsettledTerms);
  if (!Crawl(updater).Run(top, target.share)) return false;
  if (!settled && !updater.Stopped()) RecordCrawlTerms(target.index_folder, target.terms);
  return true;
}

/// It may have been moved here from where the crawl has not been yet.
void Crawl::Meet(int dir_fd, Folder& folder, const Found& found) {
  if (updater_.Adopt(dir_fd, folder, found)) return;
  if (updater_.Moved().AddArrival(folder, found.name)) return;
  updater_.TakeIn(dir_fd, folder, found);
}

bool Crawl::LooksUnmounted(int top) {
  Tree& tree = updater_.Indexed();
  if (!tree.HasRoot() || tree.Root().stamp.inode == IdOf(top).inode) return false;
  return !tree.Open(Writer::kRoot)->entries.empty() && listing_.Read(top) &&
         listing_.Entries().empty();
}

}  // namespace maru::indexer
