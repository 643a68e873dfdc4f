#pragma once

#include <set>
#include <string>

namespace maru {

/// The folder of the indices, one in it for each index id.
std::string IndexHome();

/// Shares with an index on the disk, by name, in byte order. Works for every user.
std::set<std::string> IndexedShares();

}  // namespace maru
