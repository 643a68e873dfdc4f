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

Xapian::Query Scaled(Xapian::Query query, double weight) {
  return weight == 1 ? query : Xapian::Query(Xapian::Query::OP_SCALE_WEIGHT, query, weight);
}

bool ArePaired(const std::string& first, const std::string& second) {
  return IsSpacelessWord(first) && IsSpacelessWord(second);
}

Xapian::Query AnyOf(const std::vector<Xapian::Query>& queries) {
  return Xapian::Query(Xapian::Query::OP_OR, queries.begin(), queries.end());
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

Xapian::Query Compiler::CompileWord(const Query& query) {
  std::vector<Xapian::Query> any;
  for (const FieldWeight& where : query.fields) {
    const Field& field = FieldOf(where.field, {FieldType::kText});
    for (const std::string& word : Expand(query, field.prefix)) {
      const bool other_form = query.kind == Query::Kind::kWord && word != query.words[0];
      any.push_back(Scaled(Xapian::Query(TermOf(field.prefix, word)),
                           where.weight * (other_form ? kFormWeight : 1)));
    }
  }
  return AnyOf(any);
}

/// The index keeps no positions of the text: it tells which documents have all the words, and the
/// texts of those tell the rest.
Xapian::Query Compiler::TextPhrase(const std::vector<std::string>& words) {
  const std::string_view prefix = FindField(kText)->prefix;
  std::vector<Xapian::Query> terms;
  bool all_paired = words.size() > 1;
  for (std::size_t i = 0; i < words.size(); ++i) {
    const bool pairs = i > 0 && ArePaired(words[i - 1], words[i]);
    const bool paired = i + 1 < words.size() && ArePaired(words[i], words[i + 1]);
    all_paired = all_paired && (i == 0 || pairs);
    if (pairs) terms.emplace_back(TermOf(prefix, words[i - 1] + words[i]));
    if (!pairs && !paired) terms.emplace_back(TermOf(prefix, words[i]));
  }
  const Xapian::Query all(Xapian::Query::OP_AND, terms.begin(), terms.end());
  if (words.size() == 1 || (words.size() == 2 && all_paired)) return all;
  return Xapian::Query(Xapian::Query::OP_FILTER, all, sources_.Phrase(words));
}

Xapian::Query Compiler::CompilePhrase(const Query& query) {
  std::vector<Xapian::Query> any;
  for (const FieldWeight& where : query.fields) {
    const Field& field = FieldOf(where.field, {FieldType::kText});
    if (where.field == kText) {
      any.push_back(Scaled(TextPhrase(query.words), where.weight));
      continue;
    }
    std::vector<std::string> terms;
    for (const std::string& word : query.words) terms.push_back(TermOf(field.prefix, word));
    any.push_back(Scaled(Xapian::Query(Xapian::Query::OP_PHRASE, terms.begin(), terms.end(),
                                       static_cast<Xapian::termcount>(terms.size())),
                         where.weight));
  }
  return AnyOf(any);
}

Xapian::Query Compiler::CompileValue(const Query& query) {
  const Field& field = FieldOf(query.field, {FieldType::kKeyword, FieldType::kFlag});
  if (field.type == FieldType::kFlag) {
    const Xapian::Query flag(TermOf(field.prefix, "1"));
    return query.text == "1"
               ? Scaled(flag, 0)
               : Xapian::Query(Xapian::Query::OP_AND_NOT, Xapian::Query::MatchAll, flag);
  }
  return Scaled(Xapian::Query(TermOf(field.prefix, query.text)), 0);
}

Xapian::Query Compiler::CompileRange(const Query& query) {
  const Field& field = FieldOf(query.field, {FieldType::kNumber, FieldType::kTime});
  if (!(query.low <= query.high)) return Xapian::Query::MatchNothing;
  return Xapian::Query(Xapian::Query::OP_VALUE_RANGE, static_cast<Xapian::valueno>(field.slot),
                       Xapian::sortable_serialise(query.low),
                       Xapian::sortable_serialise(query.high));
}

Xapian::Query Compiler::CompileParts(const Query& query, unsigned depth) {
  std::vector<Xapian::Query> parts;
  for (const Query& part : query.parts) parts.push_back(Compile(part, depth + 1));
  if (parts.empty()) return Xapian::Query::MatchNothing;
  switch (query.kind) {
    case Query::Kind::kAnd:
      return Xapian::Query(Xapian::Query::OP_AND, parts.begin(), parts.end());
    case Query::Kind::kOr:
      return AnyOf(parts);
    case Query::Kind::kAndNot:
      if (parts.size() == 1) return parts[0];
      return Xapian::Query(Xapian::Query::OP_AND_NOT, parts[0],
                           Xapian::Query(Xapian::Query::OP_OR, parts.begin() + 1, parts.end()));
    default:
      return Xapian::Query(Xapian::Query::OP_FILTER, parts.begin(), parts.end());
  }
}

void Compiler::CountNode(unsigned depth) {
  if (depth > Query::kMaxDepth || ++nodes_ > Query::kMaxNodes) {
    throw BadQuery("The query is too large");
  }
}

Xapian::Query Compiler::Compile(const Query& query, unsigned depth) {
  CountNode(depth);
  switch (query.kind) {
    case Query::Kind::kEverything:
      return Xapian::Query::MatchAll;
    case Query::Kind::kNothing:
      return Xapian::Query::MatchNothing;
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
      return sources_.Under(query.text);
    default:
      return CompileParts(query, depth);
  }
}

Xapian::Query Compiler::Compile(const Query& query) {
  nodes_ = 0;
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
