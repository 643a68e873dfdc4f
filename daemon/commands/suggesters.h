#pragma once

#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "daemon/core/core.h"
#include "daemon/core/scope.h"

/// Where suggestions for a search box come from.
namespace maru::daemon {

/// What was typed and for whom.
struct SuggestRequest {
  const Core& core;
  const Scope& scope;
  /// Null when there is no index to look into.
  index::View* view;
  /// Whose history.
  uid_t uid;
  const std::string& text;
  std::size_t limit;
};

struct Suggester {
  std::string_view name;
  std::string_view description;
  /// Used when no suggester is named; otherwise just when nothing else was found.
  bool always;
  /// Whole texts for the box, best first, about `limit` of them.
  std::vector<std::string> (*suggest)(const SuggestRequest& request);
};

/// In the order in which they take turns.
std::span<const Suggester> Suggesters();

}  // namespace maru::daemon
