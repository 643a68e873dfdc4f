#pragma once

#include <string>

namespace maruseeker::db {

/// Which rows of a result, and in which order.
struct SelectParam {
  SelectParam(int rows_to_skip, int most_rows, std::string column, bool ascending)
      : offset(rows_to_skip), limit(most_rows), sort_by(std::move(column)), asc(ascending) {}

  /// Rows to skip, and the most rows to return; 0 or less: none skipped, no limit.
  int offset;
  int limit;
  /// A column; empty: the database's own order.
  std::string sort_by;
  bool asc;
};

}  // namespace maruseeker::db
