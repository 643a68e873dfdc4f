#include "history/database.h"

#include "system/config.h"
#include "system/reason_to_end.h"

namespace maruseeker::db {
namespace {

std::string Schema(bool sqlite) {
  const std::string id = sqlite ? "INTEGER PRIMARY KEY AUTOINCREMENT" : "SERIAL PRIMARY KEY";
  return "CREATE TABLE IF NOT EXISTS search_history (id " + id +
         ", uid BIGINT NOT NULL, keyword TEXT NOT NULL, create_time BIGINT NOT NULL);"
         "CREATE INDEX IF NOT EXISTS search_history_by_user ON search_history (uid, create_time)";
}

}  // namespace

marudbquery::Session* DBSession::Instance() {
  static marudbquery::Session session = [] {
    // No process forked off this one could use the connection.
    static const maru::ReasonToEnd connected;
    const maru::Config& config = maru::Config::Get();
    std::string connection = config.history_database;
    if (connection.empty()) connection = "sqlite3://" + config.state_dir + "/history.db";
    return marudbquery::Session(connection, Schema(connection.starts_with("sqlite3:")));
  }();
  return &session;
}

}  // namespace maruseeker::db
