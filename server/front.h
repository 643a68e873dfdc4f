#pragma once

#include "server/descriptor.h"
#include "system/config.h"

namespace maru::server {

/// The front's whole life, in the process the supervisor forked for it. Starts as root, to read the
/// certificate's key, and turns into the web account before it takes the first connection.
/// `control` leads to the host; `lifeline` to the supervisor, as for the host. Returns the exit
/// status.
int RunFront(const Config& config, Descriptor listener, Descriptor control, Descriptor lifeline);

}  // namespace maru::server
