#pragma once

#include <string>
#include <utility>
#include <vector>

#include "common/db/select_param.h"
#include "platform/marudbquery.h"

namespace maruseeker::db {

/// One table and its record type; made for one operation. Nothing here throws
/// or logs: failures are results, and GetLastError tells why.
template <class T>
class TableBase {
 public:
  /// Borrows the session, which is not opened yet.
  TableBase(marudbquery::Session* session, std::string table)
      : session_(session), table_(std::move(table)) {}
  virtual ~TableBase() = default;

  /// The number of rows; 0 on failure too.
  int Count(const marudbquery::Condition& cond) {
    marudbquery::SelectStatement select(session_, table_);
    select.SetCondition(marudbquery::Condition::Null() && cond);
    int count = 0;
    select.Select("COUNT(*)", count);
    if (select.Execute(true)) return count;
    error_ = select.GetLastError();
    return 0;
  }

  /// `recs` becomes the rows. On failure, what it holds is not the result.
  bool GetAll(std::vector<T>& recs, const marudbquery::Condition& cond, const SelectParam& param) {
    marudbquery::SelectStatement select(session_, table_);
    select.SetCondition(marudbquery::Condition::Null() && cond);
    if (param.offset > 0) select.SetOffset(param.offset);
    if (param.limit > 0) select.SetLimit(param.limit);
    if (!param.sort_by.empty()) {
      select.OrderBy(param.sort_by, param.asc ? marudbquery::kAscending : marudbquery::kDescending);
    }
    T record;
    select.SelectAll(record);
    recs.clear();
    if (select.Execute(false)) {
      while (select.Fetch()) recs.push_back(record);
      if (select.GetLastError().empty()) return true;
    }
    error_ = select.GetLastError();
    return false;
  }

  /// Deletes the rows; none that match is no failure.
  bool Delete(const marudbquery::Condition& cond) {
    marudbquery::DeleteStatement statement(session_, table_);
    statement.SetCondition(cond);
    if (statement.Execute()) return true;
    error_ = statement.GetLastError();
    return false;
  }

  const std::string& GetLastError() const { return error_; }

 protected:
  marudbquery::Session* session_;
  std::string table_;
  std::string error_;
};

}  // namespace maruseeker::db
