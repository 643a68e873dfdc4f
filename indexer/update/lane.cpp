#include "indexer/update/lane.h"

#include <malloc.h>

#include <algorithm>
#include <utility>

namespace maru::indexer {
namespace {

constexpr std::size_t kMaxUnderWay = 128;
/// Bytes of files under way in a lane, beside one large one. Prepared, each becomes ten or more
/// where all words differ.
constexpr std::size_t kMaxCost = 2u << 20;
constexpr std::size_t kNameCost = 4u << 10;

/// Bytes read between two times that free memory is given back: what one thread allocates and
/// another frees leaves holes that would double the process.
constexpr std::uint64_t kTrimEvery = 16u << 20;

}  // namespace

Lane::~Lane() {
  while (Take(true)) continue;
}

void Lane::Submit(Job job) {
  while (!HasRoom()) Put(*Take(true));
  const std::uint64_t text =
      job.file ? std::min<std::uint64_t>(job.document.size, workers_.MaxText()) : 0;
  job.cost = kNameCost + static_cast<std::size_t>(text);
  ++under_way_;
  cost_ += job.cost;
  workers_.Submit(*this, std::move(job));
}

void Lane::Collect() {
  while (std::optional<Result> result = Take(false)) Put(std::move(*result));
}

void Lane::Finish() {
  while (std::optional<Result> result = Take(true)) Put(std::move(*result));
}

void Lane::Deliver(Result result) {
  const std::lock_guard lock(mutex_);
  results_.push_back(std::move(result));
  // Within the lock: the lane may be gone as soon as its owner has seen the result.
  finished_.notify_one();
}

bool Lane::HasRoom() const {
  return under_way_ == 0 || (under_way_ < kMaxUnderWay && cost_ < kMaxCost);
}

std::optional<Result> Lane::Take(bool wait) {
  if (under_way_ == 0) return std::nullopt;
  std::unique_lock lock(mutex_);
  if (wait) finished_.wait(lock, [this] { return !results_.empty(); });
  if (results_.empty()) return std::nullopt;
  Result result = std::move(results_.front());
  results_.pop_front();
  --under_way_;
  cost_ -= result.cost;
  return result;
}

void Lane::Put(Result result) {
  Counts& counts = tree_.Counted();
  if (result.failed) ++counts.failed;
  const std::uint64_t before = counts.bytes.fetch_add(result.bytes_read);
  if (before / kTrimEvery != counts.bytes / kTrimEvery) malloc_trim(0);
  Folder& folder = *result.folder;
  index::Entry* entry = folder.Find(result.name);
  if (!entry) {
    tree_.AddFile(folder, std::move(result.prepared), result.name, result.stamp);
  } else if (entry->directory == 0) {
    tree_.ReplaceFile(folder, *entry, std::move(result.prepared), result.stamp);
  }
  tree_.CommitIfDue();
}

}  // namespace maru::indexer
