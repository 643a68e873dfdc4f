#include "indexer/update/updater.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <unordered_map>
#include <utility>

#include "indexer/extract/extractor.h"
#include "system/log.h"
#include "system/rights.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;
using index::Document;
using index::Entry;

/// Fails with ENOENT when it is another file than was seen.
UniqueFd OpenFile(int dir_fd, const Found& found) {
  constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  UniqueFd file(openat(dir_fd, found.name.data(), kFlags));
  if (!file) return file;
  struct stat status {};
  if (fstat(file.Get(), &status) == 0 && S_ISREG(status.st_mode) &&
      status.st_ino == found.stamp.inode) {
    return file;
  }
  errno = ENOENT;
  return UniqueFd();
}

}  // namespace

/// None when it has vanished or cannot be examined.
std::optional<Document> Updater::Describe(int dir_fd, DirectoryId parent,
                                          const Found& found) const {
  Document document;
  document.name = found.name;
  document.parent = parent;
  document.is_dir = found.IsFolder();
  document.size = document.is_dir ? 0 : found.stamp.size;
  document.mtime = found.ModTime();
  document.inode = found.stamp.inode;
  if (ReadFileRights(dir_fd, document.name.c_str(), document.rights)) {
    const std::size_t depth = parent == 0 ? 0 : tree_.DepthOf(parent) + 1;
    selection_.Narrow(depth, document.name, document.rights);
    return document;
  }
  if (!HasVanished(errno)) MARU_LOG("Cannot read the rights of [%s]", document.name.c_str());
  return std::nullopt;
}

bool Updater::Selects(const Found& found, DirectoryId folder) const {
  return selection_.Takes(tree_.DepthOf(folder) + 1, found);
}

void Updater::Select(Listing& listing, DirectoryId folder) const {
  listing.Filter([&, depth = tree_.DepthOf(folder) + 1](const Found& found) {
    return selection_.Takes(depth, found);
  });
}

bool Updater::UpdateTop(int top, const std::string& share_name) {
  const std::optional<Found> found = Look(top, "");
  std::optional<Document> document;
  if (found) document = Describe(top, 0, *found);
  if (!document) return false;
  const Entry root = tree_.Root();
  if (root.stamp == found->stamp && root.name == share_name) {
    ++tree_.Counted().unchanged;
  } else {
    document->name = share_name;
    tree_.SetRoot(*document, found->KeptStamp());
  }
  return true;
}

std::vector<Found> Updater::Update(int dir_fd, const FolderHandle& folder,
                                   std::vector<Difference> differences) {
  std::vector<Found> new_folders;
  // What is in the list is dealt with first: later steps move entries about, and may commit.
  MatchRenames(dir_fd, *folder, differences);
  std::erase_if(differences,
                [&](const Difference& one) { return UpdateEntry(dir_fd, *folder, one); });
  folder->Merge();
  for (const Difference& difference : differences) {
    if (stop_) break;
    if (difference.found->IsFolder()) {
      new_folders.push_back(*difference.found);
    } else {
      Submit(dir_fd, folder, *difference.found);
    }
  }
  return new_folders;
}

/// Files and folders that have but another name in the same folder.
void Updater::MatchRenames(int dir_fd, Folder& folder, std::vector<Difference>& differences) {
  std::unordered_map<std::uint64_t, Entry*> gone;
  for (const Difference& difference : differences) {
    if (!difference.found) gone.emplace(difference.entry->stamp.inode, difference.entry);
  }
  if (gone.empty()) return;
  for (Difference& difference : differences) {
    if (difference.entry) continue;
    const Found& found = *difference.found;
    const auto match = gone.find(found.stamp.inode);
    if (match == gone.end() || !SameContent(*match->second, found)) continue;
    Entry moved = *match->second;
    if (!Refresh(dir_fd, folder, moved, found)) continue;
    folder.Add(std::move(moved));
    match->second->document = 0;
    gone.erase(match);
    difference.found = nullptr;
  }
}

/// True when that was all there is to do.
bool Updater::UpdateEntry(int dir_fd, Folder& folder, const Difference& difference) {
  Entry* const entry = difference.entry;
  const Found* const found = difference.found;
  if (!entry) return !found;
  if (entry->document == 0) return true;
  if (found) {
    if (!SameContent(*entry, *found)) return false;
    Refresh(dir_fd, folder, *entry, *found);
    return true;
  }
  if (entry->directory != 0) {
    moves_.AddOrphan(folder, *entry);
  } else {
    tree_.RemoveFile(folder, *entry);
  }
  return true;
}

bool Updater::Refresh(int dir_fd, Folder& folder, Entry& entry, const Found& found) {
  const std::optional<Document> document = Describe(dir_fd, folder.id, found);
  if (document) tree_.Update(folder, entry, *document, found.KeptStamp());
  return document.has_value();
}

void Updater::Submit(int dir_fd, const FolderHandle& folder, const Found& found) {
  if (found.type != FileType::kFile) return;
  std::optional<Document> document = Describe(dir_fd, folder->id, found);
  if (!document) return;
  UniqueFd file;
  if (found.stamp.size > 0 && extract::MayHoldText(found.name)) {
    file = OpenFile(dir_fd, found);
    if (!file && HasVanished(errno)) return;
    if (!file) ++tree_.Counted().failed;
  }
  lane_.Submit({.folder = folder,
                .document = std::move(*document),
                .stamp = found.KeptStamp(),
                .file = std::move(file)});
}

/// A folder that is new here and gone elsewhere was moved: one row, and its documents stay.
bool Updater::Adopt(int dir_fd, Folder& folder, const Found& found) {
  const std::string name(found.name);
  if (!moves_.Adopt(found.stamp.inode, folder, name)) return false;
  Refresh(dir_fd, folder, *folder.Find(name), found);
  return true;
}

void Updater::TakeIn(int dir_fd, Folder& folder, const Found& found) {
  if (Adopt(dir_fd, folder, found)) return;
  const std::optional<Document> document = Describe(dir_fd, folder.id, found);
  if (document) tree_.AddFolder(folder, *document, found.KeptStamp());
}

void Updater::Proceed() {
  lane_.Collect();
  tree_.CommitIfDue();
}

void Updater::NoteUnreadable(const std::string& path) {
  ++tree_.Counted().unreadable;
  if (std::exchange(noted_unreadable_, true)) return;
  MARU_LOG("Cannot read folder [%s]; further ones are counted only", path.c_str());
}

}  // namespace maru::indexer
