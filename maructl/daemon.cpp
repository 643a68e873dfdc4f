#include "maructl/daemon.h"

#include <stdexcept>

#include "system/json.h"
#include "system/throw_errno.h"

namespace maru::control {

Daemon::Daemon() : connection_(kDaemonSocket) {
  if (!connection_.Connect()) {
    ThrowErrno(std::string("the search daemon does not answer at ") + kDaemonSocket);
  }
}

void Daemon::Ask(const std::string& command, const Json::Value& data) {
  Json::Value request;
  request["command"] = command;
  request["data"] = data;
  if (!connection_.Send(json::ToString(request))) {
    throw std::runtime_error("the search daemon does not take the request");
  }
}

Json::Value Daemon::Next() {
  std::string text;
  Json::Value message;
  if (!connection_.Recv(text)) throw std::runtime_error("the search daemon broke off");
  if (!json::FromString(text, message) || !message.isObject()) {
    throw std::runtime_error("the search daemon talks nonsense");
  }
  return message;
}

void Daemon::Judge(const Json::Value& message) {
  if (json::BoolMember(message, "success")) return;
  const std::string reason = json::StringMember(json::Member(message, "error"), "msg");
  throw std::runtime_error(reason.empty() ? "the search daemon failed" : reason);
}

Json::Value Daemon::Reply() {
  const Json::Value message = Next();
  Judge(message);
  return json::Member(message, "data");
}

}  // namespace maru::control
