#include "daemon/core/usage.h"

#include <algorithm>
#include <cmath>
#include <ctime>
#include <functional>
#include <set>

#include "common/error.h"
#include "history/marudbquery.h"
#include "system/log.h"

namespace maru::daemon {
namespace {

/// Of this id, which is nobody's, earlier versions kept rows: all users' together.
constexpr long long kEverybody = 4294967295;

constexpr const char* kSchema =
    "CREATE TABLE IF NOT EXISTS opened ("
    "uid BIGINT NOT NULL, index_id TEXT NOT NULL, document BIGINT NOT NULL, path TEXT NOT NULL, "
    "count BIGINT NOT NULL, weight DOUBLE PRECISION NOT NULL, time BIGINT NOT NULL, "
    "PRIMARY KEY (uid, index_id, document))";

std::string_view FolderOf(std::string_view path) {
  return path.substr(0, path.rfind('/'));
}

maruseeker::Error StoreFailed(const char* why) {
  return maruseeker::Error(maruseeker::kErrorStorage,
                           std::string("The opening cannot be stored: ") + why);
}

}  // namespace

bool IsSameFile(std::string_view opened_path, std::string_view present_path) {
  const std::string_view opened_folder = FolderOf(opened_path);
  const std::string_view present_folder = FolderOf(present_path);
  return opened_folder == present_folder ||
         opened_path.substr(opened_folder.size()) == present_path.substr(present_folder.size());
}

UsageStore::UsageStore(const std::string& path, Clock clock)
    : clock_(clock ? std::move(clock) : [] { return std::int64_t{std::time(nullptr)}; }) {
  try {
    session_ = std::make_unique<marudbquery::Session>("sqlite3://" + path, kSchema);
    session_->Open() << "PRAGMA synchronous = NORMAL";
    session_->Open() << "DELETE FROM opened WHERE uid = :u", soci::use(kEverybody);
    Load();
  } catch (const std::exception& error) {
    MARU_LOG("Opened files are not remembered: %s: %s", path.c_str(), error.what());
    session_.reset();
    files_.clear();
  }
}

UsageStore::~UsageStore() = default;

void UsageStore::Load() {
  long long uid = 0, document = 0, count = 0, time = 0;
  double weight = 0;
  std::string index_id, path;
  soci::statement rows =
      (session_->Open().prepare
           << "SELECT uid, index_id, document, path, count, weight, time FROM opened",
       soci::into(uid), soci::into(index_id), soci::into(document), soci::into(path),
       soci::into(count), soci::into(weight), soci::into(time));
  rows.execute();
  while (rows.fetch()) {
    files_[static_cast<uid_t>(uid)][{index_id, static_cast<index::DocumentId>(document)}] = {
        path, count, weight, time};
  }
}

double UsageStore::Faded(const Row& row, std::int64_t now) const {
  const auto age = static_cast<double>(std::max<std::int64_t>(now - row.time, 0));
  return row.weight * std::exp2(-age / static_cast<double>(kHalfLife));
}

void UsageStore::StoreRow(uid_t user, const Key& key, const Row& row) {
  const long long uid = user, document = key.second, count = row.count, time = row.time;
  session_->Open() << "INSERT OR REPLACE INTO opened (uid, index_id, document, path, count, "
                      "weight, time) VALUES (:u, :i, :d, :p, :c, :w, :t)",
      soci::use(uid), soci::use(key.first), soci::use(document), soci::use(row.path),
      soci::use(count), soci::use(row.weight), soci::use(time);
}

void UsageStore::DeleteRow(uid_t user, const Key& key) {
  const long long uid = user, document = key.second;
  session_->Open() << "DELETE FROM opened WHERE uid = :u AND index_id = :i AND document = :d",
      soci::use(uid), soci::use(key.first), soci::use(document);
}

void UsageStore::Add(uid_t uid, const Key& key, const std::string& path) {
  const std::int64_t now = clock_();
  Files& files = files_[uid];
  if (!files.contains(key) && files.size() >= kMaxFiles) {
    const auto weakest = std::min_element(files.begin(), files.end(), [&](auto& a, auto& b) {
      return Faded(a.second, now) < Faded(b.second, now);
    });
    DeleteRow(uid, weakest->first);
    files.erase(weakest);
  }
  Row row = files[key];
  row = {path, row.count + 1, Faded(row, now) + 1, now};
  StoreRow(uid, key, row);
  files[key] = row;
}

/// The user whose last opening is the longest ago.
void UsageStore::ForgetOldestUser() {
  const auto newest = [](const Files& files) {
    std::int64_t time = 0;
    for (const auto& [key, row] : files) time = std::max(time, row.time);
    return time;
  };
  const auto oldest = std::min_element(
      files_.begin(), files_.end(),
      [&](const auto& a, const auto& b) { return newest(a.second) < newest(b.second); });
  const long long uid = oldest->first;
  session_->Open() << "DELETE FROM opened WHERE uid = :u", soci::use(uid);
  files_.erase(oldest);
}

void UsageStore::Record(uid_t uid, const std::string& index_id, index::DocumentId document,
                        const std::string& path) {
  const std::lock_guard lock(mutex_);
  if (!session_) throw StoreFailed("there is no database");
  std::string why;
  const bool stored = session_->Transaction(
      [&] {
        if (!files_.contains(uid) && files_.size() >= kMaxUsers) ForgetOldestUser();
        Add(uid, {index_id, document}, path);
        return true;
      },
      why);
  if (!stored) throw StoreFailed(why.c_str());
}

std::vector<OpenedFile> UsageStore::OpenedBy(uid_t uid,
                                             const std::vector<std::string>& index_ids) const {
  std::vector<OpenedFile> opened;
  const std::lock_guard lock(mutex_);
  const auto files = files_.find(uid);
  if (files == files_.end()) return opened;
  const std::set<std::string_view> wanted(index_ids.begin(), index_ids.end());
  const std::int64_t now = clock_();
  for (const auto& [key, row] : files->second) {
    if (!wanted.contains(key.first)) continue;
    const double weight = Faded(row, now);
    opened.push_back({key.first, key.second, row.path, weight / (1 + weight)});
  }
  std::ranges::stable_sort(opened, std::greater(), &OpenedFile::boost);
  return opened;
}

std::size_t UsageStore::Size() const {
  const std::lock_guard lock(mutex_);
  std::size_t rows = 0;
  for (const auto& [uid, files] : files_) rows += files.size();
  return rows;
}

}  // namespace maru::daemon
