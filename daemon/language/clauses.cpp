#include "daemon/language/clauses.h"

#include "daemon/language/criteria.h"
#include "daemon/language/keyword.h"
#include "daemon/language/query_tree.h"
#include "index/store/fields.h"

namespace maru::daemon {
namespace {

using index::Field;
using index::FieldType;
using index::Query;

constexpr std::size_t kMaxCriteria = 32;
constexpr std::size_t kMaxFilters = 256;
constexpr std::size_t kMaxFilterData = 4096;
constexpr double kMaxWeight = 1000;

const Field& FieldNamed(const std::string& name) {
  const Field* field = index::FindField(name);
  if (!field) throw BadParameter("Unknown field " + Quoted(name));
  return *field;
}

std::vector<index::FieldWeight> ReadWeights(const Arguments& arguments) {
  std::vector<index::FieldWeight> weights;
  for (const Field& field : index::Fields()) {
    if (field.type == FieldType::kText && field.weight > 0) {
      weights.push_back({std::string(field.name), field.weight});
    }
  }
  for (const Arguments& row :
       arguments.Objects("search_weight_list", kMaxCriteria, {"field", "weight"})) {
    const Field& field = FieldNamed(row.String("field", kMaxFieldName));
    if (field.type != FieldType::kText) {
      throw BadParameter(std::string(field.name) + " is not a text field and has no weight");
    }
    const double weight = row.Number("weight", 0, kMaxWeight);
    std::erase_if(weights, [&](const auto& known) { return known.field == field.name; });
    if (weight > 0) weights.push_back({std::string(field.name), weight});
  }
  return weights;
}

void ReadCriteria(const Arguments& arguments, QueryClauses& clauses) {
  for (const Arguments& row :
       arguments.Objects("criteria_list", kMaxCriteria, {"field", "value"})) {
    const Field& field = FieldNamed(row.String("field", kMaxFieldName));
    std::optional<Query> query = ParseCriterion(field, row.String("value", kMaxKeywordBytes));
    if (!query) continue;
    auto& list = field.type == FieldType::kText ? clauses.scored : clauses.filters;
    list.push_back(std::move(*query));
  }
}

}  // namespace

QueryClauses ReadClauses(const Arguments& arguments) {
  QueryClauses clauses;
  clauses.keyword = arguments.String("keyword", kMaxKeywordBytes);
  clauses.fields = ReadWeights(arguments);
  ReadCriteria(arguments, clauses);
  if (auto kinds = ParseKinds(arguments.String("file_type", kMaxKeywordBytes))) {
    clauses.filters.push_back(std::move(*kinds));
  }
  return clauses;
}

Filters ReadFilters(const Arguments& arguments) {
  Filters filters;
  for (const Arguments& filter : arguments.Objects("filters", kMaxFilters, {"name", "data"})) {
    const std::string name = filter.String("name", kMaxFilterData);
    if (name != "permission" && name != "file_type") {
      throw BadParameter("Unknown filter " + Quoted(name));
    }
    filter.Require("data");
    auto& list = name == "permission" ? filters.users : filters.types;
    list.push_back(filter.String("data", kMaxFilterData));
  }
  return filters;
}

bool ReadAnyWord(const Arguments& arguments) {
  const std::string name = arguments.String("default_search_op", 8, "AND");
  if (name != "AND" && name != "OR") arguments.Refuse("default_search_op", "is not AND or OR");
  return name == "OR";
}

bool IsBlank(const QueryClauses& clauses) {
  return clauses.scored.empty() && clauses.filters.empty() &&
         !ParseKeyword(clauses.keyword, clauses.fields);
}

Query ToQuery(const QueryClauses& clauses, bool any_word) {
  std::vector<Query> scored = clauses.scored;
  if (auto keyword = ParseKeyword(clauses.keyword, clauses.fields, any_word)) {
    scored.insert(scored.begin(), std::move(*keyword));
  }
  const bool everything = scored.empty() && !clauses.filters.empty();
  std::vector<Query> narrowed = clauses.filters;
  narrowed.insert(narrowed.begin(),
                  everything ? Query{} : Join(Query::Kind::kAnd, std::move(scored)));
  return Join(Query::Kind::kFilter, std::move(narrowed));
}

}  // namespace maru::daemon
