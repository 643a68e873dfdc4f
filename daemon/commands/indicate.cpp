#include <map>

#include "daemon/commands/commands.h"
#include "daemon/core/arguments.h"
#include "daemon/core/scope.h"
#include "daemon/language/clauses.h"
#include "daemon/language/criteria.h"
#include "daemon/language/query_tree.h"

namespace maru::daemon {
namespace {

using index::Query;

constexpr std::size_t kMaxQueries = 64;
constexpr std::size_t kMaxNameBytes = 4096;

/// One of the named queries: what is counted.
struct Facet {
  std::string name;
  std::vector<std::string> users;
  bool any_word = false;
  Query filter;
};

/// A query's own type is its last "file_type" filter: askers add each query's filters to those of
/// the queries before, and expect the count of the type just added.
Facet ReadFacet(const Arguments& named, bool blank) {
  named.Require("name");
  const Arguments query = named.Object("query", {"filters", "default_search_op"});
  Filters filters = ReadFilters(query);
  Facet facet{named.String("name", kMaxNameBytes), std::move(filters.users), ReadAnyWord(query),
              blank ? Nothing() : Query{}};
  if (filters.types.empty()) return facet;
  if (auto kinds = ParseKinds(filters.types.back())) facet.filter = std::move(*kinds);
  return facet;
}

}  // namespace

Json::Value IndicateCommand(const Request& request) {
  const Arguments data(request.data, "data",
                       {"keyword", "indice", "criteria_list", "search_weight_list", "queries"});
  const QueryClauses clauses = ReadClauses(data);
  const bool blank = IsBlank(clauses);
  const std::vector<std::string> ids = data.Strings("indice", kMaxIndices, kMaxIndexId);

  // Facets with the same eyes and the same operator share one pass; in practice that is all.
  std::map<std::pair<std::vector<std::string>, bool>, std::vector<Facet>> passes;
  for (const Arguments& named : data.Objects("queries", kMaxQueries, {"name", "query"})) {
    Facet facet = ReadFacet(named, blank);
    passes[{facet.users, facet.any_word}].push_back(std::move(facet));
  }
  Json::Value counts(Json::objectValue);
  for (const auto& [what, facets] : passes) {
    const auto& [users, any_word] = what;
    for (const Facet& facet : facets) counts[facet.name] = 0;
    const Scope scope = ScopeOf(request, EyesOf(request.caller, users), ids);
    if (scope.indices.empty()) continue;
    std::vector<Query> filters;
    for (const Facet& facet : facets) filters.push_back(facet.filter);
    const Query query = blank ? Query{} : ToQuery(clauses, any_word);
    const auto found = OpenView(request.core, scope, request.cancelled)->Count(query, filters);
    for (std::size_t i = 0; i < facets.size(); ++i) {
      counts[facets[i].name] = Json::UInt64{found[i]};
    }
  }
  return counts;
}

}  // namespace maru::daemon
