#include "index/compile.h"

#include <algorithm>

#include "index/engine.h"
#include "index/fields.h"
#include "index/tokenizer.h"

namespace maru::index {
namespace {

/// Other forms of a word count this much less than the word itself.
constexpr double kFormWeight = 0.6;
constexpr std::size_t kMaxForms = 12;
/// Words of the vocabulary looked at for forms of one word.
constexpr unsigned kMaxFormCandidates = 2000;
constexpr std::size_t kShortestStemmed = 3;

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

/// Words of Latin letters alone have English forms; everything else stands for itself.
bool HasForms(const std::string& word) {
  return word.size() >= kShortestStemmed &&
         std::all_of(word.begin(), word.end(), [](char c) { return c >= 'a' && c <= 'z'; });
}

const Xapian::Stem& Stemmer() {
  thread_local const Xapian::Stem stemmer("english");
  return stemmer;
}

}  // namespace

std::vector<std::string> Compiler::WordsWithPrefix(const Xapian::Database& database,
                                                   std::string_view field_prefix,
                                                   const std::string& prefix, std::size_t limit) {
  const std::string begin = TermOf(field_prefix, prefix);
  std::vector<std::pair<Xapian::doccount, std::string>> words;
  const auto rarer = [](const auto& a, const auto& b) { return a.first > b.first; };
  for (auto term = database.allterms_begin(begin); term != database.allterms_end(begin); ++term) {
    const Xapian::doccount frequency = term.get_termfreq();
    if (words.size() == limit && frequency <= words.front().first) continue;
    words.emplace_back(frequency, (*term).substr(field_prefix.size()));
    std::push_heap(words.begin(), words.end(), rarer);
    if (words.size() <= limit) continue;
    std::pop_heap(words.begin(), words.end(), rarer);
    words.pop_back();
  }
  std::sort_heap(words.begin(), words.end(), rarer);
  std::vector<std::string> result;
  for (auto& [frequency, word] : words) result.push_back(std::move(word));
  return result;
}

/// Words of the vocabulary with the stem of `word`, itself left out. Found by their common
/// beginning, so the index needs no stems.
std::vector<std::string> Compiler::Forms(const std::string& word, std::string_view field_prefix) {
  std::vector<std::string> forms;
  if (!HasForms(word)) return forms;
  const std::string stem = Stemmer()(word);
  // "citi" is the stem of "city" and "cities".
  const std::size_t common = stem.ends_with('i') ? stem.size() - 1 : stem.size();
  const std::string begin = TermOf(field_prefix, stem.substr(0, std::max<std::size_t>(common, 2)));
  unsigned candidates = 0;
  for (auto term = database_.allterms_begin(begin); term != database_.allterms_end(begin); ++term) {
    if (++candidates > kMaxFormCandidates || forms.size() >= kMaxForms) break;
    std::string form = (*term).substr(field_prefix.size());
    if (form.size() <= word.size() + 5 && form != word && HasForms(form) &&
        Stemmer()(form) == stem) {
      forms.push_back(std::move(form));
    }
  }
  return forms;
}

const std::vector<std::string>& Compiler::Expand(const Query& query,
                                                 std::string_view field_prefix) {
  return expansions_.Get({std::string(field_prefix), query.words.at(0), query.kind, query.exact},
                         [&] { return FindExpansion(query, field_prefix); });
}

std::vector<std::string> Compiler::FindExpansion(const Query& query,
                                                 std::string_view field_prefix) {
  const std::string& word = query.words.at(0);
  if (query.kind == Query::Kind::kPrefix) {
    return WordsWithPrefix(database_, field_prefix, word, Query::kMaxExpansion);
  }
  std::vector<std::string> words;
  if (database_.term_exists(TermOf(field_prefix, word))) words.push_back(word);
  if (query.exact) return words;
  for (std::string& form : Forms(word, field_prefix)) words.push_back(std::move(form));
  return words;
}

Plan Compiler::CompileWord(const Query& query) {
  std::vector<Plan> any;
  for (const FieldWeight& where : query.fields) {
    const Field& field = FieldOf(where.field, {FieldType::kText});
    for (const std::string& word : Expand(query, field.prefix)) {
      const bool other_form = query.kind == Query::Kind::kWord && word != query.words[0];
      any.push_back(Plan::Term(TermOf(field.prefix, word))
                        .Scaled(where.weight * (other_form ? kFormWeight : 1)));
    }
  }
  if ((terms_ += any.size()) > Query::kMaxTerms) throw BadQuery("The query is too large");
  return Plan(Plan::Kind::kOr, std::move(any));
}

/// The index keeps no positions of the text: it tells which documents have all the words, and the
/// texts of those tell the rest.
Plan Compiler::TextPhrase(const std::vector<std::string>& words) {
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
  return Plan(Plan::Kind::kFilter, {std::move(all), Plan::Other(sources_.Phrase(words))});
}

Plan Compiler::CompilePhrase(const Query& query) {
  std::vector<Plan> any;
  for (const FieldWeight& where : query.fields) {
    const Field& field = FieldOf(where.field, {FieldType::kText});
    if (where.field == kText) {
      any.push_back(TextPhrase(query.words).Scaled(where.weight));
      continue;
    }
    std::vector<std::string> terms;
    for (const std::string& word : query.words) terms.push_back(TermOf(field.prefix, word));
    any.push_back(Plan::Other(Xapian::Query(Xapian::Query::OP_PHRASE, terms.begin(), terms.end(),
                                            static_cast<Xapian::termcount>(terms.size())))
                      .Scaled(where.weight));
  }
  return Plan(Plan::Kind::kOr, std::move(any));
}

Plan Compiler::CompileValue(const Query& query) {
  const Field& field = FieldOf(query.field, {FieldType::kKeyword, FieldType::kFlag});
  if (field.type != FieldType::kFlag) return Plan::Term(TermOf(field.prefix, query.text)).Scaled(0);
  Plan flag = Plan::Term(TermOf(field.prefix, "1")).Scaled(0);
  if (query.text == "1") return flag;
  return Plan(Plan::Kind::kAndNot, {Plan(Plan::Kind::kEverything, {}), std::move(flag)});
}

Plan Compiler::CompileRange(const Query& query) {
  const Field& field = FieldOf(query.field, {FieldType::kNumber, FieldType::kTime});
  if (!(query.low <= query.high)) return {};
  return Plan::Other(
      Xapian::Query(Xapian::Query::OP_VALUE_RANGE, static_cast<Xapian::valueno>(field.slot),
                    Xapian::sortable_serialise(query.low), Xapian::sortable_serialise(query.high)));
}

Plan Compiler::CompileParts(const Query& query, unsigned depth) {
  std::vector<Plan> parts;
  for (const Query& part : query.parts) parts.push_back(Compile(part, depth + 1));
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

void Compiler::CountNode(unsigned depth) {
  if (depth > Query::kMaxDepth || ++nodes_ > Query::kMaxNodes) {
    throw BadQuery("The query is too large");
  }
}

Plan Compiler::Compile(const Query& query, unsigned depth) {
  CountNode(depth);
  switch (query.kind) {
    case Query::Kind::kEverything:
      return Plan(Plan::Kind::kEverything, {});
    case Query::Kind::kNothing:
      return {};
    case Query::Kind::kWord:
    case Query::Kind::kPrefix:
      if (query.words.empty()) throw BadQuery("A word is missing");
      return CompileWord(query);
    case Query::Kind::kPhrase:
      if (query.words.empty()) throw BadQuery("A word is missing");
      return CompilePhrase(query);
    case Query::Kind::kValue:
      return CompileValue(query);
    case Query::Kind::kRange:
      return CompileRange(query);
    case Query::Kind::kUnder:
      return Plan::Other(sources_.Under(query.text));
    default:
      return CompileParts(query, depth);
  }
}

Plan Compiler::Compile(const Query& query) {
  nodes_ = 0;
  terms_ = 0;
  return Compile(query, 0);
}

void Compiler::Mark(const Query& query, unsigned depth, std::vector<MarkGroup>& groups) {
  CountNode(depth);
  switch (query.kind) {
    case Query::Kind::kWord:
    case Query::Kind::kPrefix:
    case Query::Kind::kPhrase:
      for (const FieldWeight& where : query.fields) {
        const Field& field = FieldOf(where.field, {FieldType::kText});
        const bool phrase = query.kind == Query::Kind::kPhrase;
        groups.push_back({where.field, phrase ? query.words : Expand(query, field.prefix), phrase});
      }
      return;
    case Query::Kind::kAndNot:
      if (!query.parts.empty()) Mark(query.parts[0], depth + 1, groups);
      return;
    default:
      for (const Query& part : query.parts) Mark(part, depth + 1, groups);
  }
}

std::vector<MarkGroup> Compiler::Marks(const Query& query) {
  nodes_ = 0;
  std::vector<MarkGroup> groups;
  Mark(query, 0, groups);
  return groups;
}

}  // namespace maru::index
