#pragma once

#include "system/config.h"
#include "system/unique_fd.h"

namespace maru::server {

/// The host's whole life, in a process of its own, the first of a new PID namespace. `control`
/// leads to the front; `lifeline` to the supervisor: one byte is written when the host is ready,
/// and the host ends when the other end is closed. Returns the exit status.
int RunHost(const Config& config, UniqueFd control, UniqueFd lifeline);

}  // namespace maru::server
