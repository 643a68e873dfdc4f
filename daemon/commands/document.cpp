#include <algorithm>
#include <cstdint>

#include "daemon/commands/commands.h"
#include "daemon/commands/hit.h"
#include "daemon/core/arguments.h"
#include "daemon/core/page_check.h"
#include "daemon/language/question.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kMaxPathBytes = 16 * 1024;

/// One answer for what does not exist and for what this caller may not read.
maruseeker::Error NotThere() {
  return maruseeker::Error(maruseeker::kErrorNoPermission, "No such document, or no permission");
}

bool Readable(const Scope& scope, const index::Hit& hit) {
  return StillReadable(scope, {hit})[0];
}

/// Share name and path within the share ("" for the share itself) of "/volume1/photo/a.jpg".
std::pair<std::string, std::string> SplitFullPath(const std::string& full_path) {
  const std::string begin = std::string(kVolume) + "/";
  if (!full_path.starts_with(begin) || full_path.find('\0') != std::string::npos) {
    throw BadParameter("data.full_path is not a path such as /volume1/photo/a.jpg");
  }
  const std::size_t slash = std::min(full_path.find('/', begin.size()), full_path.size());
  return {full_path.substr(begin.size(), slash - begin.size()), full_path.substr(slash)};
}

}  // namespace

Json::Value HighlightCommand(const Request& request) {
  const Arguments data(request.data, "data",
                       {"id", "doc_id", "highlight", "keyword", "search_weight_list"});
  const std::string id = data.String("id", kMaxIndexId);
  const std::int64_t document = data.Integer("doc_id", INT64_MIN, INT64_MAX, 0);
  const index::FragmentOptions options = ReadFragmentOptions(Arguments(
      data.Any("highlight"), "data.highlight", {"field", "frag_length", "num_fragments"}));
  const index::Query query = ToQuery(ReadQuestion(data), false);
  const Scope scope = ScopeOf(request.core, EyesOf(request.caller, {}), {id});
  if (scope.places.empty() || document < 1 || document > UINT32_MAX) throw NotThere();
  const auto reader = OpenReader(request.core, scope);
  const auto hit = reader->Find(0, static_cast<index::DocumentId>(document));
  if (!hit || !Readable(scope, *hit)) throw NotThere();
  Json::Value reply;
  reply["doc_id"] = hit->document;
  reply["fragments"] = FragmentsOf(*reader, *hit, query, {options});
  return reply;
}

Json::Value RecordOpenCommand(const Request& request) {
  const Arguments data(request.data, "data", {"id", "full_path"});
  const std::string id = data.String("id", kMaxIndexId);
  const auto [share, path] = SplitFullPath(data.String("full_path", kMaxPathBytes));
  if (ShareOfIndex(id) != share) throw BadParameter("data.full_path does not lie in " + Quoted(id));
  const Scope scope = ScopeOf(request.core, EyesOf(request.caller, {}), {id});
  if (scope.places.empty()) throw NotThere();
  const auto hit = OpenReader(request.core, scope)->Find(0, path);
  if (!hit || !Readable(scope, *hit)) throw NotThere();
  request.core.usage.Record(request.caller.uid, id, hit->document, hit->path);
  return Json::objectValue;
}

}  // namespace maru::daemon
