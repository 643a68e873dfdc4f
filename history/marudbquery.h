#pragma once

#include <soci/soci.h>

#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <variant>
#include <vector>

/// The database query layer: statements from conditions, over SOCI. Values are always bound, never
/// part of the statement's text; table and column names are checked against the table's own
/// columns, and an unknown one makes Execute fail. Nothing here throws but Session's own functions;
/// statements report through their results and `GetLastError`.
namespace marudbquery {

/// One bound value.
using Value = std::variant<long long, std::string>;

/// Column names with values, for updates and inserts.
using Values = std::vector<std::pair<std::string, Value>>;

/// A record that can say what an update sets.
class Updatable {
 public:
  virtual Values UpdateValues() const = 0;
  virtual ~Updatable() = default;
};

/// A record that can say what an insert stores.
class Insertable {
 public:
  virtual Values InsertValues() const = 0;
  virtual ~Insertable() = default;
};

/// A condition on rows; immutable, cheap to copy. Null is neutral in both joins.
class Condition {
 public:
  /// T is int, unsigned int, long long or std::string; `op` one of = != < <= > >=. Anything else
  /// makes the statement fail.
  template <class T>
  static Condition ConditionFactory(const std::string& column, const std::string& op,
                                    const T& value) {
    if constexpr (std::is_integral_v<T>) {
      return Compare(column, op, static_cast<long long>(value));
    } else {
      return Compare(column, op, std::string(value));
    }
  }
  /// The column holds `text` somewhere, literally and case by case: no character is special.
  static Condition HasSubstring(const std::string& column, const std::string& text);
  static Condition Null();

  /// Long chains of joins are balanced, so that thousands of ids stay within the database's depth.
  friend Condition operator&&(const Condition& a, const Condition& b);
  friend Condition operator||(const Condition& a, const Condition& b);

  struct Node;
  const std::shared_ptr<const Node>& Root() const { return root_; }

 private:
  static Condition Compare(const std::string& column, const std::string& op, Value value);
  std::shared_ptr<const Node> root_;
};

/// A database connection, opened on first use: a process that forks gives each child its own.
/// SQLite runs in WAL mode with a busy time-out.
class Session {
 public:
  /// `connection` as SOCI takes it ("sqlite3://...", "postgresql://..."; another fails when
  /// opened). `schema` is run when the database is opened: statements parted by ";" that are
  /// harmless to repeat. Throws std::invalid_argument for another kind of database.
  Session(std::string connection, std::string schema);
  ~Session();
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;

  /// Runs `work` in one write transaction (SQLite: BEGIN IMMEDIATE): committed when it returns
  /// true, rolled back otherwise. False when it was not, with `error` empty
  /// when `work` itself said so; does not throw.
  bool Transaction(const std::function<bool()>& work, std::string& error);
  /// Within a transaction's work: undoes what `work` changed when it returns false or throws, and
  /// the transaction goes on. What `work` returned; does not throw.
  bool Attempt(const std::function<bool()>& work);

  /// For the statements of this layer. Those that open the database throw when it cannot be.
  soci::session& Open();
  bool IsSQLite() const;
  bool HasTable(const std::string& table);
  bool HasColumn(const std::string& table, const std::string& column);

 private:
  struct State;
  std::unique_ptr<State> state_;
};

enum Order { kAscending = 0, kDescending = 1 };

class Statement {
 public:
  Statement(Session* session, std::string table);
  void SetCondition(const Condition& condition) { condition_ = condition; }
  const std::string& GetLastError() const { return error_; }

 protected:
  Session* session_;
  std::string table_;
  Condition condition_;
  std::string error_;
};

class SelectStatement : public Statement {
 public:
  SelectStatement(Session* session, std::string table);
  ~SelectStatement();

  void SetOffset(int offset) { offset_ = offset; }
  void SetLimit(int limit) { limit_ = limit; }
  /// Rows of equal values follow by "id", so that pages never overlap.
  void OrderBy(const std::string& column, Order order);

  /// Selects one expression, "COUNT(*)" or a column, into an integer.
  void Select(const std::string& expression, int& into);
  /// Selects all columns into a record with a soci::type_conversion from soci::values.
  template <class Record>
  void SelectAll(Record& record) {
    bind_ = [&record](soci::statement& statement) { statement.exchange(soci::into(record)); };
    columns_.clear();
  }

  /// With `fetch_first` the first row is fetched at once. False: see GetLastError.
  bool Execute(bool fetch_first);
  /// Fetches the next row into what Select named; false at the end, or on failure (GetLastError is
  /// then not empty).
  bool Fetch();

 private:
  struct State;
  std::unique_ptr<State> state_;
  std::function<void(soci::statement&)> bind_;
  std::string columns_;
  std::string order_column_;
  Order order_ = kAscending;
  int offset_ = 0;
  int limit_ = 0;
};

class DeleteStatement : public Statement {
 public:
  using Statement::Statement;
  /// A condition that selects all rows (Null) is refused.
  bool Execute();
};

class InsertStatement : public Statement {
 public:
  using Statement::Statement;
  bool Execute(const Insertable& record);
};

class UpdateStatement : public Statement {
 public:
  using Statement::Statement;
  /// As DeleteStatement: a Null condition is refused. `changed`, when not null, gets the row count.
  bool Execute(const Updatable& record, long long* changed = nullptr);
};

}  // namespace marudbquery
