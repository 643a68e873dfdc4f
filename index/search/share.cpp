#include "index/search/share.h"

#include <sys/stat.h>

#include <optional>

#include "index/store/engine.h"

namespace maru::index {
namespace {

constexpr std::size_t kIdleHandles = 16;

/// Renamed and filled folders keep their inode: only that tells them apart.
FileIdentity FolderIdentity(const std::string& path) {
  FileIdentity folder = FileIdentity::Of(path);
  folder.changed_ns = 0;
  return folder;
}

}  // namespace

FileIdentity FileIdentity::Of(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return {};
  return {status.st_dev, status.st_ino,
          status.st_ctim.tv_sec * std::int64_t{1'000'000'000} + status.st_ctim.tv_nsec};
}

Share::Share(const std::string& folder, std::shared_ptr<Cache> cache)
    : path_(folder + kDatabaseFolder),
      folder_(FolderIdentity(path_)),
      cache_(std::move(cache)),
      texts_(folder) {}

bool Share::IsCurrent() const {
  return FolderIdentity(path_) == folder_;
}

/// Of the commit that `database` is at: the newest one, or one made from it.
std::shared_ptr<const Snapshot> Share::SnapshotOf(const Xapian::Database& database) {
  const std::lock_guard lock(mutex_);
  if (name_.empty()) name_ = database.get_uuid();
  if (name_ != database.get_uuid()) throw Xapian::DatabaseOpeningError("The index was made anew");
  const std::uint32_t commit = Snapshot::CommitOf(database);
  if (newest_ && commit == newest_->Commit()) return newest_;
  // Another thread's handle went ahead meanwhile.
  if (newest_ && commit < newest_->Commit()) {
    return std::make_shared<const Snapshot>(database, nullptr, cache_);
  }
  newest_ = std::make_shared<const Snapshot>(database, newest_.get(), cache_);
  return newest_;
}

Share::Handle Share::Take() {
  std::optional<Handle> handle;
  {
    const std::lock_guard lock(mutex_);
    if (!idle_.empty()) {
      handle = std::move(idle_.back());
      idle_.pop_back();
    }
  }
  // Every commit puts a new version file in place of the old one. Looked at before the database: a
  // commit in between is met the next time.
  const FileIdentity version = FileIdentity::Of(path_ + kVersionFile);
  if (handle && handle->version == version) return std::move(*handle);
  if (handle) {
    handle->database.reopen();
  } else {
    handle = Handle{Xapian::Database(path_, Xapian::DB_BACKEND_GLASS), {}, nullptr};
  }
  handle->version = version;
  handle->snapshot = SnapshotOf(handle->database);
  return std::move(*handle);
}

void Share::GiveBack(Handle handle) {
  const std::lock_guard lock(mutex_);
  if (idle_.size() < kIdleHandles) idle_.push_back(std::move(handle));
}

}  // namespace maru::index
