#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace maru::daemon {

/// Opens the history's database and keeps it open, so that processes that write one row need not
/// read its log first. A failure is logged; the first use tries again.
void OpenHistory();

/// Earlier searches that are looked at for suggestions.
constexpr int kMaxEarlierSearches = 500;

/// A user's newest searches, newest first, from the service's history database. Thread-safe. A
/// history that cannot be read is logged and empty.
std::vector<std::string> EarlierSearches(uid_t uid);

}  // namespace maru::daemon
