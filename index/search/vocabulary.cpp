#include "index/search/vocabulary.h"

#include <algorithm>
#include <map>

#include "index/store/engine.h"
#include "index/store/fields.h"
#include "index/text/tokenizer.h"

namespace maru::index {

template <>
struct BytesOf<std::vector<WordCount>> {
  std::size_t operator()(const std::vector<WordCount>& words) const {
    std::size_t bytes = 0;
    for (const WordCount& word : words) bytes += sizeof(word) + word.word.size();
    return bytes;
  }
};

namespace {

constexpr char kForms = 'f';
constexpr char kBeginnings = 'b';
/// Words of a vocabulary looked at for forms of one word, and for spellings of one.
constexpr unsigned kMaxFormCandidates = 2000;
constexpr unsigned kMaxSpellings = 400'000;
constexpr std::size_t kShortestStemmed = 3;
constexpr std::size_t kShortestCorrected = 3;
constexpr unsigned kMaxDistance = 2;
/// Documents changed beyond which a vocabulary is better asked anew than they are.
constexpr std::size_t kFewChanged = 64;

using Words = std::vector<WordCount>;

/// Words of Latin letters alone have English forms; everything else stands for itself.
bool HasForms(const std::string& word) {
  return word.size() >= kShortestStemmed &&
         std::all_of(word.begin(), word.end(), [](char c) { return c >= 'a' && c <= 'z'; });
}

const Xapian::Stem& Stemmer() {
  thread_local const Xapian::Stem stemmer("english");
  return stemmer;
}

/// What words stand for a word, or begin with it: found by a common beginning in the vocabulary, so
/// that the index needs no stems.
class Widening {
 public:
  Widening(char kind, const std::string& word) : kind_(kind), word_(word), begin_(word) {
    if (kind != kForms || !HasForms(word)) return;
    stem_ = Stemmer()(word);
    // "citi" is the stem of "city" and "cities".
    const std::size_t common = stem_.ends_with('i') ? stem_.size() - 1 : stem_.size();
    begin_ = stem_.substr(0, std::max<std::size_t>(common, 2));
  }

  /// What they all begin with.
  const std::string& Begin() const { return begin_; }
  bool Takes(const std::string& word) const {
    if (kind_ == kBeginnings || word == word_) return true;
    return !stem_.empty() && word.size() <= word_.size() + 5 && HasForms(word) &&
           Stemmer()(word) == stem_;
  }
  Words In(const Xapian::Database& database, std::string_view field_prefix) const;
  /// Whether a document has words that it takes and that are not among `known`.
  bool FindsNew(const Xapian::Database& database, DocumentId id, std::string_view field_prefix,
                const Words& known) const;

 private:
  const char kind_;
  const std::string word_;
  std::string begin_;
  std::string stem_;
};

Words MostFrequentIn(const Xapian::Database& database, const std::string& prefix,
                     std::string_view field_prefix, std::size_t limit) {
  const std::string begin = TermOf(field_prefix, prefix);
  Words words;
  const auto more = [](const WordCount& a, const WordCount& b) {
    return a.documents > b.documents;
  };
  for (auto term = database.allterms_begin(begin); term != database.allterms_end(begin); ++term) {
    const std::uint64_t documents = term.get_termfreq();
    if (words.size() == limit && documents <= words.front().documents) continue;
    words.push_back({(*term).substr(field_prefix.size()), documents});
    std::push_heap(words.begin(), words.end(), more);
    if (words.size() <= limit) continue;
    std::pop_heap(words.begin(), words.end(), more);
    words.pop_back();
  }
  std::sort_heap(words.begin(), words.end(), more);
  return words;
}

Words Widening::In(const Xapian::Database& database, std::string_view field_prefix) const {
  if (kind_ == kBeginnings) {
    return MostFrequentIn(database, word_, field_prefix, Query::kMaxExpansion);
  }
  Words words;
  if (const auto documents = database.get_termfreq(TermOf(field_prefix, word_))) {
    words.push_back({word_, documents});
  }
  if (stem_.empty()) return words;
  const std::string begin = TermOf(field_prefix, begin_);
  unsigned candidates = 0;
  for (auto term = database.allterms_begin(begin); term != database.allterms_end(begin); ++term) {
    if (++candidates > kMaxFormCandidates || words.size() > Query::kMaxForms) break;
    std::string word = (*term).substr(field_prefix.size());
    if (word != word_ && Takes(word)) words.push_back({std::move(word), term.get_termfreq()});
  }
  return words;
}

bool Widening::FindsNew(const Xapian::Database& database, DocumentId id,
                        std::string_view field_prefix, const Words& known) const {
  try {
    const std::string begin = TermOf(field_prefix, begin_);
    auto term = database.termlist_begin(id);
    const auto end = database.termlist_end(id);
    if (term != end) term.skip_to(begin);
    for (; term != end && (*term).starts_with(begin); ++term) {
      const std::string word = (*term).substr(field_prefix.size());
      const bool is_known = std::any_of(known.begin(), known.end(),
                                        [&](const WordCount& row) { return row.word == word; });
      if (!is_known && Takes(word)) return true;
    }
  } catch (const Xapian::DocNotFoundError&) {
    // Gone: it brings no words.
  }
  return false;
}

/// Edits (insert, remove, replace, swap neighbours) from one word to the other, at most `most` + 1.
unsigned Distance(const std::string& a, const std::string& b, unsigned most) {
  if (a.size() > b.size() + most || b.size() > a.size() + most) return most + 1;
  std::vector<unsigned> before(b.size() + 1), last(b.size() + 1), row(b.size() + 1);
  for (std::size_t j = 0; j <= b.size(); ++j) last[j] = static_cast<unsigned>(j);
  for (std::size_t i = 1; i <= a.size(); ++i) {
    row[0] = static_cast<unsigned>(i);
    unsigned least = row[0];
    for (std::size_t j = 1; j <= b.size(); ++j) {
      const unsigned cost = a[i - 1] == b[j - 1] ? 0 : 1;
      row[j] = std::min({last[j] + 1, row[j - 1] + 1, last[j - 1] + cost});
      if (i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1]) {
        row[j] = std::min(row[j], before[j - 2] + 1);
      }
      least = std::min(least, row[j]);
    }
    if (least > most) return most + 1;
    before.swap(last);
    last.swap(row);
  }
  return last[b.size()];
}

}  // namespace

/// Of all shares, the word itself first, then in the order of words.
std::vector<WordCount> Vocabulary::Widened(char kind, const std::string& word,
                                           std::string_view field_prefix) const {
  const Widening widening(kind, word);
  const std::string name = std::string(field_prefix) + ' ' + word;
  std::map<std::string, std::uint64_t> all;
  for (const Reader* reader : readers_) {
    const Snapshot& state = reader->State();
    const Xapian::Database& database = reader->Database();
    auto words = state.Find<Words>(kind, name, [&](const auto& old, const CommitChanges& changes) {
      const bool is_new =
          changes.terms.size() > kFewChanged ||
          std::any_of(changes.terms.begin(), changes.terms.end(), [&](DocumentId id) {
            return widening.FindsNew(database, id, field_prefix, *old);
          });
      return is_new ? nullptr : old;
    });
    if (!words) {
      words = std::make_shared<const Words>(widening.In(database, field_prefix));
      state.Keep(kind, name, words);
    }
    for (const WordCount& row : *words) all[row.word] += row.documents;
  }
  Words words;
  if (const auto itself = all.extract(word)) words.push_back({itself.key(), itself.mapped()});
  for (const auto& [other, documents] : all) words.push_back({other, documents});
  return words;
}

std::vector<std::string> Vocabulary::FormsOf(const std::string& word, std::string_view field_prefix,
                                             bool exact) const {
  std::vector<std::string> forms;
  for (WordCount& row : Widened(kForms, word, field_prefix)) {
    if (exact && row.word != word) continue;
    if (forms.size() <= Query::kMaxForms) forms.push_back(std::move(row.word));
  }
  return forms;
}

std::vector<std::string> Vocabulary::BeginningWith(const std::string& prefix,
                                                   std::string_view field_prefix) const {
  Words words = Widened(kBeginnings, prefix, field_prefix);
  std::stable_sort(words.begin(), words.end(), [](const WordCount& a, const WordCount& b) {
    return a.documents > b.documents;
  });
  if (words.size() > Query::kMaxExpansion) words.resize(Query::kMaxExpansion);
  std::vector<std::string> result;
  for (WordCount& row : words) result.push_back(std::move(row.word));
  return result;
}

Xapian::Database Vocabulary::All() const {
  Xapian::Database all;
  for (const Reader* reader : readers_) all.add_database(reader->Database());
  return all;
}

std::vector<WordCount> Vocabulary::MostFrequent(const std::string& prefix,
                                                std::string_view field_prefix,
                                                std::size_t limit) const {
  return MostFrequentIn(All(), prefix, field_prefix, limit);
}

std::vector<Vocabulary::Near> Vocabulary::NearTo(const std::string& word) const {
  std::vector<Near> near;
  if (word.size() < kShortestCorrected || word.size() > kMaxWord) return near;
  const unsigned most = word.size() < 6 ? 1 : kMaxDistance;
  const Xapian::Database all = All();
  for (const Field& field : Fields()) {
    if (field.type != FieldType::kText) continue;
    // The first letter is rarely mistaken, and it bounds the walk.
    const std::string begin = TermOf(field.prefix, word.substr(0, 1));
    unsigned looked = 0;
    for (auto term = all.allterms_begin(begin); term != all.allterms_end(begin); ++term) {
      if (++looked > kMaxSpellings) break;
      std::string other = (*term).substr(field.prefix.size());
      const unsigned distance = Distance(word, other, most);
      if (distance == 0 || distance > most) continue;
      near.push_back({distance, term.get_termfreq(), std::move(other), *term});
    }
  }
  std::sort(near.begin(), near.end(), [](const Near& a, const Near& b) {
    return a.distance != b.distance ? a.distance < b.distance : a.documents > b.documents;
  });
  return near;
}

}  // namespace maru::index
