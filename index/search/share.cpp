#include "index/search/share.h"

#include <sys/stat.h>

#include <optional>

#include "index/store/engine.h"

namespace maru::index {
namespace {

/// Each spares a search the 40 microseconds of opening a database, at the price of some
/// descriptors.
constexpr std::size_t kIdleHandles = 16;

Share::Version VersionOf(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return {};
  return {IdOf(status),
          status.st_ctim.tv_sec * std::int64_t{1'000'000'000} + status.st_ctim.tv_nsec};
}

FileId FolderOf(const std::string& path) {
  return VersionOf(path).file;
}

}  // namespace

Share::Share(const std::string& folder, std::shared_ptr<Cache> cache)
    : path_(folder + kDatabaseFolder),
      folder_(FolderOf(path_)),
      cache_(std::move(cache)),
      texts_(folder) {}

bool Share::IsCurrent() const {
  return FolderOf(path_) == folder_;
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
  const Version version = VersionOf(path_ + kVersionFile);
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
