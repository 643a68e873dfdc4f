#include "index/search/vocabulary.h"

#include <algorithm>
#include <array>
#include <map>
#include <set>

#include "index/store/engine.h"
#include "index/store/fields.h"
#include "index/text/tokenizer.h"

namespace maru::index {

using Words = std::vector<std::string>;

template <>
struct BytesOf<Words> {
  std::size_t operator()(const Words& words) const {
    std::size_t bytes = 0;
    for (const std::string& word : words) bytes += sizeof(word) + word.size();
    return bytes;
  }
};

namespace {

constexpr char kForms = 'f';
constexpr std::size_t kShortestStemmed = 3;
/// Letters that an ending may add to a word.
constexpr std::size_t kLongestEnding = 5;
constexpr std::size_t kShortestCorrected = 3;
constexpr std::size_t kMaxDistance = 2;
/// Documents changed beyond which a vocabulary is better asked anew than they are.
constexpr std::size_t kFewChanged = 64;
constexpr unsigned kTermsBetweenPolls = 4096;
/// So many documents are read themselves, for which of their words begin with a prefix.
constexpr std::size_t kFewDocuments = 128;

/// Words of Latin letters alone have English forms; everything else stands for itself.
bool HasForms(const std::string& word) {
  return word.size() >= kShortestStemmed &&
         std::all_of(word.begin(), word.end(), [](char c) { return c >= 'a' && c <= 'z'; });
}

const Xapian::Stem& Stemmer() {
  thread_local const Xapian::Stem stemmer("english");
  return stemmer;
}

/// The other words of a word's stem in a field: found by a common beginning in the vocabulary, so
/// that the index needs no stems.
class Forms {
 public:
  Forms(const std::string& word, std::string_view field_prefix)
      : word_(word), field_prefix_(field_prefix), stem_(Stemmer()(word)) {
    // "citi" is the stem of "city" and "cities".
    const std::size_t common = stem_.ends_with('i') ? stem_.size() - 1 : stem_.size();
    begin_ = TermOf(field_prefix, stem_.substr(0, std::max<std::size_t>(common, 2)));
  }

  Words In(const Xapian::Database& database, const std::function<void()>& poll) const {
    Words words;
    const auto end = database.allterms_end(begin_);
    unsigned looked = 0;
    for (auto term = database.allterms_begin(begin_); term != end; ++term) {
      if (++looked % kTermsBetweenPolls == 0) poll();
      std::string word = (*term).substr(field_prefix_.size());
      if (IsOne(word)) words.push_back(std::move(word));
    }
    return words;
  }
  /// Whether a document has forms that are not among `known`, which are in their order.
  bool FindsNew(const Xapian::Database& database, DocumentId id, const Words& known) const {
    try {
      auto term = database.termlist_begin(id);
      const auto end = database.termlist_end(id);
      if (term != end) term.skip_to(begin_);
      for (; term != end && (*term).starts_with(begin_); ++term) {
        const std::string word = (*term).substr(field_prefix_.size());
        if (!std::binary_search(known.begin(), known.end(), word) && IsOne(word)) return true;
      }
    } catch (const Xapian::DocNotFoundError&) {
      // Gone: it brings no words.
    }
    return false;
  }

 private:
  bool IsOne(const std::string& word) const {
    return word != word_ && word.size() <= word_.size() + kLongestEnding && HasForms(word) &&
           Stemmer()(word) == stem_;
  }

  const std::string& word_;
  const std::string_view field_prefix_;
  const std::string stem_;
  std::string begin_;
};

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

Words Vocabulary::OtherFormsOf(const std::string& word, std::string_view field_prefix) const {
  if (!HasForms(word)) return {};
  const Forms forms(word, field_prefix);
  const std::string name = TermOf(field_prefix, word);
  Words all;
  for (const Sight& share : shares_) {
    const Snapshot& state = share.State();
    const Xapian::Database& database = share.Source().Database();
    auto words = state.Find<Words>(kForms, name, [&](const auto& old, const auto& changes) {
      const bool is_new =
          changes.terms.size() > kFewChanged ||
          std::any_of(changes.terms.begin(), changes.terms.end(),
                      [&](DocumentId id) { return forms.FindsNew(database, id, *old); });
      return is_new ? nullptr : old;
    });
    if (!words) {
      words = std::make_shared<const Words>(forms.In(database, share.Poller()));
      state.Keep(kForms, name, words);
    }
    Words joined;
    std::set_union(all.begin(), all.end(), words->begin(), words->end(),
                   std::back_inserter(joined));
    all = std::move(joined);
  }
  return all;
}

void Vocabulary::Poll() const {
  if (!shares_.empty()) shares_.front().Poll();
}

Xapian::Database Vocabulary::All() const {
  Xapian::Database all;
  for (const Sight& share : shares_) all.add_database(share.Source().Database());
  return all;
}

std::uint64_t Vocabulary::FrequencyOf(const std::string& term) {
  std::uint64_t documents = 0;
  for (Sight& share : shares_) documents += share.FrequencyOf(term, false);
  return documents;
}

/// The words of the candidates that most documents seen have. No more are counted than could be
/// among them: of no term more documents are seen than there are.
Words Vocabulary::MostSeen(std::vector<Candidate> candidates, std::size_t limit) {
  std::sort(candidates.begin(), candidates.end(),
            [](const Candidate& a, const Candidate& b) { return a.most > b.most; });
  struct Counted {
    std::uint64_t documents;
    std::string word;
    bool operator<(const Counted& other) const {
      return documents != other.documents ? documents > other.documents : word < other.word;
    }
  };
  std::set<Counted> best;
  for (const Candidate& candidate : candidates) {
    if (best.size() == limit && (limit == 0 || candidate.most < best.rbegin()->documents)) break;
    Poll();
    const std::uint64_t documents = FrequencyOf(candidate.term);
    if (documents == 0) continue;
    best.insert({documents, candidate.term.substr(candidate.field_prefix.size())});
    if (best.size() > limit) best.erase(std::prev(best.end()));
  }
  Words words;
  for (const Counted& row : best) words.push_back(row.word);
  return words;
}

/// The terms of the few documents seen that have one; none when they are many.
std::optional<std::vector<Vocabulary::Candidate>> Vocabulary::CandidatesOfFew(
    const std::string& begin, std::string_view field_prefix) {
  std::map<std::string, std::uint64_t> terms;
  for (Sight& share : shares_) {
    const auto few = share.FewBeginning(begin, kFewDocuments);
    if (!few) return std::nullopt;
    const Xapian::Database& database = share.Source().Database();
    for (const DocumentId id : *few) {
      auto term = database.termlist_begin(id);
      const auto end = database.termlist_end(id);
      for (term.skip_to(begin); term != end && (*term).starts_with(begin); ++term) ++terms[*term];
    }
  }
  std::vector<Candidate> candidates;
  for (auto& [term, documents] : terms) candidates.push_back({term, field_prefix, documents});
  return candidates;
}

Words Vocabulary::Beginning(const std::string& prefix, std::string_view field_prefix,
                            std::size_t limit) {
  const std::string begin = TermOf(field_prefix, prefix);
  if (auto few = CandidatesOfFew(begin, field_prefix)) return MostSeen(std::move(*few), limit);
  std::vector<Candidate> candidates;
  const Xapian::Database all = All();
  const auto end = all.allterms_end(begin);
  for (auto term = all.allterms_begin(begin); term != end; ++term) {
    candidates.push_back({*term, field_prefix, term.get_termfreq()});
    if (candidates.size() % kTermsBetweenPolls == 0) Poll();
  }
  return MostSeen(std::move(candidates), limit);
}

Words Vocabulary::Near(const std::string& word, std::size_t limit) {
  if (word.size() < kShortestCorrected || word.size() > kMaxWord) return {};
  const unsigned most = word.size() < 6 ? 1 : kMaxDistance;
  std::array<std::vector<Candidate>, kMaxDistance + 1> by_distance;
  const Xapian::Database all = All();
  unsigned looked = 0;
  for (const Field& field : Fields()) {
    if (field.type != FieldType::kText) continue;
    // The first letter is rarely mistaken, and it bounds the walk.
    const std::string begin = TermOf(field.prefix, word.substr(0, 1));
    const auto end = all.allterms_end(begin);
    for (auto term = all.allterms_begin(begin); term != end; ++term) {
      if (++looked % kTermsBetweenPolls == 0) Poll();
      const unsigned distance = Distance(word, (*term).substr(field.prefix.size()), most);
      if (distance == 0 || distance > most) continue;
      by_distance[distance].push_back({*term, field.prefix, term.get_termfreq()});
    }
  }
  Words near;
  for (std::vector<Candidate>& candidates : by_distance) {
    for (std::string& other : MostSeen(std::move(candidates), limit)) {
      const bool taken = std::find(near.begin(), near.end(), other) != near.end();
      if (!taken && near.size() < limit) near.push_back(std::move(other));
    }
  }
  return near;
}

}  // namespace maru::index
