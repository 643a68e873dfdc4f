#include "index/library.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>

#include "index/engine.h"
#include "index/reader_impl.h"

namespace maru::index {
namespace {

/// Pairs of table and identity whose eyes are kept per index.
constexpr std::size_t kKnownEyes = 64;
/// Idle handles kept per set of indices, and sets kept.
constexpr std::size_t kIdleHandles = 16;
constexpr std::size_t kIdleSets = 64;

}  // namespace

std::shared_ptr<const DirectoryTable> SharedIndex::Table(const Xapian::Database& database) {
  const MetadataReader read = [&](const std::string& key) { return database.get_metadata(key); };
  const std::string engine_name = database.get_uuid();
  const std::string commit = read("commit");
  const std::lock_guard lock(mutex_);
  const bool same = table_ && engine_name_ == engine_name;
  if (same && !commit.empty() && Decoder(commit).Number32() == table_->Commit()) return table_;
  // An older state than the table's: some other handle went ahead meanwhile; loaded apart.
  const bool ahead = same && (commit.empty() || Decoder(commit).Number32() < table_->Commit());
  auto table = same && !ahead ? std::make_shared<DirectoryTable>(*table_)
                              : std::make_shared<DirectoryTable>();
  table->Load(read);
  if (ahead) return table;
  table_ = table;
  engine_name_ = engine_name;
  decoded_table_ = nullptr;
  decoded_ = nullptr;
  known_.clear();
  return table_;
}

std::shared_ptr<const Eyes> SharedIndex::EyesOf(const std::shared_ptr<const DirectoryTable>& table,
                                                const Identity& who, DocumentId last) {
  {
    const std::lock_guard lock(mutex_);
    for (const Known& known : known_) {
      if (known.table == table && known.who == who) return known.eyes;
    }
  }
  auto eyes = std::make_shared<const Eyes>(*table, who, last);
  const std::lock_guard lock(mutex_);
  if (known_.size() >= kKnownEyes) known_.erase(known_.begin());
  known_.push_back({table, who, eyes});
  return eyes;
}

std::shared_ptr<const Decoded> SharedIndex::DecodedOf(
    const std::shared_ptr<const DirectoryTable>& table, DocumentId last) {
  const std::lock_guard lock(mutex_);
  if (decoded_table_ == table) return decoded_;
  auto decoded = std::make_shared<const Decoded>(last);
  if (table == table_) {
    decoded_table_ = table;
    decoded_ = decoded;
  }
  return decoded;
}

FileIdentity FileIdentity::Of(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return {};
  return {status.st_dev, status.st_ino,
          status.st_ctim.tv_sec * std::int64_t{1'000'000'000} + status.st_ctim.tv_nsec};
}

OpenIndices::OpenIndices(std::vector<std::shared_ptr<SharedIndex>> indices) {
  auto numbers = std::make_shared<ShareNumbers>();
  for (auto& index : indices) {
    const std::string path = index->Folder() + kDatabaseFolder;
    FileIdentity folder = FileIdentity::Of(path);
    // Renamed and filled folders keep their inode: only that tells them apart.
    folder.changed_ns = 0;
    Xapian::Database database(path, Xapian::DB_BACKEND_GLASS);
    all_.add_database(database);
    (*numbers)[database.get_uuid()] = shares_.size();
    shares_.push_back({std::move(index), std::move(database), nullptr, folder, {}});
  }
  numbers_ = std::move(numbers);
  Refresh();
}

void OpenIndices::Refresh() {
  for (Share& share : shares_) {
    const std::string path = share.index->Folder() + kDatabaseFolder;
    FileIdentity folder = FileIdentity::Of(path);
    folder.changed_ns = 0;
    if (folder != share.folder) throw Xapian::DatabaseOpeningError("The index was made anew");
    // Every commit puts a new version file in place of the old one.
    const FileIdentity version = FileIdentity::Of(path + kVersionFile);
    if (share.table && version == share.version) continue;
    share.database.reopen();
    widened_.Clear();
    weighing_.reset();
    share.table = share.index->Table(share.database);
    share.version = version;
  }
  if (!weighing_) weighing_.emplace(all_);
}

struct Library::State {
  std::string path;
  std::mutex mutex;
  std::map<std::string, std::shared_ptr<SharedIndex>> indices;
  std::map<std::vector<std::string>, std::vector<std::unique_ptr<OpenIndices>>> idle;

  std::shared_ptr<SharedIndex> Index(const std::string& id) {
    const std::lock_guard lock(mutex);
    auto& index = indices[id];
    if (!index) index = std::make_shared<SharedIndex>(path + "/" + id);
    return index;
  }

  std::unique_ptr<OpenIndices> TakeIdle(const std::vector<std::string>& ids) {
    const std::lock_guard lock(mutex);
    const auto set = idle.find(ids);
    if (set == idle.end() || set->second.empty()) return nullptr;
    auto taken = std::move(set->second.back());
    set->second.pop_back();
    return taken;
  }

  void GiveBack(const std::vector<std::string>& ids, std::unique_ptr<OpenIndices> indices_open) {
    const std::lock_guard lock(mutex);
    if (idle.size() >= kIdleSets && !idle.contains(ids)) idle.clear();
    auto& set = idle[ids];
    if (set.size() < kIdleHandles) set.push_back(std::move(indices_open));
  }

  void Forget(const std::vector<std::string>& ids) {
    const std::lock_guard lock(mutex);
    idle.erase(ids);
    for (const std::string& id : ids) indices.erase(id);
  }
};

Library::Library(std::string path) : state_(std::make_shared<State>()) {
  state_->path = std::move(path);
}
Library::~Library() = default;

bool Library::Has(const std::string& index_id) const {
  if (index_id.empty() || index_id.find('/') != std::string::npos || index_id[0] == '.')
    return false;
  struct stat status {};
  const std::string database = state_->path + "/" + index_id + kDatabaseFolder;
  return stat(database.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

std::vector<std::string> Library::IndexIds() const {
  std::vector<std::string> ids;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator(state_->path, error)) {
    if (Has(entry.path().filename())) ids.push_back(entry.path().filename());
  }
  std::sort(ids.begin(), ids.end());
  return ids;
}

std::unique_ptr<Reader> Library::Open(const std::vector<std::string>& index_ids) {
  for (const std::string& id : index_ids) {
    if (!Has(id)) {
      throw maruseeker::Error(maruseeker::kErrorStorage, "There is no index " + id);
    }
  }
  const auto open = [&]() -> std::unique_ptr<OpenIndices> {
    if (auto idle = state_->TakeIdle(index_ids)) {
      try {
        idle->Refresh();
        return idle;
      } catch (const Xapian::DatabaseError&) {
        // The index was made anew or is gone: what was known of it is worth nothing.
        state_->Forget(index_ids);
      }
    }
    std::vector<std::shared_ptr<SharedIndex>> indices;
    for (const std::string& id : index_ids) indices.push_back(state_->Index(id));
    return std::make_unique<OpenIndices>(std::move(indices));
  };
  auto indices = WithEngine("Cannot open the index", open);
  return std::make_unique<EngineReader>(
      std::move(indices), [state = state_, index_ids](std::unique_ptr<OpenIndices> used) {
        state->GiveBack(index_ids, std::move(used));
      });
}

}  // namespace maru::index
