#include "indexer/catalog.h"

#include <algorithm>
#include <thread>
#include <utility>

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

Entry* Folder::Find(std::string_view name) {
  const auto place = std::lower_bound(
      entries.begin(), entries.end(), name,
      [](const Entry& entry, std::string_view sought) { return entry.name < sought; });
  return place != entries.end() && place->name == name ? &*place : nullptr;
}

void Folder::Settle() {
  if (added.empty()) return;
  std::sort(added.begin(), added.end(), ByName);
  const auto middle = static_cast<std::ptrdiff_t>(entries.size());
  entries.insert(entries.end(), std::make_move_iterator(added.begin()),
                 std::make_move_iterator(added.end()));
  std::inplace_merge(entries.begin(), entries.begin() + middle, entries.end(), ByName);
  added.clear();
  changed = true;
}

Catalog::Catalog(const std::string& index_folder, Counts& counts, FolderListener* listener)
    : writer_(index_folder),
      counts_(counts),
      listener_(listener),
      last_commit_(std::chrono::steady_clock::now() - kCommitGap),
      is_fresh_(!writer_.HasRoot()) {}

Catalog::~Catalog() {
  try {
    Commit();
  } catch (const std::exception& error) {
    MARU_LOG("The last changes of an index are lost until its next crawl: %s", error.what());
  }
}

Folder& Catalog::Open(DirectoryId id) {
  std::unique_ptr<Folder>& folder = open_[id];
  if (!folder) {
    folder = std::make_unique<Folder>();
    folder->id = id;
    folder->entries = writer_.Entries(id);
  }
  ++folder->users;
  return *folder;
}

void Catalog::Close(Folder& folder) {
  if (--folder.users > 0) return;
  Write(folder);
  open_.erase(folder.id);
}

void Catalog::Write(Folder& folder) {
  folder.Settle();
  std::erase_if(folder.entries, [](const Entry& entry) { return entry.document == 0; });
  if (folder.changed) writer_.SetEntries(folder.id, folder.entries);
  folder.changed = false;
}

void Catalog::AddRoot(const Document& document, const Stamp& stamp) {
  const DirectoryId id = writer_.AddDirectory(0, {}, document.rights);
  writer_.SetRoot({document.name, writer_.Add(Prepared(document)), id, stamp});
  ++counts_.added;
}

void Catalog::UpdateRoot(const Document& document, const Stamp& stamp) {
  Entry root = writer_.Root();
  writer_.SetDirectory(root.directory, 0, {}, document.rights);
  writer_.Update(root.document, document);
  root.name = document.name;
  root.stamp = stamp;
  writer_.SetRoot(root);
  ++counts_.changed;
}

void Catalog::AddFile(Folder& folder, Prepared prepared, const std::string& name,
                      const Stamp& stamp) {
  folder.added.push_back({name, writer_.Add(std::move(prepared)), 0, stamp});
  folder.changed = true;
  ++counts_.added;
}

void Catalog::ReplaceFile(Folder& folder, Entry& entry, Prepared prepared, const Stamp& stamp) {
  writer_.Replace(entry.document, std::move(prepared));
  entry.stamp = stamp;
  folder.changed = true;
  ++counts_.changed;
}

DirectoryId Catalog::AddFolder(Folder& folder, const Document& document, const Stamp& stamp) {
  const DirectoryId id = writer_.AddDirectory(folder.id, document.name, document.rights);
  folder.added.push_back({document.name, writer_.Add(Prepared(document)), id, stamp});
  folder.changed = true;
  ++counts_.added;
  if (listener_) listener_->Placed(id, folder.id, document.name);
  return id;
}

void Catalog::Update(Folder& folder, Entry& entry, const Document& document, const Stamp& stamp) {
  if (entry.directory != 0) {
    writer_.SetDirectory(entry.directory, folder.id, document.name, document.rights);
    if (listener_) listener_->Placed(entry.directory, folder.id, document.name);
  }
  writer_.Update(entry.document, document);
  entry.name = document.name;
  entry.stamp = stamp;
  folder.changed = true;
  ++counts_.changed;
}

void Catalog::RemoveFile(Folder& folder, const Entry& entry) {
  writer_.Remove(entry.document);
  folder.changed = true;
  ++counts_.removed;
}

/// Takes the last entry of the last folder away, or opens it when something may lie in it.
void Catalog::RemoveStep(std::vector<Folder*>& way) {
  Folder& folder = *way.back();
  const Entry& entry = folder.entries.back();
  if (entry.directory != 0) {
    way.push_back(&Open(entry.directory));
    way.back()->Settle();
    return;
  }
  RemoveFile(folder, entry);
  folder.entries.pop_back();
}

void Catalog::RemoveTree(Folder& folder, const std::string& name) {
  const Entry* top = folder.Find(name);
  if (!top || top->directory == 0) return;
  std::vector<Folder*> way{&Open(top->directory)};
  way.back()->Settle();
  while (!way.empty()) {
    CommitIfDue({});
    if (!way.back()->entries.empty()) {
      RemoveStep(way);
      continue;
    }
    const DirectoryId id = way.back()->id;
    way.back()->changed = false;
    Close(*way.back());
    way.pop_back();
    writer_.RemoveDirectory(id);
    if (listener_) listener_->Removed(id);
    Folder& above = way.empty() ? folder : *way.back();
    Entry* entry = way.empty() ? above.Find(name) : &above.entries.back();
    RemoveFile(above, *entry);
    above.entries.erase(above.entries.begin() + (entry - above.entries.data()));
  }
}

bool Catalog::Move(Folder& from, const std::string& name, Folder& to, const std::string& to_name) {
  from.Settle();
  to.Settle();
  Entry* entry = from.Find(name);
  if (!entry || to.Find(to_name)) return false;
  Entry moved = std::move(*entry);
  from.entries.erase(from.entries.begin() + (entry - from.entries.data()));
  from.changed = true;
  moved.name = to_name;
  to.added.push_back(std::move(moved));
  to.Settle();
  return true;
}

void Catalog::CommitIfDue(const Bounds& bounds) {
  if (writer_.Pending() == 0) return;
  const auto age = std::chrono::steady_clock::now() - last_commit_;
  const std::chrono::milliseconds time = is_fresh_ ? kFirstCommit : bounds.time;
  if (writer_.Pending() >= bounds.bytes || age >= time) Commit();
}

void Catalog::Commit() {
  for (auto& [id, folder] : open_) Write(*folder);
  if (writer_.Pending() == 0) return;
  std::this_thread::sleep_until(last_commit_ + kCommitGap);
  writer_.Commit();
  last_commit_ = std::chrono::steady_clock::now();
  is_fresh_ = false;
}

}  // namespace maru::indexer
