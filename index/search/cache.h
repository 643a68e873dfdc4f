#pragma once

#include <cstddef>
#include <cstdint>
#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>

namespace maru::index {

/// What was derived from the indices and is worth keeping, of all shares together: postings,
/// values, what eyes see, what words are widened to. One bound for everything: what was used the
/// longest ago goes first, and what somebody uses lives on until it is let go. Thread-safe.
class Cache {
 public:
  struct Entry {
    std::shared_ptr<const void> value;
    /// The commit of whose state it is.
    std::uint32_t commit = 0;
  };
  struct Statistics {
    std::size_t bytes = 0;
    std::size_t entries = 0;
    std::uint64_t found = 0;
    std::uint64_t missed = 0;
  };

  /// `limit` in bytes.
  explicit Cache(std::size_t limit) : limit_(limit) {}

  /// A null value when there is none.
  Entry Find(const std::string& key);
  /// Unless a later commit's is there, or it would take more than a fourth of all room.
  void Keep(const std::string& key, Entry entry, std::size_t bytes);
  /// Counts `cost` towards deriving something whole, at `price`, instead of what is needed of it
  /// each time; true once it is worth that.
  bool Spend(const std::string& key, std::uint64_t cost, std::uint64_t price);

  Statistics Numbers() const;

 private:
  struct Row {
    const std::string* key;
    Entry entry;
    std::size_t bytes = 0;
    std::uint64_t spent = 0;
  };
  using Rows = std::list<Row>;

  Row& Use(const std::string& key);
  void MakeRoom();

  const std::size_t limit_;
  mutable std::mutex mutex_;
  /// Used last first.
  Rows rows_;
  std::unordered_map<std::string, Rows::iterator> by_key_;
  Statistics numbers_;
};

/// The bytes that a kept value takes: specialised for those that hold more than themselves.
template <class Value>
struct BytesOf {
  std::size_t operator()(const Value& value) const { return sizeof(value); }
};

/// A key: `kind` tells what is kept, `owner` of whose.
std::string CacheKey(char kind, std::uint32_t owner, std::string_view name);
std::string CacheKey(char kind, std::uint32_t owner, std::uint32_t number);

}  // namespace maru::index
