#include <algorithm>
#include <set>

#include "daemon/commands/commands.h"
#include "daemon/commands/suggesters.h"
#include "daemon/core/arguments.h"
#include "index/text/tokenizer.h"
#include "system/index_id.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kMaxTermsBytes = 4096;
constexpr std::int64_t kDefaultSuggestions = 10;
constexpr std::int64_t kMaxSuggestions = 100;

std::vector<const Suggester*> ReadSuggesters(const Arguments& data) {
  std::vector<const Suggester*> chosen;
  for (const std::string& name : data.Strings("suggester", 16, 64)) {
    const auto found = std::ranges::find(Suggesters(), name, &Suggester::name);
    if (found == Suggesters().end()) {
      data.Refuse("suggester", "names an unknown one, " + Quoted(name));
    }
    if (std::ranges::count(chosen, &*found) == 0) chosen.push_back(&*found);
  }
  return chosen;
}

/// Ids, or names of shares.
std::vector<std::string> ReadIndices(const Arguments& data) {
  std::vector<std::string> ids = data.Strings("indice", kMaxIndices, kMaxIndexId);
  for (std::string& id : ids) {
    CheckIndexId(id);
    if (ShareOfIndexId(id).empty()) id = IndexIdOf(id);
  }
  return ids;
}

/// The suggesters' lists merged: the first of each, the second of each, …, each text once.
Json::Value Merged(const std::vector<const Suggester*>& suggesters,
                   const std::vector<std::vector<std::string>>& lists, std::size_t limit) {
  Json::Value merged(Json::arrayValue);
  std::set<std::string> seen;
  std::size_t longest = 0;
  for (const auto& list : lists) longest = std::max(longest, list.size());
  for (std::size_t rank = 0; rank < longest; ++rank) {
    for (std::size_t i = 0; i < lists.size() && merged.size() < limit; ++i) {
      if (rank >= lists[i].size() || !seen.insert(index::Fold(lists[i][rank])).second) continue;
      Json::Value suggestion;
      suggestion["term"] = lists[i][rank];
      suggestion["suggester"] = std::string(suggesters[i]->name);
      merged.append(std::move(suggestion));
    }
  }
  return merged;
}

Json::Value Suggest(const std::vector<const Suggester*>& suggesters,
                    const SuggestRequest& request) {
  std::vector<std::vector<std::string>> lists;
  for (const Suggester* suggester : suggesters) lists.push_back(suggester->suggest(request));
  return Merged(suggesters, lists, request.limit);
}

Json::Value SuggestByDefault(const SuggestRequest& request) {
  std::vector<const Suggester*> first, last;
  for (const Suggester& suggester : Suggesters()) {
    (suggester.always ? first : last).push_back(&suggester);
  }
  Json::Value suggestions = Suggest(first, request);
  return suggestions.empty() ? Suggest(last, request) : suggestions;
}

}  // namespace

Json::Value TermSuggestCommand(const Request& request) {
  const Arguments data(request.data, "data",
                       {"uid", "terms", "suggest_num", "indice", "suggester"});
  const std::string text = data.String("terms", kMaxTermsBytes);
  const std::int64_t wanted = data.Integer("suggest_num", INT64_MIN, INT64_MAX, 0);
  const std::int64_t named = data.Integer("uid", 0, UINT32_MAX, request.caller.uid);
  const std::vector<const Suggester*> suggesters = ReadSuggesters(data);
  const std::vector<std::string> ids =
      data.Has("indice") ? ReadIndices(data) : request.core.indices.Ids();
  const Scope scope = ScopeOf(request, EyesOf(request.caller, {}), ids);
  Json::Value reply;
  reply["suggestions"] = Json::arrayValue;
  if (index::WordsOf(text).empty()) return reply;
  const auto view =
      scope.indices.empty() ? nullptr : OpenView(request.core, scope, request.cancelled);
  const SuggestRequest typed{
      .core = request.core,
      .scope = scope,
      .view = view.get(),
      .uid = request.caller.unrestricted ? static_cast<uid_t>(named) : request.caller.uid,
      .text = text,
      .limit = static_cast<std::size_t>(wanted < 1 ? kDefaultSuggestions
                                                   : std::min(wanted, kMaxSuggestions))};
  reply["suggestions"] = suggesters.empty() ? SuggestByDefault(typed) : Suggest(suggesters, typed);
  return reply;
}

Json::Value ListSuggestersCommand(const Request& request) {
  const Arguments data(request.data, "data", {});
  Json::Value reply;
  for (const Suggester& suggester : Suggesters()) {
    Json::Value row;
    row["name"] = std::string(suggester.name);
    row["description"] = std::string(suggester.description);
    reply["suggesters"].append(std::move(row));
  }
  reply["indices"] = Json::arrayValue;
  const Eyes eyes = EyesOf(request.caller, {});
  for (const std::string& id : ScopeOf(request, eyes, request.core.indices.Ids()).Ids()) {
    reply["indices"].append(id);
  }
  return reply;
}

}  // namespace maru::daemon
