#include "index/store/bulk.h"

#include <algorithm>
#include <filesystem>

namespace maru::index {
namespace {

/// Size of the documents in a part, as Prepared::Size counts: what a builder holds in memory. Small
/// parts are built in the processor's caches; what it takes to put more of them together is less.
constexpr std::size_t kPartBytes = 16u << 20;
/// Ids set aside for a part; what it leaves unused are holes in every set of documents.
constexpr DocumentId kPartIds = 2048;
/// What may wait for one builder.
constexpr std::size_t kWaitingBytes = 4u << 20;
constexpr unsigned kMaxLanes = 8;
/// Databases merged in one go; each takes half a dozen file descriptors.
constexpr std::size_t kMergeWidth = 96;

void MergeInto(const std::vector<std::string>& sources, const std::string& target) {
  Xapian::Database all;
  for (const std::string& source : sources) all.add_database(Xapian::Database(source));
  all.compact(target, Xapian::DBCOMPACT_NO_RENUMBER);
}

}  // namespace

BulkBuilder::BulkBuilder(std::string folder) : folder_(std::move(folder)) {
  const unsigned count = std::clamp(std::thread::hardware_concurrency(), 1u, kMaxLanes);
  for (unsigned i = 0; i < count; ++i) {
    Lane& lane = *lanes_.emplace_back(std::make_unique<Lane>());
    lane.thread = std::thread([this, &lane] { Build(lane); });
  }
}

BulkBuilder::~BulkBuilder() {
  {
    const std::lock_guard lock(mutex_);
    for (const auto& lane : lanes_) lane->items.clear();
  }
  Stop();
}

void BulkBuilder::Stop() {
  {
    const std::lock_guard lock(mutex_);
    stopping_ = true;
  }
  changed_.notify_all();
  for (const auto& lane : lanes_) {
    if (lane->thread.joinable()) lane->thread.join();
  }
}

void BulkBuilder::RethrowFailure() {
  if (failure_) std::rethrow_exception(failure_);
}

BulkBuilder::Lane& BulkBuilder::LeastBusy() {
  return **std::min_element(lanes_.begin(), lanes_.end(),
                            [](const auto& a, const auto& b) { return a->waiting < b->waiting; });
}

/// Parts hold ids of their own, one block each, so that they can be put together as they are.
void BulkBuilder::BeginPart(Lane& lane) {
  lane.next = next_block_;
  next_block_ += kPartIds;
  lane.end = next_block_;
  lane.part_size = 0;
  parts_.push_back(folder_ + "/part." + std::to_string(parts_.size() + 1));
  lane.items.push_back({0, {}, 0, parts_.back()});
}

DocumentId BulkBuilder::Add(Xapian::Document document, std::size_t size) {
  DocumentId id = 0;
  {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return failure_ || LeastBusy().waiting < kWaitingBytes; });
    RethrowFailure();
    Lane& lane = LeastBusy();
    if (lane.next == lane.end || lane.part_size > kPartBytes) BeginPart(lane);
    id = lane.next++;
    lane.items.push_back({id, std::move(document), size, {}});
    lane.waiting += size;
    lane.part_size += size;
    ++documents_;
  }
  changed_.notify_all();
  return id;
}

std::optional<BulkBuilder::Item> BulkBuilder::Take(Lane& lane) {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [&] { return stopping_ || failure_ || !lane.items.empty(); });
  if (failure_ || lane.items.empty()) return std::nullopt;
  Item item = std::move(lane.items.front());
  lane.items.pop_front();
  lane.waiting -= item.size;
  lock.unlock();
  changed_.notify_all();
  return item;
}

void BulkBuilder::Build(Lane& lane) {
  try {
    std::optional<Xapian::WritableDatabase> part;
    while (auto item = Take(lane)) {
      if (item->part.empty()) {
        part->replace_document(item->id, item->document);
        continue;
      }
      if (part) part->commit();
      part =
          Xapian::WritableDatabase(item->part, Xapian::DB_CREATE_OR_OVERWRITE |
                                                   Xapian::DB_BACKEND_GLASS | Xapian::DB_NO_SYNC);
    }
    if (part) part->commit();
  } catch (...) {
    const std::lock_guard lock(mutex_);
    failure_ = std::current_exception();
  }
  changed_.notify_all();
}

void BulkBuilder::Merge(const std::string& metadata, const std::string& target) {
  Stop();
  RethrowFailure();
  // Parts stand in the order of their ids: any run of neighbours can be put together.
  while (parts_.size() > kMergeWidth) {
    std::vector<std::string> merged;
    for (std::size_t begin = 0; begin < parts_.size(); begin += kMergeWidth) {
      const auto end = std::min(parts_.size(), begin + kMergeWidth);
      merged.push_back(parts_[begin] + ".merged");
      MergeInto({parts_.begin() + static_cast<std::ptrdiff_t>(begin),
                 parts_.begin() + static_cast<std::ptrdiff_t>(end)},
                merged.back());
      for (std::size_t i = begin; i < end; ++i) std::filesystem::remove_all(parts_[i]);
    }
    parts_ = std::move(merged);
  }
  std::vector<std::string> all = parts_;
  all.push_back(metadata);
  MergeInto(all, target);
  for (const std::string& part : all) std::filesystem::remove_all(part);
}

}  // namespace maru::index
