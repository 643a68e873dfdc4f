#include "server/messages.h"

#include <limits>

#include "server/frames.h"

namespace maru::server {
namespace {

std::optional<AskKind> ParseKind(std::string_view text) {
  constexpr std::string_view kinds = "CWIOS";
  if (text.size() != 1 || kinds.find(text[0]) == std::string_view::npos) return std::nullopt;
  return static_cast<AskKind>(text[0]);
}

std::string_view Letter(const AskKind& kind) {
  return {reinterpret_cast<const char*>(&kind), 1};
}

bool ParseName(std::string_view api, std::string_view version, std::string_view method,
               MethodName& name) {
  const auto number = ParseNumber(version, std::numeric_limits<unsigned>::max());
  if (!number || api.size() > kMaxName || method.size() > kMaxName) return false;
  name = {std::string(api), static_cast<unsigned>(*number), std::string(method)};
  return true;
}

}  // namespace

std::string Pack(const Ask& ask) {
  return PackFields({Letter(ask.kind), ask.token, ask.name.api, std::to_string(ask.name.version),
                     ask.name.method, std::to_string(ask.body_size), ask.source, ask.user,
                     ask.password});
}

std::optional<Ask> UnpackAsk(std::string_view packet) {
  const auto fields = UnpackFields<9>(packet);
  if (!fields) return std::nullopt;
  const auto& [kind_text, token, api, version, method, size_text, source, user, password] = *fields;
  const auto kind = ParseKind(kind_text);
  const auto size = ParseNumber(size_text, kMaxBody);
  Ask ask;
  if (!kind || !size || token.size() > kMaxToken || user.size() > kMaxUser ||
      password.size() > kMaxPassword || !ParseName(api, version, method, ask.name))
    return std::nullopt;
  ask.kind = *kind;
  ask.token = token;
  ask.body_size = *size;
  ask.source = source;
  ask.user = user;
  ask.password = password;
  return ask;
}

std::string Pack(const Task& task) {
  return PackFields({Letter(task.kind), task.name.api, std::to_string(task.name.version),
                     task.name.method, std::to_string(task.body_size), task.session_id,
                     std::to_string(task.uid), task.user, task.stamp, task.ask_pam ? "1" : "0"});
}

std::optional<Task> UnpackTask(std::string_view packet) {
  const auto fields = UnpackFields<10>(packet);
  if (!fields) return std::nullopt;
  const auto& [kind_text, api, version, method, size_text, session_id, uid_text, user, stamp,
               ask_pam] = *fields;
  const auto kind = ParseKind(kind_text);
  const auto size = ParseNumber(size_text, kMaxBody);
  const auto uid = ParseNumber(uid_text, std::numeric_limits<uid_t>::max());
  Task task;
  if (!kind || !size || !uid || !ParseName(api, version, method, task.name)) return std::nullopt;
  task.kind = *kind;
  task.body_size = *size;
  task.session_id = session_id;
  task.uid = static_cast<uid_t>(*uid);
  task.user = user;
  task.stamp = stamp;
  task.ask_pam = ask_pam == "1";
  return task;
}

}  // namespace maru::server
