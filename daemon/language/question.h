#pragma once

#include <string>
#include <vector>

#include "daemon/core/arguments.h"
#include "index/query.h"

namespace maru::daemon {

/// What a search asks for, read and checked, before it becomes one query.
struct Question {
  std::string keyword;
  /// Where the keyword is looked for, with its weights.
  std::vector<index::FieldWeight> fields;
  /// Criteria on text fields: they narrow, and their words count for the order.
  std::vector<index::Query> words;
  /// Everything else that narrows.
  std::vector<index::Query> filters;
};

/// Reads "keyword", "criteria_list", "search_weight_list" and "file_type" of one object; all may be
/// absent.
Question ReadQuestion(const Arguments& arguments);

/// "AND" (also when absent): false; "OR": true.
bool ReadAnyWord(const Arguments& arguments);

/// Whether neither keyword nor criteria nor filters are given.
bool AsksNothing(const Question& question);

/// Matches nothing when neither keyword nor criteria nor filters are given; without a keyword, all
/// that match the rest.
index::Query ToQuery(const Question& question, bool any_word);

/// The tree for a person's eyes, one line.
std::string Explain(const index::Query& query);

}  // namespace maru::daemon
