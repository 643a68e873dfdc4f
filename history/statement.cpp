#include <stdexcept>

#include "history/marudbquery_impl.h"

namespace marudbquery {
namespace {

/// Runs a statement that answers no rows; the number of rows it changed.
long long Run(Session& session, StatementText& text, const std::string& query) {
  soci::statement statement(session.Open());
  text.Prepare(statement, query);
  statement.execute(true);
  return statement.get_affected_rows();
}

std::string NeededWhere(StatementText& text, const Condition& condition) {
  if (!condition.Root()) throw std::runtime_error("a condition is needed");
  return text.Where(condition);
}

}  // namespace

struct SelectStatement::State {
  State(Session& session, const std::string& table)
      : text(session, table), statement(session.Open()) {}

  StatementText text;  // outlives the statement, which reads its values
  soci::statement statement;
};

Statement::Statement(Session* session, std::string table)
    : session_(session), table_(std::move(table)) {}

SelectStatement::SelectStatement(Session* session, std::string table)
    : Statement(session, std::move(table)) {}

SelectStatement::~SelectStatement() = default;

void SelectStatement::OrderBy(const std::string& column, Order order) {
  order_column_ = column;
  order_ = order;
}

void SelectStatement::Select(const std::string& expression, int& into) {
  bind_ = [&into](soci::statement& statement) { statement.exchange(soci::into(into)); };
  columns_ = expression;
}

bool SelectStatement::Execute(bool fetch_first) {
  state_.reset();
  return Walled(error_, [&] {
    if (!bind_) throw std::runtime_error("nothing is selected");
    auto state = std::make_unique<State>(*session_, table_);
    StatementText& text = state->text;
    const bool count = columns_ == "COUNT(*)";
    const std::string columns = count || columns_.empty() ? columns_ : text.Column(columns_);
    std::string query = "SELECT " + (columns.empty() ? "*" : columns) + " FROM " + text.Table() +
                        text.Where(condition_);
    if (!order_column_.empty()) {
      const std::string direction = order_ == kAscending ? " ASC" : " DESC";
      query += " ORDER BY " + text.Column(order_column_) + direction;
      if (order_column_ != "id" && session_->HasColumn(table_, "id")) {
        query += ", " + text.Column("id") + direction;
      }
    }
    if (limit_ > 0) {
      query += " LIMIT " + std::to_string(limit_);
    } else if (offset_ > 0 && session_->IsSQLite()) {
      query += " LIMIT -1";  // it knows no offset without a limit
    }
    if (offset_ > 0) query += " OFFSET " + std::to_string(offset_);
    bind_(state->statement);
    text.Prepare(state->statement, query);
    state->statement.execute(fetch_first);
    state_ = std::move(state);
  });
}

bool SelectStatement::Fetch() {
  bool found = false;
  Walled(error_, [&] {
    if (!state_) throw std::runtime_error("nothing was executed");
    found = state_->statement.fetch();
  });
  return found && error_.empty();
}

bool DeleteStatement::Execute() {
  return Walled(error_, [&] {
    StatementText text(*session_, table_);
    const std::string where = NeededWhere(text, condition_);
    Run(*session_, text, "DELETE FROM " + text.Table() + where);
  });
}

bool InsertStatement::Execute(const Insertable& record) {
  return Walled(error_, [&] {
    StatementText text(*session_, table_);
    std::string columns;
    std::string values;
    for (const auto& [column, value] : record.InsertValues()) {
      columns += (columns.empty() ? "" : ", ") + text.Column(column);
      values += (values.empty() ? "" : ", ") + text.Bind(value);
    }
    Run(*session_, text,
        "INSERT INTO " + text.Table() + " (" + columns + ") VALUES (" + values + ")");
  });
}

bool UpdateStatement::Execute(const Updatable& record, long long* changed) {
  return Walled(error_, [&] {
    StatementText text(*session_, table_);
    std::string values;
    for (const auto& [column, value] : record.UpdateValues()) {
      values += (values.empty() ? "" : ", ") + text.Column(column) + " = " + text.Bind(value);
    }
    const std::string where = NeededWhere(text, condition_);
    const long long rows =
        Run(*session_, text, "UPDATE " + text.Table() + " SET " + values + where);
    if (changed) *changed = rows;
  });
}

}  // namespace marudbquery
