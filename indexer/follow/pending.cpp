#include "indexer/follow/pending.h"

#include <algorithm>

namespace maru::indexer {

bool Pending::Add(index::DirectoryId folder, const std::string& name, bool complete,
                  Clock::time_point now) {
  if (names_.size() >= kMaxNames) {
    Clear();
    return false;
  }
  Times& times = names_.try_emplace({folder, name}, Times{now, now}).first->second;
  const auto wait = complete ? kMoment : kQuiet;
  const auto at_most = complete ? kMomentAtMost : kQuietAtMost;
  times.due = std::min(now + wait, times.first + at_most);
  return true;
}

Pending::Clock::time_point Pending::NextDue() const {
  auto next = Clock::time_point::max();
  for (const auto& [place, times] : names_) next = std::min(next, times.due);
  return next;
}

NamesByFolder Pending::TakeDue(Clock::time_point now, std::size_t limit) {
  NamesByFolder due;
  for (auto next = names_.begin(); next != names_.end() && limit > 0;) {
    if (next->second.due > now) {
      ++next;
      continue;
    }
    const auto& [folder, name] = next->first;
    due[folder].push_back(name);
    next = names_.erase(next);
    --limit;
  }
  return due;
}

}  // namespace maru::indexer
