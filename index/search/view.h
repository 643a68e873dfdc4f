#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "index/search/query.h"
#include "index/store/record.h"
#include "index/text/fragments.h"
#include "system/rights.h"

namespace maru::index {

/// One match, with all that its line in a result and its fragments need.
struct Hit {
  /// Which of the searched shares, as an index into the View's list.
  std::size_t share = 0;
  DocumentId document = 0;
  /// What it goes by outside: an alias of its id, which tells of no other document.
  std::uint32_t alias = 0;
  double score = 0;
  Record record;
  uid_t owner = 0;
  /// Path within the share: "" for the share's own folder, else "/trip/a.jpg".
  std::string path;
  /// Where its text lies.
  TextPlace text;
};

struct SearchOptions {
  std::uint32_t from = 0;
  std::uint32_t size = 0;
  /// Empty: best first. Else a number or time field.
  std::string sort_field;
  bool ascending = false;
  /// Added to the score of single documents: (share, document) -> addend, in units of a strong
  /// match.
  std::map<std::pair<std::size_t, DocumentId>, double> boosts;
};

struct SearchResult {
  /// Exact number of matches these eyes may see.
  std::uint64_t total = 0;
  std::vector<Hit> hits;
};

/// Thrown out of a View whose `cancelled` said true.
struct Cancelled {};

/// Asked now and then; true when nobody waits for an answer any more. May be null.
using IsCancelled = std::function<bool()>;

/// Some shares' indices, each at one commit, through one user's eyes, for one request: a document
/// that these may not read does not exist here. One thread at a time. Throws Error (120: a query it
/// does not take; 121: the index cannot be read) and Cancelled.
class View {
 public:
  class State;
  explicit View(std::unique_ptr<State> state);
  ~View();
  View(const View&) = delete;
  View& operator=(const View&) = delete;

  SearchResult Search(const Query& query, const SearchOptions& options);

  /// How many matches of `query` each of `filters` keeps (kFilter without weights), in one pass.
  std::vector<std::uint64_t> Count(const Query& query, const std::vector<Query>& filters);

  /// A document by its id, by its path within the share ("" is the share itself), or by its alias;
  /// none when it does not exist.
  std::optional<Hit> Find(std::size_t share, DocumentId document);
  std::optional<Hit> Find(std::size_t share, std::string_view path);
  std::optional<Hit> FindAlias(std::size_t share, std::uint32_t alias);

  /// Words of `field` ("" for all text fields, one after the other) that begin with `prefix`, those
  /// in most documents first; at most `limit`.
  std::vector<std::string> Complete(const std::string& field, const std::string& prefix,
                                    std::size_t limit);
  /// Words of the text fields within a small edit distance of `word`, nearest and commonest first.
  std::vector<std::string> Correct(const std::string& word, std::size_t limit);

  /// Documents in all shares, whoever may read them: for those who run the server.
  std::uint64_t Documents();

 private:
  friend class Highlighter;
  std::unique_ptr<State> state_;
};

/// Shows where hits match a query, from what the index stored of them. One thread at a time.
class Highlighter {
 public:
  /// Hits come from this view, which outlives the object.
  Highlighter(View& view, Query query);
  ~Highlighter();
  Highlighter(const Highlighter&) = delete;
  Highlighter& operator=(const Highlighter&) = delete;

  /// The best fragments of a text field; none when it holds no match. Throws Error (120) for
  /// another field.
  std::vector<Fragment> FragmentsOf(const Hit& hit, const FragmentOptions& options);

 private:
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace maru::index
