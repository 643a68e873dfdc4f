#pragma once

namespace maru::indexer {

enum class Sight {
  /// Every file can be read.
  kAll,
  /// Only what this account may read.
  kOwn,
};

/// Makes sure that the folders for the indices exist, then, for a process started as root, becomes
/// the service account with no right of root's but to read every file (CAP_DAC_READ_SEARCH), and
/// never a new one. A process without such rights stays who it is. Throws std::runtime_error.
/// Before threads.
Sight DropPrivileges();

}  // namespace maru::indexer
