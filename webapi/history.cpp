#include "webapi/history.h"

#include <vector>

#include "common/db/search_history.h"
#include "common/json_value.h"
#include "webapi/param_check.h"

namespace maruseeker::webapi {
namespace {

using marudbquery::Condition;

constexpr int kDefaultLimit = 50;

/// The id of an element as a row has it. No row has the id 0, nor one beyond 32 bits.
int RowID(const Json::Value& element) {
  int id = 0;
  return AsInt(element, id) ? id : 0;
}

}  // namespace

bool CheckHistoryGetParams(MARU::APIRequest* request, MARU::APIResponse* response) {
  const auto direction = request->GetAndCheckString("sort_direction", request->OPTIONAL, nullptr);
  const auto sort_by = request->GetAndCheckString("sort_by", request->OPTIONAL, nullptr);
  const auto limit = request->GetAndCheckInt("limit", request->OPTIONAL, nullptr);
  const auto offset = request->GetAndCheckInt("offset", request->OPTIONAL, nullptr);
  const auto substr = request->GetAndCheckString("substr", request->OPTIONAL, nullptr);
  return CheckParams(response, {{"sort_direction", direction},
                                {"sort_by", sort_by},
                                {"limit", limit},
                                {"offset", offset},
                                {"substr", substr}});
}

bool CheckHistoryDeleteParams(MARU::APIRequest* request, MARU::APIResponse* response) {
  const auto id = request->GetAndCheckArray("id", request->REQUIRED, nullptr);
  return CheckParams(response, {{"id", id}}) && CheckElements(response, "id", id, IsIntegral);
}

void HistoryGetAPI::ParseParams() {
  const auto substr = request_->GetAndCheckString("substr", request_->OPTIONAL, nullptr);
  const auto sort_by = request_->GetAndCheckString("sort_by", request_->OPTIONAL, nullptr);
  const auto direction = request_->GetAndCheckString("sort_direction", request_->OPTIONAL, nullptr);
  const auto offset = request_->GetAndCheckInt("offset", request_->OPTIONAL, nullptr);
  const auto limit = request_->GetAndCheckInt("limit", request_->OPTIONAL, nullptr);

  substr_ = substr.Get("");
  sort_by_ = sort_by.Get("");
  asc_ = ToLower(direction.Get("asc")) == "asc";
  offset_ = offset.Get(0);
  limit_ = limit.Get(kDefaultLimit);
}

void HistoryGetAPI::Execute() {
  const sdk::SDKCredentials service(kServiceAccount);
  db::SearchHistoryTable table;
  Condition cond = Condition::ConditionFactory<unsigned int>("uid", "=", login_uid_);
  if (!substr_.empty()) cond = cond && Condition::HasSubstring("keyword", substr_);
  const int total = table.Count(cond);
  std::vector<db::SearchHistory> recs;
  MARU_FAIL_IF(!table.GetAll(recs, cond, db::SelectParam(offset_, limit_, sort_by_, asc_)),
               kErrorHistory);

  Json::Value& historys = output_["historys"] = Json::Value(Json::arrayValue);
  output_["total"] = total;
  for (const db::SearchHistory& record : recs) {
    Json::Value& history = historys.append(Json::Value(Json::objectValue));
    history["id"] = record.id;
    history["keyword"] = record.keyword;
    history["create_time"] = static_cast<Json::Int64>(record.create_time);
  }
}

void HistoryDeleteAPI::ParseParams() {
  const auto id = request_->GetAndCheckArray("id", request_->REQUIRED, nullptr);
  MARU_FAIL_IF(id.IsInvalid(), kErrorBadParameter);
  id_ = id.Get();
}

void HistoryDeleteAPI::Execute() {
  const sdk::SDKCredentials service(kServiceAccount);
  db::SearchHistoryTable table;
  const Condition owner = Condition::ConditionFactory<unsigned int>("uid", "=", login_uid_);
  Condition ids = Condition::Null();
  MARU_FAIL_IF(0 == id_.size(), kErrorHistory);
  for (const Json::Value& element : id_) {
    ids = ids || Condition::ConditionFactory<int>("id", "=", RowID(element));
  }
  const Condition cond = owner && ids;
  MARU_FAIL_IF(!table.Delete(cond), kErrorHistory);
}

}  // namespace maruseeker::webapi
