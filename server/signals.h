#pragma once

#include <initializer_list>

#include "server/descriptor.h"

namespace maru::server {

/// Blocks the signals in this process and makes a descriptor that is readable when one came. Throws
/// std::system_error.
Descriptor OpenSignals(std::initializer_list<int> signals);

/// The number of the next signal that came, or 0 when none waits.
int NextSignal(const Descriptor& signals);

}  // namespace maru::server
