#pragma once

#include "system/unique_fd.h"

/// What processes give up before they meet a request. Functions that give up rights or sights throw
/// std::system_error when the kernel refuses; the process must then not go on.
namespace maru::server {

/// A mount namespace of this process's own: what the machine mounts goes on appearing in it, what
/// is mounted in it does not appear on the machine.
void EnterMountNamespace();

/// The host's own view of the file system: a mount namespace with a /proc of its PID namespace
/// (where the machine permits one) and an empty /tmp that nobody else sees.
void MakePrivateMounts();

/// Removes files in /tmp that nobody has written for a day: the notes of queries that were killed.
/// Only after MakePrivateMounts.
void SweepPrivateTmp();

/// Root without any power but to become users, read their files, end their processes and give files
/// away; also for everything this process will ever start.
void KeepHostCapabilities();

/// For a forked child: the signals as a new program expects them, and no descriptor but `kept`
/// (which becomes number 3 and is returned) and the standard ones.
UniqueFd KeepOnly(UniqueFd kept);

}  // namespace maru::server
