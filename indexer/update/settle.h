#pragma once

#include "indexer/update/updater.h"

namespace maru::indexer {

/// All folders that are gone from their place or new at one are known: takes in and walks those
/// that waited, removes what is gone for good, and waits for all that is under way. `top` is the
/// share's folder.
void Settle(Updater& updater, int top);

}  // namespace maru::indexer
