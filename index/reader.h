#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "index/document.h"
#include "index/query.h"
#include "system/rights.h"

namespace maru::index {

/// One match.
struct Hit {
  /// Which of the searched shares, as an index into the Reader's list.
  std::size_t share = 0;
  DocumentId document = 0;
  double score = 0;
  Record record;
  uid_t owner = 0;
  /// Path within the share: "" for the share's own folder, else "/trip/a.jpg".
  std::string path;
};

struct SearchOptions {
  std::uint32_t from = 0;
  std::uint32_t size = 0;
  /// Empty: best first. Else a number or time field.
  std::string sort_field;
  bool ascending = false;
  /// Asked now and then while matching; true ends the search with Cancelled.
  std::function<bool()> cancelled;
  /// Added to the score of single documents: (share, document) -> addend, in units of a strong
  /// match.
  std::map<std::pair<std::size_t, DocumentId>, double> boosts;
};

struct SearchResult {
  /// Exact number of matches these eyes may see.
  std::uint64_t total = 0;
  std::vector<Hit> hits;
};

/// Thrown by a search whose `cancelled` said true.
struct Cancelled {};

/// A run of a field's text round matches.
struct Fragment {
  /// HTML-escaped, matches marked <mark>like this</mark>.
  std::string html;
  unsigned matches = 0;
};

struct FragmentOptions {
  std::string field;
  /// Length of a fragment in characters, about; whole words are kept.
  std::size_t length = 100;
  std::size_t count = 3;
};

/// A consistent view of some shares' indices for one request. One thread at a time. Throws Error
/// (120: a query it does not take; 121: the index cannot be read).
class Reader {
 public:
  virtual ~Reader() = default;

  /// Whose eyes every later call has; a document that these may not read does not exist for them.
  virtual void SetEyes(const Identity& who) = 0;

  virtual SearchResult Search(const Query& query, const SearchOptions& options) = 0;

  /// How many matches of `query` each of `filters` keeps (kFilter without weights), in one pass.
  virtual std::vector<std::uint64_t> Count(const Query& query, const std::vector<Query>& filters,
                                           const std::function<bool()>& cancelled) = 0;

  /// The best fragments of a field (text content, name, title) for a query's words, from what the
  /// index stored; none when the field holds no match. The document must be visible to the eyes.
  virtual std::vector<Fragment> Fragments(std::size_t share, DocumentId document,
                                          const Query& query, const FragmentOptions& options) = 0;

  /// A document by its id, or by its path within the share ("" is the share itself); none when it
  /// does not exist or the eyes may not read it.
  virtual std::optional<Hit> Find(std::size_t share, DocumentId document) = 0;
  virtual std::optional<Hit> Find(std::size_t share, std::string_view path) = 0;

  /// Words of `field` ("" for all text fields) that begin with `prefix`, by number of documents,
  /// most first, and only words that stand in a document these eyes may read; at most `limit`.
  virtual std::vector<std::string> Complete(const std::string& field, const std::string& prefix,
                                            std::size_t limit) = 0;
  /// Words of the text fields within a small edit distance of `word`, nearest and commonest first;
  /// only such as stand in a document these eyes may read.
  virtual std::vector<std::string> Correct(const std::string& word, std::size_t limit) = 0;

  /// Documents in all shares, whoever may read them.
  virtual std::uint64_t Documents() const = 0;
};

/// All indices of this server. Thread-safe; keeps open handles and directory tables from request to
/// request and follows the writer's commits.
class Library {
 public:
  /// `path` holds one folder an index id.
  explicit Library(std::string path);
  ~Library();

  /// Opens the shares whose index ids are given, in that order, at their newest state. An id
  /// without an index is an Error (121) that names it.
  std::unique_ptr<Reader> Open(const std::vector<std::string>& index_ids);
  bool Has(const std::string& index_id) const;
  std::vector<std::string> IndexIds() const;

 private:
  struct State;
  std::shared_ptr<State> state_;
};

}  // namespace maru::index
