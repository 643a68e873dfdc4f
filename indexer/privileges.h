#pragma once

namespace maru::indexer {

enum class Sight {
  /// Every file can be read.
  kAll,
  /// Only what this account may read.
  kOwn,
};

/// Makes sure that the folders for the indices exist, then drops the privileges of root but the one
/// to read every file. Throws std::runtime_error. Before threads.
Sight BecomeIndexer();

}  // namespace maru::indexer
