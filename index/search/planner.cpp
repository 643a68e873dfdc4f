#include "index/search/planner.h"

#include <algorithm>

#include "index/search/eyes.h"
#include "index/store/engine.h"
#include "index/store/fields.h"
#include "index/text/tokenizer.h"

namespace maru::index {
namespace {

/// Other forms of a word count this much less than the word itself.
constexpr double kFormWeight = 0.6;

maruseeker::Error BadQuery(const std::string& why) {
  return maruseeker::Error(maruseeker::kErrorBadParameter, why);
}

const Field& FieldOf(const std::string& name, std::initializer_list<FieldType> types) {
  const Field* field = FindField(name);
  if (!field) throw BadQuery("Unknown field: " + name);
  if (std::find(types.begin(), types.end(), field->type) == types.end()) {
    throw BadQuery("The field " + name + " cannot be searched this way");
  }
  return *field;
}

bool ArePaired(const std::string& first, const std::string& second) {
  return IsSpacelessWord(first) && IsSpacelessWord(second);
}

}  // namespace

/// Charged by its form: what a query costs must not tell which words documents have.
void Planner::CountWords(std::size_t words) {
  terms_ += words;
  if (terms_ > Query::kMaxTerms) throw BadQuery("The query is too large");
}

Plan Planner::MakeWord(const Query& query) {
  CountWords(query.fields.size() * (query.exact ? 1 : Query::kWidened));
  const std::string& word = query.words[0];
  std::vector<Plan> any;
  for (const FieldWeight& where : query.fields) {
    const Field& field = FieldOf(where.field, {FieldType::kText});
    any.push_back(Plan::Term(TermOf(field.prefix, word)).Scaled(where.weight));
    if (query.exact) continue;
    for (const std::string& form : vocabulary_.OtherFormsOf(word, field.prefix)) {
      any.push_back(Plan::Term(TermOf(field.prefix, form)).Scaled(where.weight * kFormWeight));
    }
  }
  return Plan(Plan::Kind::kOr, std::move(any));
}

Plan Planner::MakePrefix(const Query& query) {
  CountWords(query.fields.size() * Query::kWidened);
  std::vector<Plan> any;
  for (const FieldWeight& where : query.fields) {
    const Field& field = FieldOf(where.field, {FieldType::kText});
    any.push_back(Plan::Prefix(TermOf(field.prefix, query.words[0])).Scaled(where.weight));
  }
  return Plan(Plan::Kind::kOr, std::move(any));
}

/// The index keeps no positions of the text: it tells which documents have all the words, and the
/// texts of those tell the rest.
Plan Planner::MakeTextPhrase(const std::vector<std::string>& words) {
  const std::string_view prefix = FindField(kText)->prefix;
  std::vector<Plan> terms;
  bool all_paired = words.size() > 1;
  for (std::size_t i = 0; i < words.size(); ++i) {
    const bool pairs = i > 0 && ArePaired(words[i - 1], words[i]);
    const bool paired = i + 1 < words.size() && ArePaired(words[i], words[i + 1]);
    all_paired = all_paired && (i == 0 || pairs);
    if (pairs) terms.push_back(Plan::Term(TermOf(prefix, words[i - 1] + words[i])));
    if (!pairs && !paired) terms.push_back(Plan::Term(TermOf(prefix, words[i])));
  }
  Plan all = Plan(Plan::Kind::kAnd, std::move(terms));
  if (words.size() == 1 || (words.size() == 2 && all_paired)) return all;
  return Plan(Plan::Kind::kFilter, {std::move(all), Plan::Words(Plan::Kind::kTextPhrase, words)});
}

Plan Planner::MakePhrase(const Query& query) {
  std::vector<Plan> any;
  for (const FieldWeight& where : query.fields) {
    const Field& field = FieldOf(where.field, {FieldType::kText});
    if (where.field == kText) {
      any.push_back(MakeTextPhrase(query.words).Scaled(where.weight));
      continue;
    }
    std::vector<std::string> terms;
    std::vector<Plan> all;
    for (const std::string& word : query.words) {
      terms.push_back(TermOf(field.prefix, word));
      all.push_back(Plan::Term(terms.back()));
    }
    any.push_back(Plan(Plan::Kind::kFilter, {Plan(Plan::Kind::kAnd, std::move(all)),
                                             Plan::Words(Plan::Kind::kPositions, std::move(terms))})
                      .Scaled(where.weight));
  }
  return Plan(Plan::Kind::kOr, std::move(any));
}

Plan Planner::MakeValue(const Query& query) {
  const Field& field = FieldOf(query.field, {FieldType::kKeyword, FieldType::kFlag});
  if (field.type != FieldType::kFlag) return Plan::Term(TermOf(field.prefix, query.text)).Scaled(0);
  Plan flag = Plan::Term(TermOf(field.prefix, "1")).Scaled(0);
  if (query.text == "1") return flag;
  return Plan(Plan::Kind::kAndNot, {Plan(Plan::Kind::kEverything, {}), std::move(flag)});
}

Plan Planner::MakeRange(const Query& query) {
  const Field& field = FieldOf(query.field, {FieldType::kNumber, FieldType::kTime});
  if (!(query.low <= query.high)) return {};
  return Plan::Range(static_cast<unsigned>(field.slot), query.low, query.high);
}

/// A path is resolved once for each share it lies in.
Plan Planner::MakeUnder(const Query& query) {
  Plan plan(Plan::Kind::kUnder, {});
  for (std::size_t share = 0; share < shares_.size(); ++share) {
    FolderSet& set = plan.under.emplace_back();
    if (query.field != ids_[share] && !query.field.empty()) continue;
    set.whole = query.text.empty();
    const auto entry = set.whole ? std::nullopt : shares_[share].Source().Resolve(query.text);
    if (!entry) continue;
    set.self = entry->document;
    if (entry->directory) {
      set.folders = FoldersUnder(shares_[share].State().Table(), entry->directory);
    }
  }
  return plan;
}

Plan Planner::MakeParts(const Query& query, unsigned depth) {
  std::vector<Plan> parts;
  for (const Query& part : query.parts) parts.push_back(Make(part, depth + 1));
  if (parts.empty()) return {};
  switch (query.kind) {
    case Query::Kind::kAnd:
      return Plan(Plan::Kind::kAnd, std::move(parts));
    case Query::Kind::kOr:
      return Plan(Plan::Kind::kOr, std::move(parts));
    case Query::Kind::kAndNot:
      return Plan(Plan::Kind::kAndNot, std::move(parts));
    default:
      return Plan(Plan::Kind::kFilter, std::move(parts));
  }
}

void Planner::CountNode(unsigned depth) {
  if (depth > Query::kMaxDepth || ++nodes_ > Query::kMaxNodes) {
    throw BadQuery("The query is too large");
  }
}

Plan Planner::Make(const Query& query, unsigned depth) {
  CountNode(depth);
  switch (query.kind) {
    case Query::Kind::kEverything:
      return Plan(Plan::Kind::kEverything, {});
    case Query::Kind::kNothing:
      return {};
    case Query::Kind::kWord:
      if (query.words.empty()) throw BadQuery("A word is missing");
      return MakeWord(query);
    case Query::Kind::kPrefix:
      if (query.words.empty()) throw BadQuery("A word is missing");
      return MakePrefix(query);
    case Query::Kind::kPhrase:
      if (query.words.empty()) throw BadQuery("A word is missing");
      return MakePhrase(query);
    case Query::Kind::kValue:
      return MakeValue(query);
    case Query::Kind::kRange:
      return MakeRange(query);
    case Query::Kind::kUnder:
      return MakeUnder(query);
    default:
      return MakeParts(query, depth);
  }
}

Plan Planner::PlanOf(const Query& query) {
  nodes_ = 0;
  terms_ = 0;
  return Make(query, 0);
}

MarkGroup Planner::MarkOf(const Query& query, const std::string& field) {
  const Field& row = FieldOf(field, {FieldType::kText});
  if (query.kind == Query::Kind::kPhrase) return {field, query.words, MarkGroup::Kind::kPhrase};
  MarkGroup group{field, {query.words.at(0)}, MarkGroup::Kind::kPrefix};
  if (query.kind == Query::Kind::kPrefix) return group;
  group.kind = MarkGroup::Kind::kWords;
  if (query.exact) return group;
  for (std::string& form : vocabulary_.OtherFormsOf(query.words[0], row.prefix)) {
    group.words.push_back(std::move(form));
  }
  return group;
}

void Planner::Mark(const Query& query, unsigned depth, std::vector<MarkGroup>& groups) {
  CountNode(depth);
  switch (query.kind) {
    case Query::Kind::kWord:
    case Query::Kind::kPrefix:
    case Query::Kind::kPhrase:
      for (const FieldWeight& where : query.fields) groups.push_back(MarkOf(query, where.field));
      return;
    case Query::Kind::kAndNot:
      if (!query.parts.empty()) Mark(query.parts[0], depth + 1, groups);
      return;
    default:
      for (const Query& part : query.parts) Mark(part, depth + 1, groups);
  }
}

std::vector<MarkGroup> Planner::MarksOf(const Query& query) {
  nodes_ = 0;
  std::vector<MarkGroup> groups;
  Mark(query, 0, groups);
  return groups;
}

}  // namespace maru::index
