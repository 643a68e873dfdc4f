#pragma once

#include <set>
#include <string>

#include "system/share_table.h"

namespace maru {

/// The folder of the indices, one in it for each index id.
std::string IndexHome();

/// Shares with an index on the disk, by name, in byte order. Works for every user.
std::set<std::string> IndexedShares();

/// What of a share's settings its index depends on, beside its files: an index made by other terms
/// is of no use. Empty for a share without such settings.
std::string CrawlTermsOf(const ShareSettings& share);
/// Those that an index was made by; equal to no share's terms while that is not settled.
std::string RecordedCrawlTerms(const std::string& index_folder);
/// Throws std::system_error.
void RecordCrawlTerms(const std::string& index_folder, const std::string& terms);

/// Terms of no share.
inline constexpr const char* kUnsettledTerms = "unsettled";

}  // namespace maru
