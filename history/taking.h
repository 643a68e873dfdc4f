#pragma once

#include <string>

#include "common/db/search_history.h"

/// How searches come into the history's table. False with `error`, which stays what it was when it
/// cannot be told why.
namespace maru::history {

/// Takes one, of whose user's rows the newest `max` stay, as SearchHistoryTable::UpdateWithTime has
/// it; `record` becomes the row.
bool TakeNow(maruseeker::db::SearchHistory& record, int max, std::string& error);

/// Takes the journal's. One that the database refuses is logged and forgotten; while it takes
/// nothing at all, they stay. errno as before.
bool TakeJournal(std::string& error);

}  // namespace maru::history
