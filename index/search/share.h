#pragma once

#include <xapian.h>

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "index/search/cache.h"
#include "index/search/reader.h"
#include "index/search/snapshot.h"
#include "index/store/texts.h"
#include "system/file_id.h"

namespace maru::index {

/// One index folder: its newest snapshot, handles that wait to be used again, its stored texts.
/// Thread-safe. Throws the engine's errors.
class Share {
 public:
  Share(const std::string& folder, std::shared_ptr<Cache> cache);

  /// Tells a version file from the one that took its place, which may have got its inode.
  struct Version {
    FileId file;
    std::int64_t changed_ns = 0;

    friend bool operator==(const Version&, const Version&) = default;
  };
  /// A handle on the newest commit, with the snapshot of it.
  struct Handle {
    Xapian::Database database;
    /// Of the version file, when the handle was last moved to the newest commit.
    Version version;
    std::shared_ptr<const Snapshot> snapshot;
  };
  Handle Take();
  void GiveBack(Handle handle);

  TextReader& Texts() { return texts_; }
  /// Whether the folder still holds the database that it held, and not one made anew.
  bool IsCurrent() const;

 private:
  std::shared_ptr<const Snapshot> SnapshotOf(const Xapian::Database& database);

  const std::string path_;
  const FileId folder_;
  const std::shared_ptr<Cache> cache_;
  TextReader texts_;
  std::mutex mutex_;
  /// The engine's of the database.
  std::string name_;
  std::shared_ptr<const Snapshot> newest_;
  std::vector<Handle> idle_;
};

}  // namespace maru::index
