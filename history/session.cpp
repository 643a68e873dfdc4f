#include <soci/soci.h>
#include <unistd.h>

#include <map>
#include <set>
#include <string_view>

#include "history/marudbquery_impl.h"

namespace marudbquery {
namespace {

constexpr std::string_view kSQLite = "sqlite3";
constexpr std::string_view kPostgreSQL = "postgresql";
// The longest queue of writers is far shorter; a lock held longer is a fault to report.
constexpr const char* kBusyTimeout = "PRAGMA busy_timeout = 20000";

// In pages. Whoever opens the database while nobody else has it open reads the whole log; while the
// search daemon runs, nobody has to.
constexpr const char* kCheckpoint = "PRAGMA wal_autocheckpoint = 400";
// The disk is waited for at checkpoints only: a power cut may cost the last few rows, never the
// database.
constexpr const char* kSynchronous = "PRAGMA synchronous = NORMAL";

/// Backends are loaded only where they are asked for, by few processes, and by name, never from the
/// current folder.
std::unique_ptr<soci::session> Connect(const std::string& backend, const std::string& connection) {
  static const bool registered = [] {
    for (const std::string_view name : {kSQLite, kPostgreSQL}) {
      soci::dynamic_backends::register_backend(std::string(name),
                                               "libsoci_" + std::string(name) + ".so.4.0");
    }
    return true;
  }();
  static_cast<void>(registered);
  return std::make_unique<soci::session>(backend, connection);
}

void PrepareSQLite(soci::session& database) {
  database << kBusyTimeout;
  database << kCheckpoint;
  database << kSynchronous;
  std::string mode;
  database << "PRAGMA journal_mode", soci::into(mode);
  if (mode == "wal") return;
  try {
    database << "PRAGMA journal_mode = WAL", soci::into(mode);
  } catch (const soci::soci_error&) {
    // Another process is using it just now; readers then wait for writers until the next one comes.
  }
}

/// Two processes that create a thing at once make one of them fail; the second time it is there.
void RunTwiceAtMost(soci::session& database, const std::string& statement) {
  try {
    database << statement;
  } catch (const soci::soci_error&) {
    database << statement;
  }
}

void RunSchema(soci::session& database, std::string_view schema) {
  while (!schema.empty()) {
    const std::size_t end = std::min(schema.find(';'), schema.size());
    const std::string statement(schema.substr(0, end));
    schema.remove_prefix(std::min(end + 1, schema.size()));
    if (statement.find_first_not_of(" \n") != std::string::npos) {
      RunTwiceAtMost(database, statement);
    }
  }
}

}  // namespace

struct Session::State {
  std::string backend;
  std::string connection;
  std::string schema;
  std::unique_ptr<soci::session> database;
  pid_t owner = 0;
  std::map<std::string, std::set<std::string>> columns;

  /// A child must not close its parent's connection, nor use it: it forgets it.
  void Forget() {
    if (owner == getpid()) return;
    static_cast<void>(database.release());
    columns.clear();
  }

  const std::set<std::string>& Columns(soci::session& open, const std::string& table);
};

const std::set<std::string>& Session::State::Columns(soci::session& open,
                                                     const std::string& table) {
  const auto known = columns.find(table);
  if (known != columns.end()) return known->second;
  const char* query = backend == kSQLite
                          ? "SELECT name FROM pragma_table_info(:t)"
                          : "SELECT column_name FROM information_schema.columns "
                            "WHERE table_schema = current_schema() AND table_name = :t";
  std::set<std::string> names;
  const soci::rowset<std::string> rows = (open.prepare << query, soci::use(table));
  names.insert(rows.begin(), rows.end());
  return columns[table] = std::move(names);
}

Session::Session(std::string connection, std::string schema) : state_(new State) {
  const std::size_t end = connection.find("://");
  if (end != std::string::npos) {
    state_->backend = connection.substr(0, end);
    state_->connection = connection.substr(end + 3);
  }
  state_->schema = std::move(schema);
}

Session::~Session() {
  state_->Forget();
}

soci::session& Session::Open() {
  state_->Forget();
  if (state_->database) return *state_->database;
  if (state_->backend != kSQLite && state_->backend != kPostgreSQL) {
    throw soci::soci_error("a database is named by sqlite3:// or postgresql://");
  }
  auto database = Connect(state_->backend, state_->connection);
  if (IsSQLite()) {
    PrepareSQLite(*database);
  } else {
    *database << "SET client_min_messages = warning";  // the rest would go to standard error
  }
  RunSchema(*database, state_->schema);
  state_->database = std::move(database);
  state_->owner = getpid();
  return *state_->database;
}

bool Session::IsSQLite() const {
  return state_->backend == kSQLite;
}

bool Session::HasTable(const std::string& table) {
  soci::session& open = Open();
  return !state_->Columns(open, table).empty();
}

bool Session::HasColumn(const std::string& table, const std::string& column) {
  soci::session& open = Open();
  return state_->Columns(open, table).contains(column);
}

bool Session::Transaction(const std::function<bool()>& work, std::string& error) {
  bool begun = false;
  bool agreed = false;
  const bool done = Walled(error, [&] {
    soci::session& database = Open();
    // A write lock from the start: a transaction that first read could not wait for it.
    database << (IsSQLite() ? "BEGIN IMMEDIATE" : "BEGIN");
    begun = true;
    agreed = work();
    if (agreed) database << "COMMIT";
  });
  if (done && agreed) return true;
  std::string ignored;
  if (begun) Walled(ignored, [&] { Open() << "ROLLBACK"; });
  return false;
}

bool Session::Attempt(const std::function<bool()>& work) {
  std::string ignored;
  bool agreed = false;
  const bool done = Walled(ignored, [&] {
    Open() << "SAVEPOINT attempt";
    agreed = work();
    if (agreed) Open() << "RELEASE SAVEPOINT attempt";
  });
  if (done && agreed) return true;
  Walled(ignored, [&] {
    Open() << "ROLLBACK TO SAVEPOINT attempt";
    Open() << "RELEASE SAVEPOINT attempt";
  });
  return false;
}

}  // namespace marudbquery
