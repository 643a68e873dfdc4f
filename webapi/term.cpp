#include "webapi/term.h"

#include "platform/json.h"
#include "webapi/daemon_channel.h"
#include "webapi/param_check.h"

namespace maruseeker::webapi {
namespace {

constexpr ExchangeRules kRules = {"Cannot send search json to maruelastic daemon", true};

/// The reply, or an empty object while the daemon's socket file is missing.
Json::Value SendToDaemon(const Json::Value& request) {
  if (!IsDaemonSocketThere()) return Json::Value(Json::objectValue);
  const DaemonReply reply = Exchange(request, kRules);
  MARU_THROW_IF_FAILED(reply);
  return reply.body;
}

}  // namespace

bool CheckTermSuggestParams(MARU::APIRequest* request, MARU::APIResponse* response) {
  const auto suggester = request->GetAndCheckUnitArray("suggester", request->OPTIONAL, nullptr);
  const auto indice = request->GetAndCheckUnitArray("indice", request->OPTIONAL, nullptr);
  const auto terms = request->GetAndCheckString("terms", request->REQUIRED, nullptr);
  const auto suggest_num = request->GetAndCheckInt("suggest_num", request->OPTIONAL, nullptr);
  return CheckParams(response, {{"suggester", suggester},
                                {"indice", indice},
                                {"terms", terms},
                                {"suggest_num", suggest_num}}) &&
         CheckElements(response, "suggester", suggester, IsString) &&
         CheckElements(response, "indice", indice, IsString);
}

void TermSuggestAPI::ParseParams() {
  const auto suggest_num = request_->GetAndCheckInt("suggest_num", request_->REQUIRED, nullptr);
  const auto terms = request_->GetAndCheckString("terms", request_->REQUIRED, nullptr);
  const auto suggester = request_->GetAndCheckArray("suggester", request_->OPTIONAL, nullptr);
  const auto indice = request_->GetAndCheckArray("indice", request_->OPTIONAL, nullptr);

  request_to_daemon_["command"] = "term_suggest";
  Json::Value& data = request_to_daemon_["data"];
  data["uid"] = login_uid_;
  data["terms"] = terms.Get();
  data["suggest_num"] = suggest_num.Get();
  if (!indice.Get().isNull()) data["indice"] = indice.Get();
  if (!suggester.Get().isNull()) data["suggester"] = suggester.Get();
}

void TermSuggestAPI::Execute() {
  output_ = maru::json::Member(SendToDaemon(request_to_daemon_), "data");
}

void TermSuggestListDBAPI::ParseParams() {
  request_to_daemon_["command"] = "list_term_sugg_db";
  request_to_daemon_["data"] = Json::Value(Json::objectValue);
}

void TermSuggestListDBAPI::Execute() {
  output_ = maru::json::Member(SendToDaemon(request_to_daemon_), "data");
}

}  // namespace maruseeker::webapi
