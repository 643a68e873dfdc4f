#pragma once

#include <chrono>
#include <cstddef>
#include <mutex>
#include <optional>
#include <span>
#include <vector>

#include "indexer/extract/extractor.h"
#include "system/unique_fd.h"

namespace maru::extract {

/// Processes without rights that run extractors: one a slot, each with a socket pair to this
/// process. A file costs at most its own text: a process that crashes, hangs or answers too much is
/// killed and replaced by a small forker process, which never opens an index (a forked child would
/// keep an index's lock).
class Processes {
 public:
  static constexpr std::chrono::seconds kTimeout{20};

  /// Forks; so before this process has threads, an index or any open secret. Throws
  /// std::system_error. `table` holds the extractors that Extract can name, for the life of this.
  explicit Processes(unsigned slots, std::span<const Extractor> table = Extractors(),
                     std::chrono::milliseconds timeout = kTimeout);
  /// Ends the processes.
  ~Processes();
  Processes(const Processes&) = delete;
  Processes& operator=(const Processes&) = delete;

  unsigned Slots() const { return static_cast<unsigned>(processes_.size()); }

  /// Has the process of `slot` run the extractor `row` on an open file. None when it failed. Each
  /// slot by one thread at a time.
  std::optional<Extracted> Extract(unsigned slot, std::size_t row, int file, std::size_t max_text);

 private:
  std::optional<Extracted> Ask(UniqueFd& process, std::size_t row, int file, std::size_t max_text);
  UniqueFd NewProcess(unsigned slot);

  const std::chrono::milliseconds timeout_;
  std::vector<UniqueFd> processes_;
  std::mutex forker_mutex_;
  UniqueFd forker_;
  int forker_pid_ = -1;
};

}  // namespace maru::extract
