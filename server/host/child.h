#pragma once

#include "server/host/plugin.h"
#include "system/unique_fd.h"

namespace maru::server {

/// The whole life of a request child, right after its fork: waits at `tasks` for a Task, serves it
/// and finishes what follows the answer, and then waits for another of the same user, unless
/// something ties its process to that request. What the child shares with its parent it lets go of
/// first. Never returns, and runs none of the parent's exit handlers.
[[noreturn]] void RunRequestChild(UniqueFd tasks, const Plugin& plugin);

}  // namespace maru::server
