#pragma once

#include <cstddef>

namespace maru::extract {

/// Gives up all capabilities, for good. False when that fails.
bool DropCapabilities();

/// Gives up, for good, all that turning bytes into text does not need: capabilities, new
/// privileges, and every system call but memory, reading and writing open descriptors, receiving
/// and sending messages on them, and ending. Memory is bounded by `max_memory` bytes (not under the
/// sanitizers, whose shadow is larger). False when any of it fails: the process must then end.
/// Single thread.
bool EnterSandbox(std::size_t max_memory);

}  // namespace maru::extract
