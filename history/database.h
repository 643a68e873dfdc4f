#pragma once

#include "history/marudbquery.h"

namespace maruseeker::db {

/// The history database of the service, from the configuration; opened on first use, as whoever the
/// process then is. `search_history` is created when missing.
class DBSession {
 public:
  static marudbquery::Session* Instance();
};

}  // namespace maruseeker::db
