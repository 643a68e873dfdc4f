#pragma once

#include <span>

#include "daemon/core/core.h"

namespace maru::daemon {

/// What a caller may ask for.
struct Command {
  std::string_view name;
  /// Returns the reply's "data" (null: none). Throws maruseeker::Error and index::Cancelled.
  Json::Value (*run)(const Request&);
};

/// All commands; defined in daemon/commands/, of which the core knows nothing else.
std::span<const Command> Commands();

}  // namespace maru::daemon
