#pragma once

#include <initializer_list>

#include "system/unique_fd.h"

namespace maru::server {

/// Blocks the signals in this process and makes a descriptor that is readable when one came. Throws
/// std::system_error.
UniqueFd OpenSignals(std::initializer_list<int> signals);

/// The number of the next signal that came, or 0 when none waits.
int NextSignal(const UniqueFd& signals);

/// For a forked child: no signal is blocked.
void UnblockSignals();

}  // namespace maru::server
