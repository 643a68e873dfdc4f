#include "webapi/daemon_channel.h"

#include <errno.h>
#include <unistd.h>

#include "common/json_value.h"
#include "platform/daemon_connection.h"
#include "platform/json.h"

namespace maruseeker::webapi {
namespace {

/// A longer text is cut in the log.
constexpr std::size_t kMaxQuoted = 4096;

DaemonReply Failure(ErrorCode code, std::string line) {
  DaemonReply reply;
  reply.failed = true;
  reply.code = code;
  reply.failure = std::move(line);
  return reply;
}

DaemonReply Malformed(const std::string& text) {
  errno = 0;
  return Failure(kErrorDaemonExchange, "Malformed resp from daemon: " + text.substr(0, kMaxQuoted));
}

}  // namespace

bool IsDaemonSocketThere() {
  return access(kDaemonSocket, F_OK) == 0;
}

DaemonReply Exchange(const Json::Value& request, const ExchangeRules& rules) {
  marudaemon::DomainSockConnection connection(kDaemonSocket);
  if (!connection.Connect()) {
    return Failure(kErrorDaemonUnreachable, "Cannot connect to maruelastic daemon");
  }
  if (!connection.Send(maru::json::ToString(request))) {
    return Failure(kErrorDaemonExchange, rules.send_failure);
  }
  std::string text;
  if (!connection.Recv(text)) return Failure(kErrorDaemonExchange, "Recv from daemon fail");

  DaemonReply reply;
  if (!maru::json::FromString(text, reply.body)) return Malformed(text);
  if (!rules.judge_success) return reply;
  if (!reply.body.isObject()) return Malformed(text);
  if (AsBool(maru::json::Member(reply.body, "success"))) return reply;
  const Json::Value& error = maru::json::Member(reply.body, "error");
  const Json::Value& code = maru::json::Member(error, "code");
  if (!code.isInt()) return Malformed(text);
  throw Error(static_cast<ErrorCode>(code.asInt()), maru::json::StringMember(error, "msg"));
}

}  // namespace maruseeker::webapi
