#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "index/store/document.h"

namespace marudbquery {
class Session;
}

namespace maru::daemon {

/// A file that was opened from a search result, with what that adds to its score.
struct OpenedFile {
  std::string index_id;
  index::DocumentId document = 0;
  /// Within the share, as it was when last opened.
  std::string path;
  double boost = 0;
};

/// Whether a document found under its id again is still the file that was opened: its name or its
/// folder is as it was. (An index made anew gives its ids out again.)
bool IsSameFile(std::string_view opened_path, std::string_view present_path);

/// What each user opened, how often and when, fading with a half-life of kHalfLife; nobody's
/// openings are told to others, whose files they may not be. In memory for
/// searches and in a database of its own for restarts; each opening is stored before Record
/// returns (written ahead, without waiting for the disk: lost at most by a failing machine).
/// Thread-safe.
class UsageStore {
 public:
  static constexpr std::int64_t kHalfLife = 30 * 24 * 3600;
  /// Files remembered per user, and users.
  static constexpr std::size_t kMaxFiles = 200;
  static constexpr std::size_t kMaxUsers = 5'000;
  /// Files that one search boosts.
  static constexpr std::size_t kMaxBoosted = 32;

  using Clock = std::function<std::int64_t()>;

  /// Opens or makes the database file. One that cannot be used is logged: then searches are not
  /// boosted and Record fails.
  explicit UsageStore(const std::string& path, Clock clock = nullptr);
  ~UsageStore();

  /// One more opening by this user. Throws Error (121) when it cannot be stored.
  void Record(uid_t uid, const std::string& index_id, index::DocumentId document,
              const std::string& path);

  /// The files of these indices that the user opened, the highest boost first: 0.5 for what was
  /// opened once just now, never 1.
  std::vector<OpenedFile> OpenedBy(uid_t uid, const std::vector<std::string>& index_ids) const;

  /// Rows kept, of everybody.
  std::size_t Size() const;

 private:
  using Key = std::pair<std::string, index::DocumentId>;
  struct Row {
    std::string path;
    std::int64_t count = 0;
    /// Openings, faded to the moment `time`.
    double weight = 0;
    std::int64_t time = 0;
  };
  using Files = std::map<Key, Row>;

  void Load();
  void Add(uid_t uid, const Key& key, const std::string& path);
  void ForgetOldestUser();
  void StoreRow(uid_t uid, const Key& key, const Row& row);
  void DeleteRow(uid_t uid, const Key& key);
  double Faded(const Row& row, std::int64_t now) const;

  Clock clock_;
  mutable std::mutex mutex_;
  /// Null when the database cannot be used.
  std::unique_ptr<marudbquery::Session> session_;
  /// By user id.
  std::map<uid_t, Files> files_;
};

}  // namespace maru::daemon
