#include <map>

#include "daemon/commands/commands.h"
#include "daemon/core/arguments.h"
#include "daemon/core/scope.h"
#include "daemon/language/criteria.h"
#include "daemon/language/filters.h"
#include "daemon/language/question.h"

namespace maru::daemon {
namespace {

using index::Query;

constexpr std::size_t kMaxQueries = 64;
constexpr std::size_t kMaxNameBytes = 4096;

/// One of the named queries.
struct Part {
  std::string name;
  std::vector<std::string> users;
  bool any_word = false;
  Query filter;
};

/// A query's own type is its last "file_type" filter: askers add each query's filters to those of
/// the queries before, and expect the count of the type just added.
Part ReadPart(const Json::Value& item, bool blank) {
  const Arguments part(item, "data.queries", {"name", "query"});
  if (!part.Has("name")) part.Refuse("name", "is missing");
  const Arguments query(part.Object("query"), "data.queries.query",
                        {"filters", "default_search_op"});
  Filters filters = ReadFilters(query);
  Part read{part.String("name", kMaxNameBytes), std::move(filters.users), ReadAnyWord(query), {}};
  std::optional<Query> kinds;
  if (!filters.types.empty()) kinds = ParseKinds(filters.types.back());
  if (kinds) {
    read.filter = std::move(*kinds);
  } else if (blank) {
    read.filter.kind = Query::Kind::kNothing;
  }
  return read;
}

}  // namespace

Json::Value IndicateCommand(const Request& request) {
  const Arguments data(request.data, "data",
                       {"keyword", "indice", "criteria_list", "search_weight_list", "queries"});
  const Question question = ReadQuestion(data);
  const bool blank = AsksNothing(question);
  const std::vector<std::string> ids = data.Strings("indice", kMaxIndices, kMaxIndexId);

  // Queries with the same eyes and the same operator share one pass; in practice that is all.
  std::map<std::pair<std::vector<std::string>, bool>, std::vector<Part>> passes;
  for (const Json::Value& item : data.Array("queries", kMaxQueries)) {
    Part part = ReadPart(item, blank);
    passes[{part.users, part.any_word}].push_back(std::move(part));
  }
  Json::Value counts(Json::objectValue);
  for (const auto& [kind_of_pass, parts] : passes) {
    const auto& [users, any_word] = kind_of_pass;
    for (const Part& part : parts) counts[part.name] = 0;
    const Scope scope = ScopeOf(request.core, EyesOf(request.caller, users), ids);
    if (scope.places.empty()) continue;
    std::vector<Query> filters;
    for (const Part& part : parts) filters.push_back(part.filter);
    const Query query = blank ? Query{} : ToQuery(question, any_word);
    const auto found = OpenReader(request.core, scope)->Count(query, filters, request.cancelled);
    for (std::size_t i = 0; i < parts.size(); ++i) {
      counts[parts[i].name] = Json::UInt64{found[i]};
    }
  }
  return counts;
}

}  // namespace maru::daemon
