#pragma once

#include <sys/types.h>

namespace maru::server {

/// Removes those files of the private /tmp in which `pid`, a process that is gone, has noted
/// itself: JSON objects with its id as "pid", a few lines long. An id that is given out again would
/// otherwise make them another's.
void RemoveFilesOf(pid_t pid);

}  // namespace maru::server
