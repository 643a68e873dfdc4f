#include <algorithm>
#include <map>

#include "index/search/fragment_finder.h"
#include "index/search/planner.h"
#include "index/search/view.h"
#include "index/search/view_state.h"
#include "index/store/fields.h"

namespace maru::index {
namespace {

/// Texts of so few chunks are looked through faster than the index.
constexpr std::size_t kFewChunks = 4;
/// Of more words, a document's list of terms tells sooner than theirs of documents.
constexpr std::size_t kFewWords = 16;

bool HasTerm(const Reader& reader, DocumentId document, const std::string& term) {
  if (const auto postings = reader.PostingsOf(term)) {
    return std::binary_search(postings->ids.begin(), postings->ids.end(), document);
  }
  auto at = reader.Database().postlist_begin(term);
  const auto end = reader.Database().postlist_end(term);
  if (at != end) at.skip_to(document);
  return at != end && *at == document;
}

/// Those of `terms`, which ascend, that a document has.
std::vector<bool> HasTerms(const Reader& reader, DocumentId document,
                           const std::vector<std::string>& terms) {
  std::vector<bool> has;
  if (terms.size() <= kFewWords) {
    for (const std::string& term : terms) has.push_back(HasTerm(reader, document, term));
    return has;
  }
  auto at = reader.Database().termlist_begin(document);
  const auto end = reader.Database().termlist_end(document);
  for (const std::string& term : terms) {
    if (at != end) at.skip_to(term);
    has.push_back(at != end && *at == term);
  }
  return has;
}

/// Which words of the groups a document has; of phrases: all.
PresentWords WordsIn(const Reader& reader, DocumentId document, const FragmentFinder& finder) {
  const std::string prefix(FindField(kText)->prefix);
  PresentWords present = finder.AllWords();
  for (std::size_t i = 0; i < present.size(); ++i) {
    const MarkGroup& group = finder.Groups()[i];
    if (group.phrase || group.words.size() == 1) continue;
    std::vector<std::string> terms;
    for (const std::string& word : group.words) terms.push_back(prefix + word);
    const std::vector<bool> has = HasTerms(reader, document, terms);
    std::vector<std::uint64_t> there;
    for (std::size_t word = 0; word < has.size(); ++word) {
      if (has[word]) there.push_back(present[i][word]);
    }
    present[i] = std::move(there);
  }
  return present;
}

/// A short field as it is shown.
std::string ShownText(const Record& record, const std::string& field) {
  if (field == kName) return record.name;
  if (field == kTitle) return record.title;
  std::string text;
  for (const std::string& author : record.authors) text += (text.empty() ? "" : "; ") + author;
  return text;
}

}  // namespace

struct Highlighter::State {
  View::State& view;
  Query query;
  /// By field.
  std::map<std::string, FragmentFinder> finders;
  StoredText text;

  FragmentFinder& FinderOf(const std::string& field) {
    const auto known = finders.find(field);
    if (known != finders.end()) return known->second;
    auto groups = Planner(view.Readers(), view.Ids()).MarksOf(query);
    std::erase_if(groups, [&](const MarkGroup& group) { return group.field != field; });
    return finders.emplace(field, FragmentFinder(std::move(groups))).first->second;
  }
};

Highlighter::Highlighter(View& view, Query query)
    : state_(new State{*view.state_, std::move(query), {}, {}}) {}
Highlighter::~Highlighter() = default;

std::vector<Fragment> Highlighter::FragmentsOf(const Hit& hit, const FragmentOptions& options) {
  const Field* field = FindField(options.field);
  if (!field || field->type != FieldType::kText) {
    throw maruseeker::Error(maruseeker::kErrorBadParameter, "No fragments of " + options.field);
  }
  View::State& view = state_->view;
  return view.OnOneState("Cannot read a text", [&]() -> std::vector<Fragment> {
    FragmentFinder& finder = state_->FinderOf(options.field);
    if (finder.Groups().empty()) return {};
    if (options.field != kText) return finder.Whole(ShownText(hit.record, options.field));
    const Reader& reader = view.At(hit.share);
    StoredText& text = state_->text;
    if (!text.Open(reader.Texts(), hit.text)) return {};
    const bool many = text.Chunks() > kFewChunks;
    return finder.In(text, many ? WordsIn(reader, hit.document, finder) : finder.AllWords(),
                     options);
  });
}

}  // namespace maru::index
