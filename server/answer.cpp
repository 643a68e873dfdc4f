#include "server/answer.h"

#include "common/error.h"
#include "system/json.h"

namespace maru::server {
namespace {

constexpr char kHeadLetter = 'A';
constexpr char kMoreLetter = 'R';
constexpr int kRefusals = 10'000;

}  // namespace

int HttpStatus(int code) {
  switch (code) {
    case maruseeker::kErrorBadParameter:
      return 400;
    case maruseeker::kErrorNoPermission:
      return 403;
    case maruseeker::kErrorOutdated:
      return 409;
    case maruseeker::kErrorDaemonExchange:
      return 502;
    case maruseeker::kErrorDaemonUnreachable:
      return 503;
    default:
      return code >= kRefusals + 400 && code < kRefusals + 600 ? code - kRefusals : 500;
  }
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
  std::string packet(1, kHeadLetter);
  const std::string cookie = answer.cookie ? "=" + *answer.cookie : std::string();
  packet += PackFields({std::to_string(answer.status), std::to_string(answer.body.size()), cookie});
  std::string_view rest = answer.body;
  do {
    const std::string_view chunk = rest.substr(0, kMaxPacket - packet.size());
    packet += chunk;
    rest.remove_prefix(chunk.size());
    if (SendPacket(socket, packet, wait) != SendResult::kDone) return false;
    packet.assign(1, kMoreLetter);
  } while (!rest.empty());
  return true;
}

void SendChildEnd(int socket, ChildEnd end) {
  const char letter = static_cast<char>(end);
  // When there is no room the front learns the same from the closed socket.
  SendPacket(socket, {&letter, 1}, Wait::kNo);
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

AnswerReader::State AnswerReader::Take(std::string_view packet) {
  chunk_ = {};
  if (packet.size() == 1 && packet[0] == static_cast<char>(ChildEnd::kKilled))
    return State::kKilled;
  if (packet.empty() || packet[0] != (has_head_ ? kMoreLetter : kHeadLetter)) return State::kFailed;
  packet.remove_prefix(1);
  const State state = has_head_ ? State::kMore : State::kHead;
  if (has_head_) {
    chunk_ = packet;
  } else if (!TakeHead(packet)) {
    return State::kFailed;
  }
  if (chunk_.size() > size_ - taken_) return State::kFailed;
  has_head_ = true;
  taken_ += chunk_.size();
  return state;
}

}  // namespace maru::server
