#pragma once

#include <set>
#include <string>
#include <vector>

#include "history/marudbquery.h"
#include "system/keep_errno.h"

/// What the parts of the query layer share. For this room.
namespace marudbquery {

struct Condition::Node {
  enum Kind { kCompare, kSubstring, kAnd, kOr };

  Kind kind;
  // A comparison or substring.
  std::string column;
  std::string op;
  Value value;
  // A join.
  int height = 0;
  std::shared_ptr<const Node> left, right;
};

/// Text of a statement with its values; columns are checked as they are written. Its functions
/// throw std::runtime_error.
class StatementText {
 public:
  /// The table must exist.
  StatementText(Session& session, const std::string& table);

  std::string Table() const { return Quoted(table_); }
  /// The column's name as it stands in a statement, if the table has it.
  std::string Column(const std::string& name) const;
  /// A placeholder for the value.
  std::string Bind(const Value& value);
  /// "" or " WHERE ...".
  std::string Where(const Condition& condition);

  /// Prepares and binds; this object must outlive the statement.
  void Prepare(soci::statement& statement, const std::string& text);

 private:
  static std::string Quoted(const std::string& name) { return '"' + name + '"'; }
  std::string Of(const Condition::Node& node);

  Session& session_;
  std::string table_;
  std::vector<Value> values_;
};

/// The one wall against the database library's exceptions.
template <class Work>
bool Walled(std::string& error, Work work) {
  const maru::KeepErrno keep;
  try {
    error.clear();
    work();
    return true;
  } catch (const std::exception& exception) {
    error = exception.what();
    return false;
  }
}

}  // namespace marudbquery
