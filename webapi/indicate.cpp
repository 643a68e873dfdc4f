#include "webapi/indicate.h"

#include "common/json_value.h"
#include "common/sdk/share.h"
#include "platform/file_index.h"
#include "platform/json.h"
#include "platform/share.h"
#include "webapi/daemon_channel.h"
#include "webapi/param_check.h"

namespace maruseeker::webapi {
namespace {

constexpr ExchangeRules kRules = {"Cannot send search json to maruelastic daemon", false};

Json::Value Filter(const char* name, const std::string& data) {
  Json::Value filter(Json::objectValue);
  filter["name"] = name;
  filter["data"] = data;
  return filter;
}

}  // namespace

bool CheckIndicateParams(MARU::APIRequest* request, MARU::APIResponse* response) {
  const auto weights =
      request->GetAndCheckUnitArray("search_weight_list", request->REQUIRED, nullptr);
  const auto criteria = request->GetAndCheckUnitArray("criteria_list", request->REQUIRED, nullptr);
  const auto keyword = request->GetAndCheckString("keyword", request->REQUIRED, nullptr);
  const auto file_type = request->GetAndCheckUnitArray("file_type", request->REQUIRED, nullptr);
  return CheckParams(response, {{"search_weight_list", weights},
                                {"criteria_list", criteria},
                                {"keyword", keyword},
                                {"file_type", file_type}}) &&
         CheckElements(response, "criteria_list", criteria, IsCriteria) &&
         CheckElements(response, "search_weight_list", weights, IsWeight) &&
         CheckElements(response, "file_type", file_type, IsString);
}

void IndicateAPI::ParseParams() {
  const auto criteria = request_->GetAndCheckArray("criteria_list", request_->REQUIRED, nullptr);
  const auto keyword = request_->GetAndCheckString("keyword", request_->REQUIRED, nullptr);
  const auto file_type = request_->GetAndCheckArray("file_type", request_->REQUIRED, nullptr);
  const auto weights =
      request_->GetAndCheckArray("search_weight_list", request_->REQUIRED, nullptr);

  FindIndice();
  request_to_daemon_["command"] = "indicate";
  Json::Value& data = request_to_daemon_["data"];
  data["keyword"] = keyword.Get();
  data["indice"] = indice_;
  data["criteria_list"] = criteria.Get();
  data["search_weight_list"] = weights.Get();
  AddQueries(file_type.Get());
}

void IndicateAPI::FindIndice() {
  for (const std::string& name : fileindex::FolderMgr().GetIndexedShares()) {
    const sdk::SDKShare share(name);
    if (!request_->IsAdmin() && name != "homes" &&
        share.GetPrivilege(request_->GetLoginUserName()) == kSharePrivNone) {
      continue;
    }
    indice_.append(fileindex::elastic::GetFileIndexID(name));
  }
}

/// The filters pile up: each query carries those of all queries before it, then its own.
void IndicateAPI::AddQueries(const Json::Value& file_types) {
  output_ = Json::Value(Json::objectValue);
  Json::Value query;
  Json::Value& filters = query["query"]["filters"] = Json::Value(Json::arrayValue);
  for (const Json::Value& file_type : file_types) {
    const std::string type = AsText(file_type);
    if (!request_->IsAdmin()) filters.append(Filter("permission", request_->GetLoginUserName()));
    query["query"]["default_search_op"] = "AND";
    filters.append(Filter("file_type", type));
    query["name"] = type;
    request_to_daemon_["data"]["queries"].append(query);
    output_[type] = 0;
  }
}

void IndicateAPI::Execute() {
  if (!IsDaemonSocketThere() || indice_.empty()) return;
  const DaemonReply reply = Exchange(request_to_daemon_, kRules);
  MARU_THROW_IF_FAILED(reply);
  output_ = maru::json::Member(reply.body, "data");
}

}  // namespace maruseeker::webapi
