#include <algorithm>
#include <set>

#include "index/engine.h"
#include "index/fields.h"
#include "index/reader_impl.h"
#include "index/tokenizer.h"

/// Suggestions out of the index's words, for one pair of eyes.
namespace maru::index {
namespace {

/// Documents of a word looked at for one that the eyes may see; a word that hides behind more is
/// left out, so that a suggestion's cost is bounded.
constexpr unsigned kMaxLooks = 20'000;
/// Words looked at per suggestion asked for.
constexpr std::size_t kCandidatesPerWord = 8;
constexpr unsigned kMaxVocabulary = 400'000;
constexpr std::size_t kShortestCorrected = 3;
constexpr unsigned kMaxDistance = 2;

std::vector<std::string_view> TextPrefixes(const std::string& only) {
  std::vector<std::string_view> prefixes;
  for (const Field& field : Fields()) {
    if (field.type == FieldType::kText && (only.empty() || only == field.name)) {
      prefixes.push_back(field.prefix);
    }
  }
  return prefixes;
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

bool EngineReader::SomeDocumentSeen(const std::string& term) const {
  if (blind_) return false;
  unsigned looks = 0;
  for (std::size_t share = 0; share < indices_->Count(); ++share) {
    const Xapian::Database& database = indices_->Database(share);
    auto document = database.postlist_begin(term);
    if (document == database.postlist_end(term)) continue;
    if (!eyes_[share]) return true;
    auto value = database.valuestream_begin(kPlaceSlot);
    for (; document != database.postlist_end(term); ++document) {
      if (++looks > kMaxLooks) return false;
      value.skip_to(*document);
      if (value == database.valuestream_end(kPlaceSlot)) break;
      if (value.get_docid() != *document) continue;
      const Place place = Place::Decode(*value);
      if (eyes_[share]->Sees(place.parent, place.condition)) return true;
    }
  }
  return false;
}

std::vector<std::string> EngineReader::Complete(const std::string& field, const std::string& prefix,
                                                std::size_t limit) {
  return OnOneState("Cannot complete a word", [&] {
    std::vector<std::string> words;
    const std::string folded = Fold(prefix);
    if (folded.empty() || indices_->Count() == 0) return words;
    for (const std::string_view field_prefix : TextPrefixes(field)) {
      std::size_t found = 0;
      for (const std::string& word : Compiler::WordsWithPrefix(
               indices_->All(), field_prefix, folded, limit * kCandidatesPerWord)) {
        if (found >= limit) break;
        if (!SomeDocumentSeen(TermOf(field_prefix, word))) continue;
        ++found;
        if (std::find(words.begin(), words.end(), word) == words.end()) words.push_back(word);
      }
    }
    if (words.size() > limit) words.resize(limit);
    return words;
  });
}

std::vector<std::string> EngineReader::Correct(const std::string& word, std::size_t limit) {
  return OnOneState("Cannot correct a word", [&] {
    std::vector<std::string> words;
    const std::string folded = Fold(word);
    if (folded.size() < kShortestCorrected || folded.size() > kMaxWord || indices_->Count() == 0) {
      return words;
    }
    const unsigned most = folded.size() < 6 ? 1 : kMaxDistance;
    struct Candidate {
      unsigned distance;
      Xapian::doccount frequency;
      std::string word;
      std::string term;
    };
    std::vector<Candidate> candidates;
    for (const std::string_view prefix : TextPrefixes("")) {
      // The first letter is rarely mistaken, and it bounds the walk.
      const std::string begin = TermOf(prefix, folded.substr(0, 1));
      unsigned looked = 0;
      const Xapian::Database& database = indices_->All();
      for (auto term = database.allterms_begin(begin); term != database.allterms_end(begin);
           ++term) {
        if (++looked > kMaxVocabulary) break;
        std::string other = (*term).substr(prefix.size());
        const unsigned distance = Distance(folded, other, most);
        if (distance == 0 || distance > most) continue;
        candidates.push_back({distance, term.get_termfreq(), std::move(other), *term});
      }
    }
    std::sort(candidates.begin(), candidates.end(), [](const Candidate& a, const Candidate& b) {
      return a.distance != b.distance ? a.distance < b.distance : a.frequency > b.frequency;
    });
    std::set<std::string> taken;
    std::size_t looked = 0;
    for (const Candidate& candidate : candidates) {
      if (words.size() >= limit || ++looked > limit * kCandidatesPerWord) break;
      if (taken.contains(candidate.word) || !SomeDocumentSeen(candidate.term)) continue;
      taken.insert(candidate.word);
      words.push_back(candidate.word);
    }
    return words;
  });
}

}  // namespace maru::index
