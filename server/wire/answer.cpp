#include "server/wire/answer.h"

#include <utility>

#include "common/error.h"
#include "server/wire/fields.h"
#include "system/json.h"

namespace maru::server {
namespace {

constexpr int kRefusals = 10'000;
constexpr std::pair<int, int> kStatuses[] = {
    {maruseeker::kErrorBadParameter, 400},      {maruseeker::kErrorNoPermission, 403},
    {maruseeker::kErrorOutdated, 409},          {maruseeker::kErrorDaemonExchange, 502},
    {maruseeker::kErrorDaemonUnreachable, 503},
};

char Letter(AnswerPart part) {
  return static_cast<char>(part);
}

}  // namespace

int HttpStatus(int code) {
  for (const auto& [known, status] : kStatuses)
    if (known == code) return status;
  return code >= kRefusals + 400 && code < kRefusals + 600 ? code - kRefusals : 500;
}

Answer Success(const Json::Value& data) {
  // Long answers are put together from texts: a copy of their values would cost as much again.
  const std::string member = data.isNull() ? "" : "\"data\":" + json::ToString(data) + ",";
  return {200, "{" + member + "\"success\":true}", std::nullopt};
}

Answer Failure(int code, const Json::Value& data) {
  Json::Value body;
  body["success"] = false;
  body["error"]["code"] = code;
  if (!data.isNull()) body["error"]["data"] = data;
  return {HttpStatus(code), json::ToString(body), std::nullopt};
}

Answer Refusal(int status) {
  return Failure(kRefusals + status, Json::Value());
}

bool SendAnswer(int socket, const Answer& answer, Wait wait) {
  std::string packet(1, Letter(AnswerPart::kHead));
  const std::string cookie = answer.cookie ? "=" + *answer.cookie : std::string();
  packet += PackFields({std::to_string(answer.status), std::to_string(answer.body.size()), cookie});
  std::string_view rest = answer.body;
  do {
    const std::string_view chunk = rest.substr(0, kMaxPacket - packet.size());
    packet += chunk;
    rest.remove_prefix(chunk.size());
    if (SendPacket(socket, packet, wait) != SendResult::kDone) return false;
    packet.assign(1, Letter(AnswerPart::kMore));
  } while (!rest.empty());
  return true;
}

bool AnswerReader::TakeHead(std::string_view packet) {
  std::string_view status, size, cookie;
  if (!TakeField(packet, status) || !TakeField(packet, size) || !TakeField(packet, cookie))
    return false;
  const auto status_number = ParseNumber(status, 599);
  const auto size_number = ParseNumber(size, kMaxAnswer);
  if (!status_number || *status_number < 200 || !size_number) return false;
  status_ = static_cast<int>(*status_number);
  size_ = *size_number;
  if (!cookie.empty()) cookie_ = cookie.substr(1);
  chunk_ = packet;
  return true;
}

AnswerPart AnswerReader::Take(std::string_view packet) {
  const AnswerPart wanted = has_head_ ? AnswerPart::kMore : AnswerPart::kHead;
  chunk_ = {};
  if (packet.size() == 1 && packet[0] == Letter(AnswerPart::kKilled)) return AnswerPart::kKilled;
  if (packet.empty() || packet[0] != Letter(wanted)) return AnswerPart::kFailed;
  packet.remove_prefix(1);
  if (has_head_)
    chunk_ = packet;
  else if (!TakeHead(packet))
    return AnswerPart::kFailed;
  if (chunk_.size() > size_ - taken_) return AnswerPart::kFailed;
  has_head_ = true;
  taken_ += chunk_.size();
  return wanted;
}

}  // namespace maru::server
