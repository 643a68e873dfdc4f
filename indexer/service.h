#pragma once

#include "indexer/keeper.h"
#include "indexer/update/workers.h"

namespace maru::indexer {

/// Follows all shares, as the settings have them at each moment, until SIGTERM or SIGINT, which the
/// caller has blocked in all threads along with SIGHUP.
void Serve(Workers& workers, const Keeper::Settings& settings);

}  // namespace maru::indexer
