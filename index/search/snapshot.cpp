#include "index/search/snapshot.h"

#include <algorithm>
#include <atomic>

#include "index/store/codec.h"

namespace maru::index {
namespace {

constexpr std::size_t kMostCommits = 64;
/// Documents changed beyond which deriving anew costs no more.
constexpr std::size_t kMostChanged = 4096;

std::uint32_t NewOwner() {
  static std::atomic<std::uint32_t> last = 0;
  return ++last;
}

void Join(std::vector<DocumentId>& all, const std::vector<DocumentId>& more) {
  std::vector<DocumentId> joined;
  std::set_union(all.begin(), all.end(), more.begin(), more.end(), std::back_inserter(joined));
  all = std::move(joined);
}

}  // namespace

std::uint32_t Snapshot::CommitOf(const Xapian::Database& database) {
  const std::string commit = database.get_metadata("commit");
  return commit.empty() ? 0 : Decoder(commit).Number32();
}

Snapshot::Snapshot(const Xapian::Database& database, const Snapshot* before,
                   std::shared_ptr<Cache> cache)
    : cache_(std::move(cache)),
      owner_(before ? before->owner_ : NewOwner()),
      aliases_(database.get_metadata(Aliases::kMetadata)),
      documents_(database.get_doccount()),
      last_document_(database.get_lastdocid()),
      total_length_(database.get_total_length()) {
  const MetadataReader read = [&](const std::string& key) { return database.get_metadata(key); };
  if (before) table_ = before->table_;
  table_.Load(read);
  if (before) Follow(*before, read);
}

/// Goes on with the history before by the commits since, as far as they are told.
void Snapshot::Follow(const Snapshot& before, const MetadataReader& read) {
  if (Commit() - before.Commit() > kMostCommits) return;
  history_ = before.history_;
  for (std::uint32_t commit = before.Commit() + 1; commit <= Commit(); ++commit) {
    auto changes = ReadChanges(read, commit);
    if (!changes || changes->everything) {
      history_.clear();
    } else {
      history_.push_back(std::make_shared<const CommitChanges>(std::move(*changes)));
    }
  }
  if (history_.size() > kMostCommits) {
    history_.erase(history_.begin(), history_.end() - static_cast<std::ptrdiff_t>(kMostCommits));
  }
}

std::shared_ptr<const CommitChanges> Snapshot::ChangesSince(std::uint32_t commit) const {
  // Also of a commit that is later than this one.
  const std::uint32_t commits = Commit() - commit;
  if (commits > history_.size()) return nullptr;
  const std::lock_guard lock(mutex_);
  auto& known = together_[commit];
  if (known) return known;
  auto all = std::make_shared<CommitChanges>();
  for (auto one = history_.end() - static_cast<std::ptrdiff_t>(commits); one != history_.end();
       ++one) {
    all->table = all->table || (*one)->table;
    Join(all->terms, (*one)->terms);
    Join(all->values, (*one)->values);
    if (all->values.size() > kMostChanged) return nullptr;
  }
  return known = all;
}

}  // namespace maru::index
