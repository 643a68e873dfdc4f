#pragma once

#include <set>
#include <string>

namespace maru {

/// The folder of the indices, one in it for each index id.
std::string IndexHome();

/// Names of the shares that have an index on the disk, in byte order. Works for every user.
std::set<std::string> IndexedShares();

}  // namespace maru
