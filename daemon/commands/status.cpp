#include "daemon/commands/commands.h"
#include "daemon/core/arguments.h"
#include "system/index_id.h"

namespace maru::daemon {
namespace {

/// An index that cannot be read is told of by its reason instead of a count.
Json::Value IndexStatus(const Core& core, const std::string& id) {
  Json::Value status;
  status["id"] = id;
  const std::string share(ShareOfIndexId(id));
  status["share"] = core.shares()->Find(share) ? Json::Value(share) : Json::Value();
  try {
    status["documents"] =
        Json::UInt64{core.indices.Open({{id, {0, {}, true}}}, nullptr)->Documents()};
  } catch (const maruseeker::Error& error) {
    status["error"] = error.Reason();
  }
  return status;
}

}  // namespace

Json::Value StatusCommand(const Request& request) {
  const Arguments data(request.data, "data", {});
  const auto uptime = std::chrono::steady_clock::now() - request.core.started;
  Json::Value status;
  status["version"] = MARUSEEKER_VERSION;
  status["uptime"] = Json::Int64{std::chrono::duration_cast<std::chrono::seconds>(uptime).count()};
  if (!request.caller.unrestricted) return status;
  status["indices"] = Json::arrayValue;
  for (const std::string& id : request.core.indices.Ids()) {
    status["indices"].append(IndexStatus(request.core, id));
  }
  const index::Library::Kept cached = request.core.indices.Cached();
  status["cache"]["bytes"] = Json::UInt64{cached.bytes};
  status["cache"]["entries"] = Json::UInt64{cached.entries};
  status["cache"]["found"] = Json::UInt64{cached.found};
  status["cache"]["missed"] = Json::UInt64{cached.missed};
  status["shares"] = Json::UInt64{request.core.shares()->Shares().size()};
  status["share_settings_error"] = request.core.shares()->Error();
  status["opened_files"] = Json::UInt64{request.core.usage.Size()};
  if (request.core.server_status) request.core.server_status(status);
  return status;
}

}  // namespace maru::daemon
