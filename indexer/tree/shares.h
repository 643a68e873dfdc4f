#pragma once

#include <string>
#include <tuple>
#include <vector>

#include "indexer/tree/listing.h"
#include "indexer/tree/selection.h"
#include "system/share_table.h"

namespace maru::indexer {

/// A share with its index.
struct Target {
  std::string share;
  std::string path;
  std::string index_folder;
  /// Which folder lies there now.
  FileId top;
  /// What the index depends on beside the files.
  std::string terms;
  Selection selection;

  /// The selection follows from the others.
  friend bool operator==(const Target& a, const Target& b) {
    return std::tie(a.share, a.path, a.index_folder, a.top, a.terms) ==
           std::tie(b.share, b.path, b.index_folder, b.top, b.terms);
  }
};

struct Targets {
  /// In the settings' order.
  std::vector<Target> present;
  /// Shares that are to be indexed, but whose folder is not there now.
  std::vector<std::string> missing;
};
Targets FindTargets(const ShareTable& table);

/// Removes the indices of shares that are gone from the settings, or are not to be indexed any
/// more, after a log line each; those of shares withheld from search wait. Touches nothing but
/// folders named fileindex_*, and nothing at all while the newest settings have an error. `used`
/// names indices that are still open.
void RemoveForeignIndices(const ShareTable& table, const std::vector<std::string>& used);

/// Removes an index, its folder too; says in the log when it cannot. The caller holds the indexer's
/// lock, and the index is not open.
void RemoveIndex(const std::string& index_folder);

}  // namespace maru::indexer
