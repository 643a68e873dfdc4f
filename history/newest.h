#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace maru::history {

/// A user's newest searches, newest first, from the service's history: those of its journal and a
/// few hundred of its table. Thread-safe. A database that cannot be read is logged and empty.
std::vector<std::string> NewestSearches(uid_t uid);

}  // namespace maru::history
