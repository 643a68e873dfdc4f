#include "indexer/tree/tree.h"

#include <algorithm>
#include <thread>
#include <utility>

#include "indexer/tree/listing.h"
#include "system/log.h"

namespace maru::indexer {
namespace {

using index::DirectoryId;
using index::Document;
using index::Entry;
using index::Prepared;
using index::Stamp;

bool ByName(const Entry& a, const Entry& b) {
  return a.name < b.name;
}

}  // namespace

void Folder::Add(Entry entry) {
  added.push_back(std::move(entry));
  changed = true;
}

void Folder::Merge() {
  if (!changed) return;
  std::erase_if(entries, [](const Entry& entry) { return entry.document == 0; });
  std::sort(added.begin(), added.end(), ByName);
  const auto middle = static_cast<std::ptrdiff_t>(entries.size());
  entries.insert(entries.end(), std::make_move_iterator(added.begin()),
                 std::make_move_iterator(added.end()));
  std::inplace_merge(entries.begin(), entries.begin() + middle, entries.end(), ByName);
  added.clear();
}

Entry* Folder::Find(std::string_view name) {
  const auto place = std::lower_bound(
      entries.begin(), entries.end(), name,
      [](const Entry& entry, std::string_view sought) { return entry.name < sought; });
  return place != entries.end() && place->name == name ? &*place : nullptr;
}

Tree::Tree(const std::string& index_folder, Counts& counts, FolderListener* listener)
    : writer_(index_folder),
      counts_(counts),
      listener_(listener),
      last_commit_(std::chrono::steady_clock::now() - kCommitGap),
      is_fresh_(!HasRoot()) {}

Tree::~Tree() {
  try {
    Commit();
  } catch (const std::exception& error) {
    MARU_LOG("The last changes of an index are lost until its next crawl: %s", error.what());
  }
}

FolderHandle Tree::Open(DirectoryId id) {
  FolderHandle& folder = open_[id];
  if (!folder) {
    folder = std::make_shared<Folder>();
    folder->id = id;
    folder->entries = writer_.Entries(id);
    for (const Entry& entry : folder->entries) {
      if (entry.directory != 0) SetParent(entry.directory, id);
    }
  }
  folder->Merge();
  return folder;
}

FolderHandle Tree::Enter(int dir_fd, DirectoryId id) {
  if (listener_) listener_->Entering(dir_fd, id);
  CloseUnused();
  return Open(id);
}

void Tree::Met(int dir_fd, const Folder& folder, std::span<const Found> found) {
  if (!listener_) return;
  for (const Found& file : found) {
    if (file.is_elsewhere) listener_->MetElsewhere(dir_fd, folder.id, file);
  }
}

DirectoryId Tree::ParentOf(DirectoryId id) const {
  return id < parents_.size() ? parents_[id] : 0;
}

std::size_t Tree::DepthOf(DirectoryId id) const {
  std::size_t depth = 0;
  while ((id = ParentOf(id)) != 0) ++depth;
  return depth;
}

void Tree::SetParent(DirectoryId id, DirectoryId parent) {
  if (id >= parents_.size()) parents_.resize(id + 1);
  parents_[id] = parent;
}

void Tree::Write(Folder& folder) {
  folder.Merge();
  if (folder.changed) writer_.SetEntries(folder.id, folder.entries);
  folder.changed = false;
}

void Tree::CloseUnused() {
  std::erase_if(open_, [this](const auto& item) {
    const FolderHandle& folder = item.second;
    if (folder.use_count() > 1) return false;
    Write(*folder);
    return true;
  });
}

void Tree::SetRoot(const Document& document, const Stamp& stamp) {
  Entry root = writer_.Root();
  if (root.document == 0) {
    root.directory = writer_.AddDirectory(0, {}, document.rights);
    root.document = writer_.Add(Prepared(document));
    ++counts_.added;
  } else {
    writer_.SetDirectory(root.directory, 0, {}, document.rights);
    writer_.Update(root.document, document);
    ++counts_.changed;
  }
  root.name = document.name;
  root.stamp = stamp;
  writer_.SetRoot(root);
}

void Tree::AddFile(Folder& folder, Prepared prepared, const std::string& name, const Stamp& stamp) {
  folder.Add({name, writer_.Add(std::move(prepared)), 0, stamp});
  ++counts_.added;
}

void Tree::ReplaceFile(Folder& folder, Entry& entry, Prepared prepared, const Stamp& stamp) {
  writer_.Replace(entry.document, std::move(prepared));
  entry.stamp = stamp;
  folder.changed = true;
  ++counts_.changed;
}

void Tree::AddFolder(Folder& folder, const Document& document, const Stamp& stamp) {
  const DirectoryId id = writer_.AddDirectory(folder.id, document.name, document.rights);
  folder.Add({document.name, writer_.Add(Prepared(document)), id, stamp});
  SetParent(id, folder.id);
  ++counts_.added;
}

void Tree::Update(Folder& folder, Entry& entry, const Document& document, const Stamp& stamp) {
  if (entry.directory != 0) {
    writer_.SetDirectory(entry.directory, folder.id, document.name, document.rights);
  }
  writer_.Update(entry.document, document);
  entry.name = document.name;
  entry.stamp = stamp;
  folder.changed = true;
  ++counts_.changed;
}

void Tree::RemoveFile(Folder& folder, Entry& entry) {
  writer_.Remove(entry.document);
  entry.document = 0;
  folder.changed = true;
  ++counts_.removed;
}

void Tree::Forget(DirectoryId id) {
  open_.erase(id);
  writer_.RemoveDirectory(id);
  SetParent(id, 0);
  if (listener_) listener_->Removed(id);
}

void Tree::RemoveFolder(Folder& folder, const std::string& name) {
  const Entry* top = folder.Find(name);
  if (!top || top->directory == 0) return;
  // From the leaves up and without recursion: a commit meanwhile leaves nothing without a folder.
  std::vector<FolderHandle> way{Open(top->directory)};
  while (!way.empty()) {
    CommitIfDue();
    std::vector<Entry>& entries = way.back()->entries;
    if (!entries.empty() && entries.back().directory != 0) {
      way.push_back(Open(entries.back().directory));
      continue;
    }
    if (entries.empty()) {
      Forget(way.back()->id);
      way.pop_back();
    }
    if (way.empty()) break;
    RemoveFile(*way.back(), way.back()->entries.back());
    way.back()->entries.pop_back();
  }
  RemoveFile(folder, *folder.Find(name));
  folder.Merge();
}

bool Tree::Move(Folder& from, const std::string& name, Folder& to, const std::string& to_name) {
  from.Merge();
  to.Merge();
  Entry* entry = from.Find(name);
  if (!entry || to.Find(to_name)) return false;
  Entry moved = *entry;
  entry->document = 0;
  from.changed = true;
  from.Merge();
  moved.name = to_name;
  SetParent(moved.directory, to.id);
  to.Add(std::move(moved));
  to.Merge();
  return true;
}

void Tree::CommitIfDue() {
  if (writer_.Pending() == 0) return;
  const auto age = std::chrono::steady_clock::now() - last_commit_;
  const std::chrono::seconds most = is_fresh_ ? kFirstCommit : kCommitAge;
  if (writer_.Pending() >= kCommitBytes || age >= most) Commit();
}

void Tree::Commit() {
  for (auto& [id, folder] : open_) Write(*folder);
  if (writer_.Pending() == 0) return;
  std::this_thread::sleep_until(last_commit_ + kCommitGap);
  writer_.Commit();
  last_commit_ = std::chrono::steady_clock::now();
  is_fresh_ = false;
}

}  // namespace maru::indexer
