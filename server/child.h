#pragma once

#include "server/descriptor.h"
#include "server/plugin.h"

namespace maru::server {

/// Exit status by which a child tells the host that the session's account is gone, expired, or has
/// another password, so that the session is over.
constexpr int kExitSessionOver = 77;

/// What a child says to the host: first, unless the request may act as root, that it can end
/// processes of its user only; that its answer is about to go to the front; and, if it stays for
/// its user's next request, that this one is over.
constexpr char kEndsOwnOnly = 'o';
constexpr char kAnswered = 'a';
constexpr char kRequestOver = 'd';

/// The whole life of a request child, right after its fork: waits at `tasks` for a Task, serves it
/// and finishes what follows the answer, and then waits for another of the same user, unless
/// something ties its process to that request. What the child shares with its parent it lets go of
/// first. Never returns, and runs none of the parent's exit handlers.
[[noreturn]] void RunRequestChild(Descriptor tasks, const Plugin& plugin);

/// For any forked child: the signals as a new program expects them, and no descriptor but `kept`
/// (which becomes number 3 and is returned) and the standard ones.
Descriptor KeepOnly(Descriptor kept);

}  // namespace maru::server
