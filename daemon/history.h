#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace maru::daemon {

/// Earlier searches that are looked at for suggestions.
constexpr int kMaxEarlierSearches = 500;

/// A user's newest searches, newest first, from the service's history: its journal and its
/// database. Thread-safe. A database that cannot be read is logged and empty.
std::vector<std::string> EarlierSearches(uid_t uid);

}  // namespace maru::daemon
