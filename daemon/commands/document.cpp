#include <cstdint>

#include "daemon/commands/commands.h"
#include "daemon/commands/hit.h"
#include "daemon/core/arguments.h"
#include "daemon/core/page_check.h"
#include "daemon/language/clauses.h"
#include "system/index_id.h"
#include "system/volume_path.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kMaxPathBytes = 16 * 1024;

/// One answer for what does not exist and for what this caller may not read.
maruseeker::Error NotThere() {
  return maruseeker::Error(maruseeker::kErrorNoPermission, "No such document, or no permission");
}

bool Readable(const Scope& scope, const index::Hit& hit) {
  return ReadableNow(scope, {hit})[0];
}

}  // namespace

Json::Value HighlightCommand(const Request& request) {
  const Arguments data(request.data, "data",
                       {"id", "doc_id", "highlight", "keyword", "search_weight_list"});
  const std::string id = data.String("id", kMaxIndexId);
  const std::int64_t document = data.Integer("doc_id", INT64_MIN, INT64_MAX, 0);
  const index::FragmentOptions options =
      ReadFragmentOptions(data.Object("highlight", kFragmentMembers));
  const index::Query query = ToQuery(ReadClauses(data), false);
  const Scope scope = ScopeOf(request, EyesOf(request.caller, {}), {id});
  if (scope.indices.empty() || document < 1 || document > UINT32_MAX) throw NotThere();
  const auto view = OpenView(request.core, scope, request.cancelled);
  const auto hit = view->FindAlias(0, static_cast<std::uint32_t>(document));
  if (!hit || !Readable(scope, *hit)) throw NotThere();
  index::Highlighter highlighter(*view, query);
  Json::Value reply;
  reply["doc_id"] = hit->alias;
  reply["fragments"] = FragmentsOf(highlighter, *hit, {options});
  return reply;
}

Json::Value RecordOpenCommand(const Request& request) {
  const Arguments data(request.data, "data", {"id", "full_path"});
  const std::string id = data.String("id", kMaxIndexId);
  const std::string full_path = data.String("full_path", kMaxPathBytes);
  CheckIndexId(id);
  VolumePath path;
  if (!SplitAtShare(full_path, path) || full_path.find('\0') != std::string::npos) {
    data.Refuse("full_path", "is not a path such as /volume1/photo/a.jpg");
  }
  if (id != IndexIdOf(path.share)) data.Refuse("full_path", "does not lie in " + Quoted(id));
  const Scope scope = ScopeOf(request, EyesOf(request.caller, {}), {id});
  if (scope.indices.empty()) throw NotThere();
  const auto hit = OpenView(request.core, scope, request.cancelled)->Find(0, path.rest);
  if (!hit || !Readable(scope, *hit)) throw NotThere();
  request.core.usage.Record(request.caller.uid, id, hit->document, hit->path);
  return Json::objectValue;
}

}  // namespace maru::daemon
