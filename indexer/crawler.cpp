#include "indexer/crawler.h"

#include <fcntl.h>
#include <malloc.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "indexer/extract/extractor.h"
#include "system/log.h"
#include "system/rights.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;
using index::Document;
using index::Entry;
using index::Writer;

/// New folders that wait for word of where they came from; more are taken as new at once.
constexpr std::size_t kMaxArrivals = 10'000;

/// Bytes read between two times that free memory is given back: what one thread allocates and
/// another frees leaves holes that would double the process.
constexpr std::uint64_t kTrimEvery = 16u << 20;

/// The file system says it is not there (any more), or not what it was.
bool HasVanished(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP || error == ENXIO || error == ESTALE;
}

bool SameContent(const index::Stamp& a, const index::Stamp& b) {
  return a.mtime_ns == b.mtime_ns && a.size == b.size && a.inode == b.inode;
}

bool IsOrphan(const Entry& entry) {
  return entry.name.find('/') != std::string::npos;
}

/// Fails with ENOENT when it is another file than was seen.
UniqueFd OpenFile(int place, const Found& found) {
  constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
  UniqueFd file(openat(place, found.name.data(), kFlags));
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

Crawler::Crawler(Catalog& catalog, Workers& workers, Counts& counts, const std::atomic<bool>& stop,
                 FolderListener* listener, const Catalog::Bounds& bounds)
    : catalog_(catalog),
      counts_(counts),
      stop_(stop),
      listener_(listener),
      bounds_(bounds),
      lane_(workers) {}

bool Crawler::CrawlShare(UniqueFd top, const std::string& share_name) {
  noted_unreadable_ = false;
  if (LooksUnmounted(top.Get())) {
    errno = 0;
    MARU_LOG("Share %s is empty and not the folder it was: left as it was indexed",
             share_name.c_str());
    return false;
  }
  defer_ = catalog_.Root().document != 0;
  if (!RefreshRoot(top.Get(), share_name)) return false;
  WalkFrom(OpenPath(top.Get(), {}), Writer::kRoot);
  Settle(top.Get());
  catalog_.Commit();
  return true;
}

bool Crawler::LooksUnmounted(int top) {
  const Entry root = catalog_.Root();
  if (root.document == 0 || root.stamp.inode == IdOf(top).inode) return false;
  Folder& folder = catalog_.Open(Writer::kRoot);
  const bool was_filled = !folder.entries.empty();
  catalog_.Close(folder);
  return was_filled && listing_.Read(top) && listing_.Entries().empty();
}

bool Crawler::RefreshRoot(int top, const std::string& share_name) {
  const Entry root = catalog_.Root();
  Found found;
  Document document;
  if (!Look(top, "", found) || !Describe(top, 0, found, document)) return false;
  document.name = share_name;
  if (root.document == 0) {
    catalog_.AddRoot(document, found.KeptStamp());
  } else if (root.stamp != found.stamp || root.name != share_name) {
    catalog_.UpdateRoot(document, found.KeptStamp());
  } else {
    ++counts_.unchanged;
  }
  return true;
}

void Crawler::Visit(int folder, DirectoryId id, std::vector<Child>& children) {
  if (listener_) listener_->Entering(folder, id);
  if (!listing_.Read(folder)) {
    NoteUnreadable(Path());
    return;
  }
  Folder& known = catalog_.Open(id);
  known.Settle();
  std::vector<Difference> differences = Compare(known, listing_.Entries());
  if (!differences.empty()) {
    Apply(folder, defer_ ? Path() : std::string(), known, differences);
    known.Settle();
  }
  for (const Entry& entry : known.entries) {
    if (entry.directory == 0 || IsOrphan(entry)) continue;
    children.push_back({entry.name, entry.directory});
    if (listener_) listener_->Placed(entry.directory, id, entry.name);
  }
  catalog_.Close(known);
  while (std::optional<Result> result = lane_.Take(false)) Complete(std::move(*result));
  catalog_.CommitIfDue(bounds_);
}

void Crawler::Unreadable(const Child& child) {
  if (!HasVanished(errno)) NoteUnreadable(child.name);
}

void Crawler::NoteUnreadable(const std::string& folder) {
  ++counts_.unreadable;
  if (!std::exchange(noted_unreadable_, true)) {
    MARU_LOG("Cannot read folder [%s]; further ones are counted only", folder.c_str());
  }
}

std::vector<Crawler::Difference> Crawler::Compare(const Folder& folder,
                                                  std::span<const Found> found) {
  std::vector<Difference> differences;
  const std::vector<Entry>& entries = folder.entries;
  std::size_t at = 0;
  std::size_t same = 0;
  for (const Found& here : found) {
    for (; at < entries.size() && entries[at].name < here.name; ++at) {
      differences.push_back({at, nullptr});
    }
    if (at == entries.size() || entries[at].name != here.name) {
      differences.push_back({Difference::kNone, &here});
      continue;
    }
    const bool is_same =
        here.type == FileType::kUnknown ||
        (entries[at].stamp == here.stamp && (entries[at].directory != 0) == here.IsFolder());
    if (is_same) {
      ++same;
    } else {
      differences.push_back({at, &here});
    }
    ++at;
  }
  for (; at < entries.size(); ++at) differences.push_back({at, nullptr});
  counts_.unchanged += same;
  return differences;
}

void Crawler::CrawlNames(int folder, const std::string& path, DirectoryId id,
                         const std::vector<std::string>& names) {
  defer_ = true;
  Folder& known = catalog_.Open(id);
  known.Settle();
  std::vector<Found> found(names.size());
  std::vector<Difference> differences;
  for (std::size_t i = 0; i < names.size(); ++i) {
    found[i].name = names[i];
    const bool is_here = Look(folder, names[i].c_str(), found[i]);
    if (!is_here && errno != 0 && !HasVanished(errno)) continue;
    const Entry* entry = known.Find(names[i]);
    if (entry && is_here && entry->stamp == found[i].stamp) continue;
    if (!entry && !is_here) continue;
    differences.push_back(
        {entry ? static_cast<std::size_t>(entry - known.entries.data()) : Difference::kNone,
         is_here ? &found[i] : nullptr});
  }
  Apply(folder, path, known, differences);
  catalog_.Close(known);
}

void Crawler::Apply(int place, const std::string& path, Folder& folder,
                    std::vector<Difference>& differences) {
  // What is in the list is dealt with first: later steps move entries about, and may commit.
  SplitReplaced(folder, differences);
  MatchRenames(place, path, folder, differences);
  std::erase_if(differences,
                [&](Difference& difference) { return ApplyInPlace(place, folder, difference); });
  std::erase_if(folder.entries, [](const Entry& entry) { return entry.document == 0; });
  folder.Settle();
  for (const Difference& difference : differences) {
    if (stop_) return;
    if (difference.found->IsFolder()) {
      MeetFolder(place, path, folder, *difference.found);
    } else {
      SubmitFile(place, folder, *difference.found);
    }
  }
}

/// Another folder under the name of one, or a file, is something new in place of what is gone.
void Crawler::SplitReplaced(const Folder& folder, std::vector<Difference>& differences) {
  for (std::size_t i = differences.size(); i > 0; --i) {
    Difference& difference = differences[i - 1];
    if (difference.entry == Difference::kNone || !difference.found) continue;
    const Entry& entry = folder.entries[difference.entry];
    const Found& found = *difference.found;
    const bool same_type = (entry.directory != 0) == found.IsFolder();
    if (same_type && (!found.IsFolder() || entry.stamp.inode == found.stamp.inode)) continue;
    difference.found = nullptr;
    differences.push_back({Difference::kNone, &found});
  }
}

/// Files and folders that have but another name in the same folder.
void Crawler::MatchRenames(int place, const std::string& path, Folder& folder,
                           std::vector<Difference>& differences) {
  std::unordered_map<std::uint64_t, Entry*> gone;
  for (const Difference& difference : differences) {
    if (difference.found) continue;
    Entry& entry = folder.entries[difference.entry];
    gone.emplace(entry.stamp.inode, &entry);
  }
  if (gone.empty()) return;
  for (Difference& difference : differences) {
    if (difference.entry != Difference::kNone) continue;
    const Found& found = *difference.found;
    const auto place_in_gone = gone.find(found.stamp.inode);
    if (place_in_gone == gone.end()) continue;
    Entry& entry = *place_in_gone->second;
    const bool same = found.IsFolder()
                          ? entry.directory != 0
                          : entry.directory == 0 && SameContent(entry.stamp, found.stamp);
    if (!same) continue;
    Entry renamed = entry;
    Refresh(place, folder, renamed, found);
    if (renamed.name != found.name) continue;
    folder.added.push_back(std::move(renamed));
    gone.erase(place_in_gone);
    entry.document = 0;
    difference.found = nullptr;
    // A walk comes to it by itself; else nobody looks into it, and what happened there before its
    // new name was known went unseen.
    if (found.IsFolder() && !walking_)
      arrivals_.push_back({path, folder.id, std::string(found.name)});
  }
}

/// True when that was all there is to do.
bool Crawler::ApplyInPlace(int place, Folder& folder, Difference& difference) {
  if (difference.entry == Difference::kNone) return !difference.found;
  Entry& entry = folder.entries[difference.entry];
  if (entry.document == 0) return true;
  if (const Found* found = difference.found) {
    if (!found->IsFolder() && !SameContent(entry.stamp, found->stamp)) return false;
    Refresh(place, folder, entry, *found);
    return true;
  }
  if (entry.directory != 0) {
    Orphaned(folder, entry);
  } else {
    catalog_.RemoveFile(folder, entry);
  }
  entry.document = 0;
  return true;
}

/// Keeps a folder that is gone from its place, under a name that no file can have, until it is
/// known whether it was moved. A run that ends before leaves it to the next, to which it is gone as
/// well.
void Crawler::Orphaned(Folder& folder, const Entry& entry) {
  Entry orphan = entry;
  if (!IsOrphan(entry)) orphan.name += '/' + std::to_string(entry.stamp.inode);
  orphans_[entry.stamp.inode] = {folder.id, orphan.name, entry.directory};
  folder.added.push_back(std::move(orphan));
  folder.changed = true;
}

void Crawler::Refresh(int place, Folder& folder, Entry& entry, const Found& found) {
  Document document;
  if (!Describe(place, folder.id, found, document)) return;
  catalog_.Update(folder, entry, document, found.KeptStamp());
}

bool Crawler::Describe(int place, DirectoryId parent, const Found& found,
                       Document& document) const {
  document.name = found.name;
  document.parent = parent;
  document.is_dir = found.IsFolder();
  document.size = document.is_dir ? 0 : found.stamp.size;
  document.mtime = found.ModTime();
  if (ReadFileRights(place, document.name.c_str(), document.rights)) return true;
  if (!HasVanished(errno)) MARU_LOG("Cannot read the rights of [%s]", document.name.c_str());
  return false;
}

void Crawler::SubmitFile(int place, Folder& folder, const Found& found) {
  Job job;
  if (found.type != FileType::kFile || !Describe(place, folder.id, found, job.document)) return;
  if (found.stamp.size > 0 && extract::MayHoldText(found.name)) {
    job.file = OpenFile(place, found);
    if (!job.file && HasVanished(errno)) return;
    if (!job.file) ++counts_.failed;
  }
  job.stamp = found.KeptStamp();
  while (!lane_.HasRoom()) Complete(*lane_.Take(true));
  job.folder = &catalog_.Open(folder.id);
  lane_.Submit(std::move(job));
}

void Crawler::Complete(Result result) {
  Folder& folder = *result.folder;
  if (result.failed) ++counts_.failed;
  counts_.bytes += result.bytes_read;
  read_since_trim_ += result.bytes_read;
  if (read_since_trim_ >= kTrimEvery) {
    read_since_trim_ = 0;
    malloc_trim(0);
  }
  if (Entry* entry = folder.Find(result.name)) {
    if (entry->directory == 0) {
      catalog_.ReplaceFile(folder, *entry, std::move(result.prepared), result.stamp);
    }
  } else {
    catalog_.AddFile(folder, std::move(result.prepared), result.name, result.stamp);
  }
  catalog_.Close(folder);
  catalog_.CommitIfDue(bounds_);
}

void Crawler::DrainAll() {
  while (std::optional<Result> result = lane_.Take(true)) Complete(std::move(*result));
}

void Crawler::MeetFolder(int place, const std::string& path, Folder& folder, const Found& found) {
  if (Adopt(place, folder, found)) return;
  if (defer_ && arrivals_.size() < kMaxArrivals) {
    arrivals_.push_back({path, folder.id, std::string(found.name)});
    return;
  }
  Document document;
  if (Describe(place, folder.id, found, document)) {
    catalog_.AddFolder(folder, document, found.KeptStamp());
  }
}

/// A folder that is new here and gone elsewhere was moved: one row, and its documents stay.
bool Crawler::Adopt(int place, Folder& folder, const Found& found) {
  const auto known = orphans_.find(found.stamp.inode);
  if (known == orphans_.end()) return false;
  const Orphan orphan = std::move(known->second);
  orphans_.erase(known);
  Folder& from = catalog_.Open(orphan.parent);
  const Entry* entry = from.Find(orphan.name);
  const std::string name(found.name);
  const bool moved =
      entry && entry->directory == orphan.id && catalog_.Move(from, orphan.name, folder, name);
  if (moved) Refresh(place, folder, *folder.Find(name), found);
  catalog_.Close(from);
  return moved;
}

void Crawler::Settle(int top) {
  defer_ = false;
  for (const Arrival& arrival : std::exchange(arrivals_, {})) {
    if (!stop_) Arrive(top, arrival);
  }
  DrainAll();
  for (const auto& [inode, orphan] : std::exchange(orphans_, {})) {
    if (stop_) break;
    Folder& folder = catalog_.Open(orphan.parent);
    const Entry* entry = folder.Find(orphan.name);
    if (entry && entry->directory == orphan.id) catalog_.RemoveTree(folder, orphan.name);
    catalog_.Close(folder);
  }
}

void Crawler::Arrive(int top, const Arrival& arrival) {
  const UniqueFd place = OpenPath(top, arrival.path);
  Found found;
  found.name = arrival.name;
  if (!place || !Look(place.Get(), arrival.name.c_str(), found) || !found.IsFolder()) return;
  Folder& folder = catalog_.Open(arrival.parent);
  folder.Settle();
  if (!folder.Find(arrival.name)) MeetFolder(place.Get(), arrival.path, folder, found);
  folder.Settle();
  const Entry* entry = folder.Find(arrival.name);
  const DirectoryId id = entry ? entry->directory : 0;
  catalog_.Close(folder);
  UniqueFd inside = OpenFolder(place.Get(), arrival.name.c_str());
  if (id != 0 && inside) WalkFrom(std::move(inside), id);
}

void Crawler::WalkFrom(UniqueFd folder, DirectoryId id) {
  // A file that is still under way would be taken for new once more.
  DrainAll();
  walking_ = true;
  Run(std::move(folder), id);
  walking_ = false;
}

}  // namespace maru::indexer
