#pragma once

#include <string>

#include "system/rights.h"

namespace maru {

/// Whether the identity can go from "/" to the folder and through it: search permission on every
/// folder on the way, those behind symbolic links too. The calling process judges what it can look
/// at; a folder that it cannot, is closed; one that is not there (any more) closes nothing.
bool CanReach(const Identity& who, const std::string& folder);

}  // namespace maru
