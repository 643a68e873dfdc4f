#pragma once

#include "system/config.h"
#include "system/unique_fd.h"

namespace maru::server {

/// The front's whole life, in the process the supervisor forked for it. Starts as root, to read the
/// certificate's key, and turns into the web account before it takes the first connection.
/// `control` leads to the host; `lifeline` to the supervisor, as for the host. Returns the exit
/// status.
int RunFront(const Config& config, UniqueFd listener, UniqueFd control, UniqueFd lifeline);

}  // namespace maru::server
