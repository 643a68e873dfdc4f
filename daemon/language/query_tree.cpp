#include "daemon/language/query_tree.h"

#include <cmath>
#include <cstdio>

#include "system/index_id.h"
#include "system/share_table.h"

namespace maru::daemon {
namespace {

using index::Query;

/// The parts in parentheses, with the word between them.
std::string Listed(const std::vector<Query>& parts, std::size_t from, const char* between) {
  std::string text = "(";
  for (std::size_t i = from; i < parts.size(); ++i) {
    if (i > from) text += between;
    text += Explain(parts[i]);
  }
  return text + ")";
}

std::string ExplainWords(const Query& query) {
  std::string text = query.kind == Query::Kind::kPhrase || query.exact ? "\"" : "";
  for (std::size_t i = 0; i < query.words.size(); ++i) {
    text += (i > 0 ? " " : "") + query.words[i];
  }
  if (query.kind == Query::Kind::kPrefix) text += "*";
  if (text[0] == '"') text += "\"";
  text += "@";
  for (std::size_t i = 0; i < query.fields.size(); ++i) {
    char weight[32];
    std::snprintf(weight, sizeof weight, ":%g", query.fields[i].weight);
    text += (i > 0 ? "," : "") + query.fields[i].field + weight;
  }
  return text;
}

std::string ExplainNumber(double number) {
  char text[32];
  std::snprintf(text, sizeof text, "%.15g", number);
  return std::isfinite(number) ? text : "";
}

}  // namespace

Query Nothing() {
  Query query;
  query.kind = Query::Kind::kNothing;
  return query;
}

Query Equals(std::string_view field, std::string text) {
  Query query;
  query.kind = Query::Kind::kValue;
  query.field = field;
  query.text = std::move(text);
  return query;
}

Query Join(Query::Kind kind, std::vector<Query> parts) {
  if (parts.empty()) return Nothing();
  if (parts.size() == 1) return std::move(parts[0]);
  Query query;
  query.kind = kind;
  query.parts = std::move(parts);
  return query;
}

std::string Explain(const Query& query) {
  switch (query.kind) {
    case Query::Kind::kEverything:
      return "everything";
    case Query::Kind::kNothing:
      return "nothing";
    case Query::Kind::kWord:
    case Query::Kind::kPrefix:
    case Query::Kind::kPhrase:
      return ExplainWords(query);
    case Query::Kind::kValue:
      return query.field + "=" + query.text;
    case Query::Kind::kRange:
      return query.field + "=" + ExplainNumber(query.low) + ".." + ExplainNumber(query.high);
    case Query::Kind::kUnder:
      return "under " + std::string(kVolume) + "/" + std::string(ShareOfIndexId(query.field)) +
             query.text;
    case Query::Kind::kAnd:
      return Listed(query.parts, 0, " AND ");
    case Query::Kind::kOr:
      return Listed(query.parts, 0, " OR ");
    case Query::Kind::kAndNot:
      return "(" + Explain(query.parts[0]) + " WITHOUT " + Listed(query.parts, 1, " OR ") + ")";
    case Query::Kind::kFilter:
      return "(" + Explain(query.parts[0]) + " ONLY " + Listed(query.parts, 1, " AND ") + ")";
  }
  return {};
}

}  // namespace maru::daemon
