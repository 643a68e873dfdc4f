#include "webapi/spotlight.h"

#include "platform/file_index.h"
#include "webapi/daemon_channel.h"
#include "webapi/param_check.h"

namespace maruseeker::webapi {
namespace {

constexpr ExchangeRules kRules = {"Cannot send json to maruelastic daemon", false};

}  // namespace

bool CheckSpotlightBoostParams(MARU::APIRequest* request, MARU::APIResponse* response) {
  const auto full_path = request->GetAndCheckString("full_path", request->REQUIRED, nullptr);
  return CheckParams(response, {{"full_path", full_path}});
}

void SpotlightBoostAPI::ParseParams() {
  const auto full_path = request_->GetAndCheckString("full_path", request_->REQUIRED, nullptr);
  if (full_path.IsInvalid()) throw Error(kErrorBadParameter);

  std::string share_name;
  std::string share_path;
  fileindex::GetShareNamePathByFullPath(share_name, share_path, full_path.Get());
  request_to_daemon_["command"] = "record_spotlight_open";
  request_to_daemon_["data"]["id"] = "fileindex_" + share_name;
  request_to_daemon_["data"]["full_path"] = full_path.Get();
}

void SpotlightBoostAPI::Execute() {
  const DaemonReply reply = Exchange(request_to_daemon_, kRules);
  MARU_THROW_IF_FAILED(reply);
}

}  // namespace maruseeker::webapi
