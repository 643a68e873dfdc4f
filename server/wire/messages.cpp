#include "server/wire/messages.h"

#include <limits>

#include "server/wire/fields.h"

namespace maru::server {
namespace {

std::string_view Letter(const AskKind& kind) {
  return {reinterpret_cast<const char*>(&kind), 1};
}

std::optional<AskKind> ParseKind(std::string_view text) {
  for (const AskKind kind : kAskKinds)
    if (text == Letter(kind)) return kind;
  return std::nullopt;
}

std::optional<MethodName> ParseName(std::string_view api, std::string_view version,
                                    std::string_view method) {
  const auto number = ParseNumber(version, std::numeric_limits<unsigned>::max());
  if (!number || api.size() > kMaxName || method.size() > kMaxName) return std::nullopt;
  return MethodName{std::string(api), static_cast<unsigned>(*number), std::string(method)};
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
  auto name = ParseName(api, version, method);
  const auto size = ParseNumber(size_text, kMaxBody);
  if (!kind || !name || !size || token.size() > kMaxToken || user.size() > kMaxUser ||
      password.size() > kMaxPassword)
    return std::nullopt;
  return Ask{*kind,
             std::string(token),
             std::move(*name),
             *size,
             std::string(source),
             std::string(user),
             std::string(password)};
}

std::string Pack(const Task& task) {
  return PackFields({Letter(task.kind), task.name.api, std::to_string(task.name.version),
                     task.name.method, std::to_string(task.body_size), task.session_id,
                     std::to_string(task.uid), task.user, task.stamp, task.source,
                     task.ask_pam ? "1" : "0"});
}

std::optional<Task> UnpackTask(std::string_view packet) {
  const auto fields = UnpackFields<11>(packet);
  if (!fields) return std::nullopt;
  const auto& [kind_text, api, version, method, size_text, session_id, uid_text, user, stamp,
               source, ask_pam] = *fields;
  const auto kind = ParseKind(kind_text);
  auto name = ParseName(api, version, method);
  const auto size = ParseNumber(size_text, kMaxBody);
  const auto uid = ParseNumber(uid_text, std::numeric_limits<uid_t>::max());
  if (!kind || !name || !size || !uid) return std::nullopt;
  return Task{*kind,
              std::move(*name),
              *size,
              std::string(session_id),
              static_cast<uid_t>(*uid),
              std::string(user),
              std::string(stamp),
              std::string(source),
              ask_pam == "1"};
}

}  // namespace maru::server
