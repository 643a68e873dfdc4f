#include "index/search/library.h"

#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <map>
#include <mutex>

#include "index/search/view_state.h"

namespace maru::index {
namespace {

/// Bytes kept of all indices together. With nothing kept, a common word takes seven times as long.
constexpr std::size_t kCacheBytes = 64u << 20;

}  // namespace

class Library::State {
 public:
  explicit State(std::string path) : path_(std::move(path)) {}

  const std::string& Path() const { return path_; }
  Cache::Statistics Cached() const { return cache_->Numbers(); }

  /// What is known of an index; forgotten when it was made anew, or cannot be read.
  std::shared_ptr<Share> ShareOf(const std::string& id, bool forget = false) {
    const std::lock_guard lock(mutex_);
    auto& share = shares_[id];
    if (!share || forget || !share->IsCurrent()) {
      share = std::make_shared<Share>(path_ + "/" + id, cache_);
    }
    return share;
  }

 private:
  const std::string path_;
  const std::shared_ptr<Cache> cache_ = std::make_shared<Cache>(kCacheBytes);
  std::mutex mutex_;
  std::map<std::string, std::shared_ptr<Share>> shares_;
};

View::State::State(std::vector<std::string> ids, std::vector<std::shared_ptr<Share>> shares,
                   std::vector<Identity> who, IsCancelled cancelled)
    : ids_(std::move(ids)),
      shares_(std::move(shares)),
      who_(std::move(who)),
      cancelled_(std::move(cancelled)) {
  Open();
}

View::State::~State() {
  GiveBack();
}

void View::State::Open() {
  handles_.reserve(shares_.size());
  sights_.reserve(shares_.size());
  for (const auto& share : shares_) {
    const Share::Handle& handle = handles_.emplace_back(share->Take());
    Reader reader(handle.snapshot, handle.database, share->Texts());
    const Identity& who = who_[sights_.size()];
    auto eyes = who.unrestricted ? nullptr : Eyes::Of(reader, who);
    sights_.emplace_back(std::move(reader), std::move(eyes), [this] { PollCancelled(); });
  }
}

void View::State::GiveBack() {
  sights_.clear();
  for (std::size_t share = 0; share < handles_.size(); ++share) {
    shares_[share]->GiveBack(std::move(handles_[share]));
  }
  handles_.clear();
}

void View::State::Renew() {
  for (Share::Handle& handle : handles_) handle.version = {};
  GiveBack();
  Open();
}

void View::State::PollCancelled() const {
  if (cancelled_ && cancelled_()) throw Cancelled{};
}

Library::Library(std::string path) : state_(std::make_shared<State>(std::move(path))) {}
Library::~Library() = default;

bool Library::Has(const std::string& index_id) const {
  if (index_id.empty() || index_id.find('/') != std::string::npos || index_id[0] == '.')
    return false;
  struct stat status {};
  const std::string database = state_->Path() + "/" + index_id + kDatabaseFolder;
  return stat(database.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

std::vector<std::string> Library::IndexIds() const {
  std::vector<std::string> ids;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator(state_->Path(), error)) {
    if (Has(entry.path().filename())) ids.push_back(entry.path().filename());
  }
  std::sort(ids.begin(), ids.end());
  return ids;
}

std::unique_ptr<View> Library::Open(const std::vector<std::string>& index_ids, const Identity& who,
                                    IsCancelled cancelled) {
  std::vector<IndexFor> indices;
  for (const std::string& id : index_ids) indices.push_back({id, who});
  return Open(indices, std::move(cancelled));
}

std::unique_ptr<View> Library::Open(const std::vector<IndexFor>& indices, IsCancelled cancelled) {
  std::vector<std::string> ids;
  std::vector<Identity> who;
  for (const IndexFor& index : indices) {
    if (!Has(index.id)) {
      throw maruseeker::Error(maruseeker::kErrorStorage, "There is no index " + index.id);
    }
    ids.push_back(index.id);
    who.push_back(index.who);
  }
  const auto open = [&](bool forget) {
    std::vector<std::shared_ptr<Share>> shares;
    for (const std::string& id : ids) shares.push_back(state_->ShareOf(id, forget));
    return std::make_unique<View>(
        std::make_unique<View::State>(ids, std::move(shares), who, cancelled));
  };
  return WithEngine("Cannot open the index", [&] {
    try {
      return open(false);
    } catch (const Xapian::DatabaseError&) {
      // The index was made anew or is gone: what was known of it is worth nothing.
      return open(true);
    }
  });
}

Library::Kept Library::Cached() const {
  const Cache::Statistics numbers = state_->Cached();
  return {numbers.bytes, numbers.entries, numbers.found, numbers.missed};
}

}  // namespace maru::index
