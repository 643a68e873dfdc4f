#include "daemon/language/question.h"

#include <cmath>
#include <cstdio>

#include "daemon/language/criteria.h"
#include "daemon/language/keyword.h"
#include "index/fields.h"

namespace maru::daemon {
namespace {

using index::Field;
using index::FieldType;
using index::Query;

constexpr std::size_t kMaxFieldName = 64;
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
  for (const Json::Value& item : arguments.Array("search_weight_list", kMaxCriteria)) {
    const Arguments row(item, arguments.NameOf("search_weight_list"), {"field", "weight"});
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

void ReadCriteria(const Arguments& arguments, Question& question) {
  for (const Json::Value& item : arguments.Array("criteria_list", kMaxCriteria)) {
    const Arguments row(item, arguments.NameOf("criteria_list"), {"field", "value"});
    const Field& field = FieldNamed(row.String("field", kMaxFieldName));
    std::optional<Query> query = ParseCriterion(field, row.String("value", kMaxKeywordBytes));
    if (!query) continue;
    auto& kept = field.type == FieldType::kText ? question.words : question.filters;
    kept.push_back(std::move(*query));
  }
}

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

Question ReadQuestion(const Arguments& arguments) {
  Question question;
  question.keyword = arguments.String("keyword", kMaxKeywordBytes);
  question.fields = ReadWeights(arguments);
  ReadCriteria(arguments, question);
  if (auto kinds = ParseKinds(arguments.String("file_type", kMaxKeywordBytes))) {
    question.filters.push_back(std::move(*kinds));
  }
  return question;
}

bool ReadAnyWord(const Arguments& arguments) {
  const std::string name = arguments.String("default_search_op", 8, "AND");
  if (name != "AND" && name != "OR") arguments.Refuse("default_search_op", "is not AND or OR");
  return name == "OR";
}

bool AsksNothing(const Question& question) {
  return question.words.empty() && question.filters.empty() &&
         !ParseKeyword(question.keyword, {question.fields, false});
}

Query ToQuery(const Question& question, bool any_word) {
  std::vector<Query> wanted = question.words;
  if (auto keyword = ParseKeyword(question.keyword, {question.fields, any_word})) {
    wanted.insert(wanted.begin(), std::move(*keyword));
  }
  Query query;
  if (wanted.size() == 1) {
    query = std::move(wanted[0]);
  } else if (!wanted.empty()) {
    query.kind = Query::Kind::kAnd;
    query.parts = std::move(wanted);
  } else if (question.filters.empty()) {
    query.kind = Query::Kind::kNothing;
  }
  if (question.filters.empty()) return query;
  Query narrowed;
  narrowed.kind = Query::Kind::kFilter;
  narrowed.parts.push_back(std::move(query));
  narrowed.parts.insert(narrowed.parts.end(), question.filters.begin(), question.filters.end());
  return narrowed;
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
      return "under " + query.text;
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
