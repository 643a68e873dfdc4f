#include <algorithm>
#include <map>

#include "index/search/fragment_finder.h"
#include "index/search/planner.h"
#include "index/search/view.h"
#include "index/search/view_state.h"
#include "index/store/fields.h"
#include "index/text/signature.h"

namespace maru::index {
namespace {

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

/// The words that a document has of a word and its other forms, which ascend.
std::vector<std::string> WordsOf(const Reader& reader, DocumentId document,
                                 const std::vector<std::string>& words) {
  const std::string_view prefix = FindField(kText)->prefix;
  std::vector<std::string> has;
  if (words.size() <= kFewWords) {
    for (const std::string& word : words) {
      if (HasTerm(reader, document, TermOf(prefix, word))) has.push_back(word);
    }
    return has;
  }
  auto at = reader.Database().termlist_begin(document);
  const auto end = reader.Database().termlist_end(document);
  for (const std::string& word : words) {
    const std::string term = TermOf(prefix, word);
    if (at != end) at.skip_to(term);
    if (at != end && *at == term) has.push_back(word);
  }
  return has;
}

/// Those of a document's words that begin with another.
std::vector<std::string> WordsBeginningWith(const Reader& reader, DocumentId document,
                                            const std::string& word) {
  const std::string_view prefix = FindField(kText)->prefix;
  const std::string begin = TermOf(prefix, word);
  std::vector<std::string> words;
  auto at = reader.Database().termlist_begin(document);
  const auto end = reader.Database().termlist_end(document);
  if (at != end) at.skip_to(begin);
  for (; at != end && (*at).starts_with(begin); ++at) {
    words.push_back((*at).substr(prefix.size()));
  }
  return words;
}

/// Which words of the groups a document has; of phrases: all.
PresentWords WordsIn(const Reader& reader, DocumentId document, const FragmentFinder& finder) {
  PresentWords present = finder.AllWords();
  for (std::size_t i = 0; i < present.size(); ++i) {
    const MarkGroup& group = finder.Groups()[i];
    const bool prefix = group.kind == MarkGroup::Kind::kPrefix;
    if (group.kind == MarkGroup::Kind::kPhrase) continue;
    present[i].emplace();
    for (const std::string& word : prefix ? WordsBeginningWith(reader, document, group.words[0])
                                          : WordsOf(reader, document, group.words)) {
      present[i]->push_back(HashWord(word));
    }
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
    auto groups = Planner(view.Sights(), view.Ids()).MarksOf(query);
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
    const Reader& reader = view.At(hit.share).Source();
    StoredText& text = state_->text;
    if (!text.Open(reader.Texts(), hit.text)) return {};
    const bool many = text.Chunks() > 1;
    return finder.In(text, many ? WordsIn(reader, hit.document, finder) : finder.AllWords(),
                     options);
  });
}

}  // namespace maru::index
