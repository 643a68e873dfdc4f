#include "indexer/update/compare.h"

namespace maru::indexer {
namespace {

using index::Entry;

bool SameType(const Entry& entry, const Found& found) {
  return (entry.directory != 0) == found.IsFolder();
}

/// A name that nothing is known of is left as it was.
bool Differ(const Entry* entry, const Found* found) {
  if (found && found->type == FileType::kUnknown) return false;
  if (!entry || !found) return entry || found;
  return entry->stamp != found->stamp || !SameType(*entry, *found);
}

bool IsReplaced(const Entry& entry, const Found& found) {
  return !SameType(entry, found) || (found.IsFolder() && entry.stamp.inode != found.stamp.inode);
}

class Differences {
 public:
  explicit Differences(const Folder& folder) : entries_(folder.entries) {}

  void Note(const Entry* entry, const Found* found) {
    if (!Differ(entry, found)) return;
    const std::size_t place =
        entry ? static_cast<std::size_t>(entry - entries_.data()) : Difference::kNone;
    const bool is_replaced = entry && found && IsReplaced(*entry, *found);
    list_.push_back({place, is_replaced ? nullptr : found});
    if (is_replaced) list_.push_back({Difference::kNone, found});
  }
  std::vector<Difference> Take() { return std::move(list_); }

 private:
  const std::vector<Entry>& entries_;
  std::vector<Difference> list_;
};

}  // namespace

std::vector<Difference> Compare(const Folder& folder, std::span<const Found> found) {
  Differences differences(folder);
  auto entry = folder.entries.begin();
  for (const Found& here : found) {
    for (; entry != folder.entries.end() && entry->name < here.name; ++entry) {
      differences.Note(&*entry, nullptr);
    }
    const bool is_known = entry != folder.entries.end() && entry->name == here.name;
    differences.Note(is_known ? &*entry++ : nullptr, &here);
  }
  for (; entry != folder.entries.end(); ++entry) differences.Note(&*entry, nullptr);
  return differences.Take();
}

std::vector<Difference> Compare(const Folder& folder, const std::vector<std::string>& names,
                                std::span<const Found> found) {
  Differences differences(folder);
  for (const std::string& name : names) {
    const bool is_here = !found.empty() && found.front().name == name;
    differences.Note(folder.Find(name), is_here ? &found.front() : nullptr);
    if (is_here) found = found.subspan(1);
  }
  return differences.Take();
}

bool SameContent(const Entry& entry, const Found& found) {
  const index::Stamp& before = entry.stamp;
  const index::Stamp& now = found.stamp;
  return SameType(entry, found) &&
         (found.IsFolder() || (before.mtime_ns == now.mtime_ns && before.size == now.size &&
                               before.inode == now.inode));
}

}  // namespace maru::indexer
