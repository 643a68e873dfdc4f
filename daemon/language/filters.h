#pragma once

#include <string>
#include <vector>

#include "daemon/core/arguments.h"

namespace maru::daemon {

/// The "filters" of a request.
struct Filters {
  /// Of "permission" filters; each narrows.
  std::vector<std::string> users;
  /// Of "file_type" filters, in the order given.
  std::vector<std::string> types;
};

Filters ReadFilters(const Arguments& arguments);

}  // namespace maru::daemon
