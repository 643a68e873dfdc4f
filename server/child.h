#pragma once

#include <string_view>

#include "server/descriptor.h"
#include "server/plugin.h"

namespace maru::server {

/// Exit status by which a child tells the host that the session's account is gone, expired, or has
/// another password, so that the session is over.
constexpr int kExitSessionOver = 77;

/// What a child sends to the host before its answer goes to the front.
constexpr std::string_view kAnswered = "a";

/// The whole life of a request child, right after its fork: waits at `tasks` for one Task, serves
/// it, finishes what follows the answer and ends. What the child shares with its parent it lets go
/// of first. Never returns, and runs none of the parent's exit handlers.
[[noreturn]] void RunRequestChild(Descriptor tasks, const Plugin& plugin);

/// For any forked child: the signals as a new program expects them, and no descriptor but `kept`
/// (which becomes number 3 and is returned) and the standard ones.
Descriptor KeepOnly(Descriptor kept);

}  // namespace maru::server
