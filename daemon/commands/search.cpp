#include <algorithm>

#include "daemon/commands/commands.h"
#include "daemon/commands/hit.h"
#include "daemon/core/arguments.h"
#include "daemon/core/page_check.h"
#include "daemon/language/clauses.h"
#include "daemon/language/criteria.h"
#include "daemon/language/query_tree.h"
#include "system/json.h"

namespace maru::daemon {
namespace {

constexpr std::int64_t kMaxFrom = 1'000'000'000;
constexpr std::int64_t kMaxSize = 10'000;
constexpr std::int64_t kDefaultSize = 20;
constexpr std::size_t kMaxHighlights = 8;
/// Characters of fragments that one page may ask for.
constexpr std::uint64_t kMaxFragmentCharacters = 16u << 20;
/// Times a page is filled up behind hits that fell out of it.
constexpr int kMaxRounds = 4;
constexpr std::size_t kMaxCollectorText = 256;

/// A search as asked for.
struct SearchRequest {
  index::Query query;
  std::vector<const index::Field*> fields;
  std::vector<index::FragmentOptions> highlights;
  index::SearchOptions options;
  Scope scope;
};

/// One, or a list.
std::vector<index::FragmentOptions> ReadHighlights(const Arguments& data) {
  if (data.Any("highlight").isObject())
    return {ReadFragmentOptions(data.Object("highlight", kFragmentMembers))};
  std::vector<index::FragmentOptions> highlights;
  for (const Arguments& item : data.Objects("highlight", kMaxHighlights, kFragmentMembers)) {
    highlights.push_back(ReadFragmentOptions(item));
  }
  return highlights;
}

void ReadSort(const Arguments& data, index::SearchOptions& options) {
  if (!data.Has("sort")) return;
  const Arguments sort = data.Object("sort", {"field", "direction"});
  options.sort_field = sort.String("field", kMaxFieldName);
  const index::Field* field = index::FindField(options.sort_field);
  if (!field || field->slot < 0) {
    sort.Refuse("field", "is not a number or time field: " + Quoted(options.sort_field));
  }
  const std::string direction = sort.String("direction", 8, "DESC");
  if (direction != "ASC" && direction != "DESC") sort.Refuse("direction", "is not ASC or DESC");
  options.ascending = direction == "ASC";
}

/// Who asked with what, told for statistics: checked, and nothing is decided by it.
void CheckCollector(const Arguments& data) {
  const Arguments collector = data.Object("collector", {"agent", "uid", "has_criteria"});
  collector.String("agent", kMaxCollectorText);
  collector.Integer("uid", 0, UINT32_MAX, 0);
  if (collector.Has("has_criteria") && !collector.Any("has_criteria").isBool()) {
    collector.Refuse("has_criteria", "is not true or false");
  }
}

void CheckPage(const SearchRequest& search) {
  std::uint64_t characters = 0;
  for (const index::FragmentOptions& highlight : search.highlights) {
    characters += std::uint64_t{search.options.size} * highlight.length * highlight.count;
  }
  if (characters > kMaxFragmentCharacters) {
    throw BadParameter("Too many fragments: ask for a smaller page, fewer or shorter fragments");
  }
}

SearchRequest ReadSearch(const Request& request) {
  const Arguments data(request.data, "data",
                       {"pre_query", "indice", "from", "size", "default_search_op", "load_field",
                        "lazy_field", "collector", "highlight", "fields", "filters", "sort"});
  const Arguments pre_query =
      data.Object("pre_query", {"keyword", "criteria_list", "file_type", "search_weight_list"});
  SearchRequest search;
  QueryClauses clauses = ReadClauses(pre_query);
  const Filters filters = ReadFilters(data);
  for (const std::string& type : filters.types) {
    if (auto kinds = ParseKinds(type)) clauses.filters.push_back(std::move(*kinds));
  }
  search.query = ToQuery(clauses, ReadAnyWord(data));
  search.fields = ReadFields(data);
  search.highlights = ReadHighlights(data);
  search.options.from = static_cast<std::uint32_t>(data.Integer("from", 0, kMaxFrom, 0));
  search.options.size = static_cast<std::uint32_t>(data.Integer("size", 0, kMaxSize, kDefaultSize));
  ReadSort(data, search.options);
  CheckCollector(data);
  CheckPage(search);
  const std::vector<std::string> ids = data.Has("indice")
                                           ? data.Strings("indice", kMaxIndices, kMaxIndexId)
                                           : request.core.indices.Ids();
  search.scope = ScopeOf(request, EyesOf(request.caller, filters.users), ids);
  return search;
}

/// What the caller opened lately ranks higher.
void AddBoosts(const Request& request, const Scope& scope, index::View& view,
               index::SearchOptions& options) {
  const std::vector<std::string> ids = scope.Ids();
  for (const OpenedFile& file : request.core.usage.OpenedBy(request.caller.uid, ids)) {
    if (options.boosts.size() == UsageStore::kMaxBoosted) break;
    const auto share =
        static_cast<std::size_t>(std::ranges::find(ids, file.index_id) - ids.begin());
    const auto hit = view.Find(share, file.document);
    if (hit && IsSameFile(file.path, hit->path)) {
      options.boosts[{share, file.document}] = file.boost;
    }
  }
}

/// The page's hits, checked against the file system and filled up behind those that fell out. The
/// total is lowered by them. (What fell out of earlier pages is not known here; until the index has
/// caught up, a hit may stand on two pages.)
index::SearchResult CheckedPage(SearchRequest& search, index::View& view) {
  index::SearchResult page;
  index::SearchOptions options = search.options;
  std::uint64_t gone = 0;
  for (int round = 0; round < kMaxRounds; ++round) {
    index::SearchResult found = view.Search(search.query, options);
    page.total = found.total;
    const std::vector<bool> readable = ReadableNow(search.scope, found.hits);
    for (std::size_t i = 0; i < found.hits.size(); ++i) {
      if (!readable[i]) ++gone;
      if (readable[i] && page.hits.size() < search.options.size) {
        page.hits.push_back(std::move(found.hits[i]));
      }
    }
    const bool more = found.hits.size() == options.size;
    if (!more || page.hits.size() == search.options.size) break;
    options.from += options.size;
  }
  page.total -= std::min(page.total, gone);
  return page;
}

}  // namespace

Json::Value SearchCommand(const Request& request) {
  SearchRequest search = ReadSearch(request);
  index::SearchResult page;
  std::unique_ptr<index::View> view;
  if (!search.scope.indices.empty()) {
    view = OpenView(request.core, search.scope, request.cancelled);
    if (search.options.sort_field.empty()) {
      AddBoosts(request, search.scope, *view, search.options);
    }
    page = CheckedPage(search, *view);
  }
  json::ObjectWriter total;
  total.AddNumber("total", static_cast<std::int64_t>(page.total));
  request.output(total.Take(), false);
  std::optional<index::Highlighter> highlighter;
  if (view && !search.highlights.empty()) highlighter.emplace(*view, search.query);
  for (const index::Hit& hit : page.hits) {
    Json::Value highlight;
    if (highlighter) {
      if (request.cancelled()) throw index::Cancelled();
      highlight = FragmentsOf(*highlighter, hit, search.highlights);
    }
    request.output(HitMessage(search.scope.indices[hit.share], hit, search.fields, highlight),
                   false);
  }
  return {};
}

Json::Value ExplainCommand(const Request& request) {
  const SearchRequest search = ReadSearch(request);
  Json::Value data;
  data["query"] = Explain(search.query);
  data["indice"] = Json::arrayValue;
  for (const std::string& id : search.scope.Ids()) data["indice"].append(id);
  return data;
}

}  // namespace maru::daemon
