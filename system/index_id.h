#pragma once

#include <string>
#include <string_view>

/// Under which id the indexer and the search daemon know a share's full-text index.
namespace maru {

inline constexpr std::string_view kIndexPrefix = "fileindex_";

inline std::string IndexIdOf(std::string_view share_name) {
  return std::string(kIndexPrefix).append(share_name);
}

/// The share's name; empty for what is no index id.
inline std::string_view ShareOfIndexId(std::string_view id) {
  if (!id.starts_with(kIndexPrefix)) return {};
  return id.substr(kIndexPrefix.size());
}

}  // namespace maru
