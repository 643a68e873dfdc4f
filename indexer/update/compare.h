#pragma once

#include <span>
#include <string>
#include <vector>

#include "indexer/tree/listing.h"
#include "indexer/tree/tree.h"

/// What a folder has in the index beside what it has on the disk.
namespace maru::indexer {

/// An entry that is not what is on the disk. Either side may be absent.
struct Difference {
  index::Entry* entry = nullptr;
  const Found* found = nullptr;
};

/// The differences between a merged folder's entries and all that was found, or what was found
/// under some names; both in byte order. Another folder under the name of one, or a file, is two of
/// them: what is gone, and something new. They hold until the folder's next Merge.
std::vector<Difference> Compare(Folder& folder, std::span<const Found> found);
std::vector<Difference> Compare(Folder& folder, const std::vector<std::string>& names,
                                std::span<const Found> found);

/// Whether what was found has all that was read of an entry: at most its name, rights and place are
/// others.
bool SameContent(const index::Entry& entry, const Found& found);

}  // namespace maru::indexer
