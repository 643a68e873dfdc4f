#include "index/search/cache.h"

#include "index/store/codec.h"

namespace maru::index {
namespace {

/// What an entry takes beside its value.
constexpr std::size_t kRowBytes = 160;

}  // namespace

/// The row of the key, made when there is none, as the one used last. With the lock.
Cache::Row& Cache::Use(const std::string& key) {
  const auto [place, added] = by_key_.try_emplace(key, rows_.end());
  if (added) {
    rows_.push_front({&place->first, {}, kRowBytes + key.size(), 0});
    place->second = rows_.begin();
    numbers_.bytes += rows_.front().bytes;
  } else {
    rows_.splice(rows_.begin(), rows_, place->second);
  }
  return rows_.front();
}

void Cache::MakeRoom() {
  while (numbers_.bytes > limit_ && !rows_.empty()) {
    numbers_.bytes -= rows_.back().bytes;
    by_key_.erase(by_key_.find(*rows_.back().key));
    rows_.pop_back();
  }
}

Cache::Entry Cache::Find(const std::string& key) {
  const std::lock_guard lock(mutex_);
  const auto place = by_key_.find(key);
  const bool found = place != by_key_.end() && place->second->entry.value;
  ++(found ? numbers_.found : numbers_.missed);
  if (!found) return {};
  rows_.splice(rows_.begin(), rows_, place->second);
  return place->second->entry;
}

void Cache::Keep(const std::string& key, Entry entry, std::size_t bytes) {
  if (bytes > limit_ / 4) return;
  const std::lock_guard lock(mutex_);
  Row& row = Use(key);
  if (row.entry.value && row.entry.commit > entry.commit) return;
  const std::size_t before = row.bytes;
  row.entry = std::move(entry);
  row.bytes = kRowBytes + key.size() + bytes;
  numbers_.bytes += row.bytes - before;
  MakeRoom();
}

bool Cache::Spend(const std::string& key, std::uint64_t cost, std::uint64_t price) {
  const std::lock_guard lock(mutex_);
  if (cost == 0 && !by_key_.contains(key)) return price == 0;
  Row& row = Use(key);
  row.spent += cost;
  const bool worth = row.spent >= price;
  MakeRoom();
  return worth;
}

Cache::Statistics Cache::Numbers() const {
  const std::lock_guard lock(mutex_);
  Statistics numbers = numbers_;
  numbers.entries = rows_.size();
  return numbers;
}

std::string CacheKey(char kind, std::uint32_t owner, std::string_view name) {
  std::string key(1, kind);
  key += BigEndian32(owner);
  key += name;
  return key;
}

std::string CacheKey(char kind, std::uint32_t owner, std::uint32_t number) {
  return CacheKey(kind, owner, BigEndian32(number));
}

}  // namespace maru::index
