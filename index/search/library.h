#pragma once

#include <memory>
#include <string>
#include <vector>

#include "index/search/view.h"

namespace maru::index {

/// One index, and through whose eyes it is looked at.
struct IndexFor {
  std::string id;
  Identity who;
};

/// All indices of this server. Thread-safe; keeps open handles and what is derived from the indices
/// from request to request, and follows the writer's commits.
class Library {
 public:
  /// What is kept of all indices together.
  struct Kept {
    std::size_t bytes = 0;
    std::size_t entries = 0;
    std::uint64_t found = 0;
    std::uint64_t missed = 0;
  };

  /// `path` holds one folder an index id.
  explicit Library(std::string path);
  ~Library();

  /// The shares whose index ids are given, in that order, at their newest commits, each through its
  /// own eyes. An id without an index is an Error (121) that names it.
  std::unique_ptr<View> Open(const std::vector<IndexFor>& indices, IsCancelled cancelled = nullptr);
  /// The same, all through one pair of eyes.
  std::unique_ptr<View> Open(const std::vector<std::string>& index_ids, const Identity& who,
                             IsCancelled cancelled = nullptr);
  bool Has(const std::string& index_id) const;
  std::vector<std::string> IndexIds() const;
  Kept Cached() const;

 private:
  class State;
  std::shared_ptr<State> state_;
};

}  // namespace maru::index
