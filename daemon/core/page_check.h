#pragma once

#include <cstddef>
#include <string_view>
#include <vector>

#include "daemon/core/scope.h"
#include "index/search/view.h"

namespace maru::daemon {

/// For each hit of a page: whether the same file or folder is still there and, for restricted eyes,
/// whether its share serves it to them and by the file system's present rights it may be read: read
/// permission on it, search permission on every folder from the share's own down (the scope has
/// judged those above). No symbolic link is followed below the share's folder. A path that cannot
/// be examined, or is deeper than kMaxPathDepth folders, may not be read.
std::vector<bool> ReadableNow(const Scope& scope, const std::vector<index::Hit>& hits);

constexpr std::size_t kMaxPathDepth = 256;

}  // namespace maru::daemon
