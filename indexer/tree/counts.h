#pragma once

#include <atomic>
#include <cstdint>

namespace maru::indexer {

/// What crawling, or crawling and following, has done so far. Written by the threads that do it,
/// read by whoever shows progress.
struct Counts {
  /// Files and folders by what became of them.
  std::atomic<std::uint64_t> added{0};
  std::atomic<std::uint64_t> changed{0};
  std::atomic<std::uint64_t> unchanged{0};
  std::atomic<std::uint64_t> removed{0};
  /// Files indexed by name only because they could not be read or understood.
  std::atomic<std::uint64_t> failed{0};
  /// Folders that could not be read.
  std::atomic<std::uint64_t> unreadable{0};
  /// Bytes read from files.
  std::atomic<std::uint64_t> bytes{0};
  /// Files and folders there are; 0 until it is known.
  std::atomic<std::uint64_t> expected{0};

  /// Files and folders done.
  std::uint64_t Seen() const { return added + changed + unchanged; }
};

}  // namespace maru::indexer
