#pragma once

#include <string>
#include <vector>

#include "daemon/core/arguments.h"
#include "index/search/query.h"

namespace maru::daemon {

/// The parts of a search, read and checked, before they become one query.
struct QueryClauses {
  std::string keyword;
  /// Where the keyword is looked for, with its weights.
  std::vector<index::FieldWeight> fields;
  /// Criteria on text fields: they narrow, and their words count for the order.
  std::vector<index::Query> scored;
  /// Everything else that narrows.
  std::vector<index::Query> filters;
};

/// Reads "keyword", "criteria_list", "search_weight_list" and "file_type" of one object; all may be
/// absent.
QueryClauses ReadClauses(const Arguments& arguments);

/// The "filters" of a request.
struct Filters {
  /// Of "permission" filters; each narrows.
  std::vector<std::string> users;
  /// Of "file_type" filters, in the order given.
  std::vector<std::string> types;
};

Filters ReadFilters(const Arguments& arguments);

/// "AND" (also when absent): false; "OR": true.
bool ReadAnyWord(const Arguments& arguments);

/// Whether neither keyword nor criteria nor filters are given.
bool IsBlank(const QueryClauses& clauses);

/// Matches nothing when the clauses are blank; without a keyword, all that match the rest.
index::Query ToQuery(const QueryClauses& clauses, bool any_word);

}  // namespace maru::daemon
