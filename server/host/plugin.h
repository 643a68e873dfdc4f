#pragma once

#include <string>

#include "platform/webapi.h"
#include "server/wire/messages.h"

namespace maru::server {

/// A loaded plug-in: what its two exported tables offer. Never unloaded.
class Plugin {
 public:
  /// Loads the shared library. Throws std::runtime_error when it cannot be loaded, lacks one of the
  /// accessors, or has a method without a check function.
  explicit Plugin(const std::string& path);

  struct Method {
    MARU::APICheck check = nullptr;
    MARU::APIEntry entry = nullptr;
  };
  /// Both null when there is no such API, version or method.
  Method Find(const MethodName& name) const;

 private:
  const MARU::APIRow* rows_;
  const MARU::APICheckRow* checks_;
};

}  // namespace maru::server
