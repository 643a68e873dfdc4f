#include "webapi/highlight.h"

#include "common/sdk/permission.h"
#include "platform/file_index.h"
#include "platform/json.h"
#include "webapi/daemon_channel.h"
#include "webapi/param_check.h"

namespace maruseeker::webapi {
namespace {

constexpr ExchangeRules kRules = {"Cannot send search json to maruelastic daemon", true};

}  // namespace

bool CheckHighlightParams(MARU::APIRequest* request, MARU::APIResponse* response) {
  const auto full_path = request->GetAndCheckString("full_path", request->REQUIRED, nullptr);
  const auto doc_id = request->GetAndCheckInt("doc_id", request->REQUIRED, nullptr);
  const auto highlight = request->GetAndCheckObject("highlight", request->REQUIRED, nullptr);
  const auto keyword = request->GetAndCheckString("keyword", request->REQUIRED, nullptr);
  return CheckParams(response, {{"full_path", full_path},
                                {"doc_id", doc_id},
                                {"highlight", highlight},
                                {"keyword", keyword}}) &&
         CheckObject(response, "highlight", highlight, CheckHighlightItem);
}

void HighlightAPI::ParseParams() {
  FilePermission file_perm(request_->GetLoginUserName());
  const auto doc_id = request_->GetAndCheckInt("doc_id", request_->REQUIRED, nullptr);
  const auto full_path = request_->GetAndCheckString("full_path", request_->REQUIRED, nullptr);
  const auto keyword = request_->GetAndCheckString("keyword", request_->REQUIRED, nullptr);
  const auto highlight = request_->GetAndCheckObject("highlight", request_->REQUIRED, nullptr);
  MARU_FAIL_IF(
      !file_perm.CheckRead(full_path.Get()), kErrorNoPermission,
      "No file permission, path: " + full_path.Get() + ", user: " + request_->GetLoginUserName());

  std::string share_name;
  std::string share_path;
  fileindex::GetShareNamePathByFullPath(share_name, share_path, full_path.Get());
  request_to_daemon_["command"] = "highlight";
  Json::Value& data = request_to_daemon_["data"];
  data["id"] = "fileindex_" + share_name;
  data["doc_id"] = doc_id.Get();
  data["highlight"] = highlight.Get();
  data["keyword"] = keyword.Get();
  data["search_weight_list"] = Json::Value(Json::arrayValue);
}

void HighlightAPI::Execute() {
  const DaemonReply reply = Exchange(request_to_daemon_, kRules);
  MARU_THROW_IF_FAILED(reply);
  output_ = maru::json::Member(reply.body, "data");
}

}  // namespace maruseeker::webapi
