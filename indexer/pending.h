#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "index/store/document.h"

namespace maru::indexer {

/// Names that changed and wait until they have come to rest: a closed file a moment, one that is
/// being written until it is quiet, but none for ever.
class Pending {
 public:
  using Clock = std::chrono::steady_clock;

  /// After a change that is complete (a closed file, a removed name), and at the latest.
  static constexpr std::chrono::milliseconds kMoment{300};
  static constexpr std::chrono::milliseconds kMomentAtMost{1'000};
  /// After a change that may go on, and at the latest.
  static constexpr std::chrono::milliseconds kQuiet{1'000};
  static constexpr std::chrono::milliseconds kQuietAtMost{30'000};
  /// More names than this are for a crawl to find.
  static constexpr std::size_t kMaxNames = 50'000;

  struct Batch {
    index::DirectoryId folder = 0;
    /// In byte order.
    std::vector<std::string> names;
  };

  /// False when there are too many: all are then forgotten.
  bool Add(index::DirectoryId folder, const std::string& name, bool complete,
           Clock::time_point now);
  void Clear() { names_.clear(); }

  /// When the first is due; time_point::max() when there is none.
  Clock::time_point NextDue() const;
  /// Takes out what is due, by folders; at most `limit` names.
  std::vector<Batch> TakeDue(Clock::time_point now, std::size_t limit);

 private:
  struct Times {
    Clock::time_point first;
    Clock::time_point due;
  };
  std::map<std::pair<index::DirectoryId, std::string>, Times> names_;
};

}  // namespace maru::indexer
