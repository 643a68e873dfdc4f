#include "indexer/update/compare.h"

namespace maru::indexer {
namespace {

using index::Entry;

bool SameType(const Entry& entry, const Found& found) {
  return (entry.directory != 0) == found.IsFolder();
}

bool IsAnother(const Entry& entry, const Found& found) {
  return !SameType(entry, found) || (found.IsFolder() && entry.stamp.inode != found.stamp.inode);
}

void Note(std::vector<Difference>& differences, Entry* entry, const Found* found) {
  // What nothing is known of is left as it was.
  if (found && found->type == FileType::kUnknown) return;
  if (entry && found && IsAnother(*entry, *found)) {
    differences.push_back({entry, nullptr});
    differences.push_back({nullptr, found});
  } else if (entry && found ? entry->stamp != found->stamp : entry || found) {
    differences.push_back({entry, found});
  }
}

}  // namespace

std::vector<Difference> Compare(Folder& folder, std::span<const Found> found) {
  std::vector<Difference> differences;
  auto entry = folder.entries.begin();
  const auto end = folder.entries.end();
  for (const Found& here : found) {
    for (; entry != end && entry->name < here.name; ++entry) Note(differences, &*entry, nullptr);
    const bool is_known = entry != end && entry->name == here.name;
    Note(differences, is_known ? &*entry++ : nullptr, &here);
  }
  for (; entry != end; ++entry) Note(differences, &*entry, nullptr);
  return differences;
}

std::vector<Difference> Compare(Folder& folder, const std::vector<std::string>& names,
                                std::span<const Found> found) {
  std::vector<Difference> differences;
  for (const std::string& name : names) {
    const bool is_here = !found.empty() && found.front().name == name;
    Note(differences, folder.Find(name), is_here ? &found.front() : nullptr);
    if (is_here) found = found.subspan(1);
  }
  return differences;
}

bool SameContent(const Entry& entry, const Found& found) {
  const index::Stamp& before = entry.stamp;
  const index::Stamp& now = found.stamp;
  return SameType(entry, found) &&
         (found.IsFolder() || (before.mtime_ns == now.mtime_ns && before.size == now.size &&
                               before.inode == now.inode && before.born_ns == now.born_ns));
}

}  // namespace maru::indexer
