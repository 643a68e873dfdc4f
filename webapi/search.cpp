#include "webapi/search.h"

#include <errno.h>
#include <signal.h>
#include <time.h>
#include <unistd.h>

#include <optional>

#include "common/db/search_history.h"
#include "common/json_value.h"
#include "common/sdk/share.h"
#include "common/sdk/share_path.h"
#include "common/sdk/task.h"
#include "common/sdk/user.h"
#include "platform/acl.h"
#include "platform/daemon_connection.h"
#include "platform/file_index.h"
#include "platform/json.h"
#include "platform/preference.h"
#include "platform/process.h"
#include "platform/share.h"
#include "webapi/daemon_channel.h"
#include "webapi/param_check.h"

namespace maruseeker::webapi {

using std::string;

namespace {

/// While a query's file names this process: the next query may kill it, whatever it does by then.
std::optional<maru::ReasonToEnd> named_in_file;

/// All messages of one answer together: as much as any other command may answer in one message.
constexpr std::size_t kMaxAnswer = marudaemon::SockConnection::kMaxMessage;

Json::Value Strings(std::initializer_list<const char*> texts) {
  Json::Value list(Json::arrayValue);
  for (const char* text : texts) list.append(text);
  return list;
}

/// One message of the answer: an object, whose "total", when it has one, is a number.
bool ReadMessage(const string& text, Json::Value& message, int& total) {
  if (maru::json::FromString(text, message) && message.isObject() &&
      (!message.isMember("total") || AsInt(message["total"], total))) {
    return true;
  }
  errno = 0;
  return false;
}

/// The name of the account with this id, looked up once; empty when there is none or the text is no
/// id. Digits may be followed by anything.
string OwnerName(const string& owner_id, std::unordered_map<std::uint32_t, string>& names) {
  std::uint32_t uid = 0;
  try {
    uid = static_cast<std::uint32_t>(std::stoul(owner_id));
    if (!names.contains(uid)) names.emplace(uid, sdk::User(uid).name);
    return names.at(uid);
  } catch (const Error&) {
    names.emplace(uid, "");
    return {};
  } catch (const std::exception&) {
    return {};
  }
}

}  // namespace

bool CheckSearchParams(MARU::APIRequest* request, MARU::APIResponse* response) {
  const auto weights =
      request->GetAndCheckUnitArray("search_weight_list", request->REQUIRED, nullptr);
  const auto criteria = request->GetAndCheckUnitArray("criteria_list", request->OPTIONAL, nullptr);
  const auto highlight = request->GetAndCheckUnitArray("highlight", request->OPTIONAL, nullptr);
  const auto keyword = request->GetAndCheckString("keyword", request->OPTIONAL, nullptr);
  const auto file_type = request->GetAndCheckString("file_type", request->OPTIONAL, nullptr);
  const auto fields = request->GetAndCheckUnitArray("fields", request->OPTIONAL, nullptr);
  const auto size = request->GetAndCheckInt("size", request->OPTIONAL, nullptr);
  const auto from = request->GetAndCheckInt("from", request->OPTIONAL, nullptr);
  const auto indice = request->GetAndCheckUnitArray("indice", request->OPTIONAL, nullptr);
  return CheckParams(response, {{"search_weight_list", weights},
                                {"criteria_list", criteria},
                                {"highlight", highlight},
                                {"keyword", keyword},
                                {"file_type", file_type},
                                {"fields", fields},
                                {"size", size},
                                {"from", from},
                                {"indice", indice}}) &&
         CheckElements(response, "search_weight_list", weights, IsWeight) &&
         CheckElements(response, "criteria_list", criteria, IsCriteria) &&
         CheckElements(response, "highlight", highlight, IsHighlight) &&
         CheckElements(response, "fields", fields, IsString) &&
         CheckElements(response, "indice", indice, IsString);
}

void SearchAPI::ParseParams() {
  const Json::Value none(Json::arrayValue);
  const auto indice = request_->GetAndCheckArray("indice", request_->REQUIRED, nullptr);
  const auto from = request_->GetAndCheckInt("from", request_->REQUIRED, nullptr);
  const auto size = request_->GetAndCheckInt("size", request_->REQUIRED, nullptr);
  const auto query_serial = request_->GetAndCheckInt("query_serial", request_->REQUIRED, nullptr);
  const auto fields = request_->GetAndCheckArray("fields", request_->REQUIRED, nullptr);
  const auto file_type = request_->GetAndCheckString("file_type", request_->REQUIRED, nullptr);
  const auto highlight = request_->GetAndCheckArray("highlight", request_->OPTIONAL, nullptr);
  const auto keyword = request_->GetAndCheckString("keyword", request_->OPTIONAL, nullptr);
  const auto criteria = request_->GetAndCheckArray("criteria_list", request_->OPTIONAL, nullptr);
  const auto weights =
      request_->GetAndCheckArray("search_weight_list", request_->OPTIONAL, nullptr);
  const auto agent = request_->GetAndCheckString("agent", request_->OPTIONAL, nullptr);
  const auto query_id = request_->GetAndCheckString("query_id", request_->OPTIONAL, nullptr);

  keyword_ = keyword.Get();
  criteria_list_ = criteria.Get(none);
  file_type_ = file_type.Get();
  from_ = from.Get();
  size_ = size.Get();
  search_weight_list_ = weights.Get();
  has_criteria_ = !criteria_list_.empty();
  agent_ = agent.Get("others");
  query_id_ = query_id.Get("");
  query_serial_ = query_serial.Get(0);
  data_["fields"] = fields.Get(none);
  if (!highlight.IsReset()) highlight_ = highlight.Get();
  FillIndice(indice.Get(none));
  if (!request_->IsAdmin()) {
    Json::Value& filter = data_["filters"][0];
    filter["name"] = "permission";
    filter["data"] = request_->GetLoginUserName();
  }
}

void SearchAPI::FillIndice(const Json::Value& share_names) {
  Json::Value wanted = share_names;
  if (wanted.empty()) {
    for (const string& name : fileindex::FolderMgr().GetIndexedShares()) wanted.append(name);
  }
  for (const Json::Value& name : wanted) {
    if (Admits(name)) indice_.append(fileindex::elastic::GetFileIndexID(name.asString()));
  }
}

/// Whatever goes wrong with a share leaves it out.
bool SearchAPI::Admits(const Json::Value& share_name) const {
  try {
    const string name = share_name.asString();
    const sdk::SDKShare share(name);
    return request_->IsAdmin() || name == "homes" ||
           share.GetPrivilege(request_->GetLoginUserName()) != kSharePrivNone;
  } catch (abi::__forced_unwind&) {
    throw;
  } catch (...) {
    return false;
  }
}

void SearchAPI::Execute() {
  if (!keyword_.empty() && pref::Preference(login_uid_).Get<bool>(kEnableHistory)) {
    sdk::ForkTask().DoTask([this] { RecordHistory(); });
  }
  if (indice_.empty()) return AnswerNothing();
  Search();
}

/// Runs in a child process. A keyword of blanks is recorded too, as an empty one.
void SearchAPI::RecordHistory() const {
  const int max = pref::Preference(login_uid_).Get<int>(kMaxHistoryNum);
  const sdk::SDKCredentials service(kServiceAccount);
  db::SearchHistory record;
  record.keyword = Trim(keyword_);
  record.uid = request_->GetLoginUID();
  record.create_time = static_cast<std::int64_t>(time(nullptr));
  db::SearchHistoryTable table;
  if (!table.UpdateWithTime(record, max)) throw Error(kErrorHistory, table.GetLastError());
}

void SearchAPI::AnswerNothing() {
  output_["hits"] = Json::Value(Json::arrayValue);
  output_["total"] = 0;
}

void SearchAPI::Search() {
  const string query_info_file = "/tmp/tov_query_" + query_id_ + ".pid";
  MARU_FAIL_IF(string::npos != query_id_.find("/"), kErrorBadParameter);
  if (!query_id_.empty() && !TakeOver(query_info_file)) {
    MARU_LOG("Failed [%s]", "!query_info.toFile(query_info_file)");
  }
  if (!IsDaemonSocketThere()) return AnswerNothing();

  marudaemon::DomainSockConnection conn(kDaemonSocket);
  MARU_FAIL_IF(!conn.Connect(), kErrorDaemonUnreachable);
  if (!conn.Send(maru::json::ToString(RequestToDaemon()))) {
    MARU_FAIL_AS("!conn.Send(js_req_to_daemon.toString())", kErrorDaemonExchange);
  }

  Json::Value result(Json::objectValue);
  result["hits"] = Json::Value(Json::arrayValue);
  Json::Value js_resp;
  string str_resp;
  for (std::size_t received = 0;; received += str_resp.size()) {
    MARU_FAIL_IF(!conn.Recv(str_resp), kErrorDaemonExchange);
    int total = 0;
    if (!ReadMessage(str_resp, js_resp, total)) {
      MARU_FAIL_AS("!js_resp.fromString(str_resp)", kErrorDaemonExchange);
    }
    if (js_resp.isMember("total")) {
      result["total"] = total;
    } else if (js_resp.isMember("success")) {
      break;
    } else {
      MARU_FAIL_IF(received > kMaxAnswer, kErrorDaemonExchange);
      result["hits"].append(std::move(js_resp));
    }
  }
  if (!AsBool(js_resp["success"])) {
    const Json::Value error = js_resp.get("error", "Unknown error");
    MARU_LOG("error: %.4096s", maru::json::ToString(error).c_str());
  }
  output_ = std::move(result);
  if (!query_id_.empty() && unlink(query_info_file.c_str()) == 0) named_in_file.reset();
}

/// Ends the client's older query and notes this one instead, or throws when this one is
/// the older. False when the note cannot be written. Members of the file that are nobody's here
/// stay.
bool SearchAPI::TakeOver(const string& query_info_file) const {
  Json::Value query_info;
  if (maru::json::FromFile(query_info_file, query_info) && query_info.isObject()) {
    const int pid = maru::json::IntMember(query_info, "pid");
    const int serial = maru::json::IntMember(query_info, "query_serial");
    if (pid < 1 || serial >= query_serial_) throw Error(kErrorOutdated, "Outdated query");
    // A file left behind may name a process id that has become our own.
    if (pid != getpid()) kill(pid, SIGKILL);
  } else {
    query_info = Json::Value(Json::objectValue);
  }
  named_in_file.emplace();
  query_info["pid"] = getpid();
  query_info["query_serial"] = query_serial_;
  // Neither a missing file nor a process already gone is a failure that the log should name.
  errno = 0;
  return maru::json::ToFile(query_info, query_info_file);
}

Json::Value SearchAPI::RequestToDaemon() const {
  Json::Value request(Json::objectValue);
  request["command"] = "search";
  Json::Value& data = request["data"] = data_;
  Json::Value& pre_query = data["pre_query"];
  pre_query["keyword"] = keyword_;
  pre_query["criteria_list"] = criteria_list_;
  pre_query["file_type"] = file_type_;
  pre_query["search_weight_list"] = search_weight_list_;
  data["indice"] = indice_;
  data["from"] = from_;
  data["size"] = size_;
  data["default_search_op"] = "AND";
  data["load_field"] =
      Strings({"MARUMDPath", "MARUMDFSName", "MARUMDExtension", "MARUMDIsDir", "MARUMDFSSize"});
  data["lazy_field"] = Strings({"MARUMDTextContent"});
  Json::Value& collector = data["collector"];
  collector["agent"] = agent_;
  collector["uid"] = login_uid_;
  collector["has_criteria"] = has_criteria_;
  if (!highlight_.isNull()) data["highlight"] = highlight_;
  return request;
}

void SearchAPI::FormOutput() {
  FillOwners();
  FillIsMountPoint();
}

void SearchAPI::FillOwners() {
  const sdk::User login_user(request_->GetLoginUserName());
  OwnerNames names = {{request_->GetLoginUID(), request_->GetLoginUserName()}};
  for (Json::Value& hit : output_["hits"]) {
    const string path = AsText(maru::json::Member(hit, "MARUMDPath"));
    hit["MARUMDSharePath"] = sdk::SharePathMgr::GetSharePath(path, login_user);
    hit["readable"] = CheckACLPerm(path, kACLRead);
    const string owner_id = AsText(maru::json::Member(hit, "MARUMDOwnerUserID"));
    if (!owner_id.empty()) hit["MARUMDOwnerUserName"] = OwnerName(owner_id, names);
  }
}

void SearchAPI::FillIsMountPoint() {
  for (Json::Value& hit : output_["hits"]) {
    Json::Value& additional = hit["additional"];
    if (!additional.isObject()) additional = Json::Value(Json::objectValue);
    additional["is_mount_point"] = IsMountPoint(AsText(maru::json::Member(hit, "MARUMDPath")));
  }
}

}  // namespace maruseeker::webapi
