#pragma once

#include <string>
#include <vector>

#include "system/config.h"

namespace maru::server {

/// The web server as a whole: opens the listening socket, mounts the shares in a namespace of its
/// own, starts the front and the host and stays with them. Ends, with everything it started, on
/// SIGTERM and SIGINT (returns 0), and when one of the two ends by itself (logs that and returns
/// 1). SIGHUP: looks at the shares at once and passes it on. Needs root. Throws std::runtime_error
/// when it cannot start. `host_command` is the host's program, an absolute path, and its arguments,
/// to which the two sockets are added.
int RunSupervisor(const Config& config, std::vector<std::string> host_command);

}  // namespace maru::server
