#include "daemon/core/core.h"

#include <algorithm>
#include <exception>

#include "daemon/core/arguments.h"
#include "daemon/core/commands.h"
#include "system/json.h"
#include "system/log.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kMaxCommandName = 64;

Json::Value Execute(Core& core, const Caller& caller, const std::string& line, const Output& output,
                    const CancelCheck& cancelled) {
  Json::Value message;
  std::string why;
  if (!json::FromString(line, message, &why)) throw BadParameter("Not a JSON text: " + why);
  const Arguments envelope(message, "", {"command", "data"});
  const std::string name = envelope.String("command", kMaxCommandName);
  if (name.empty()) envelope.Refuse("command", "is missing");
  const auto command = std::ranges::find(Commands(), name, &Command::name);
  if (command == Commands().end()) throw BadParameter("Unknown command " + Quoted(name));
  Json::Value reply(Json::objectValue);
  Json::Value data =
      command->run({core, caller.identity, caller.client, envelope.Any("data"), output, cancelled});
  if (!data.isNull()) reply["data"] = std::move(data);
  reply["success"] = true;
  return reply;
}

Json::Value Internal(const char* what) {
  MARU_LOG("Request failed: %s", what);
  return ErrorReply(maruseeker::kErrorUnknown, "Internal error");
}

}  // namespace

Json::Value ErrorReply(int code, const std::string& message) {
  Json::Value reply;
  reply["success"] = false;
  reply["error"]["code"] = code;
  reply["error"]["msg"] = message;
  return reply;
}

void Answer(Core& core, const Caller& caller, const std::string& line, const Output& output,
            const CancelCheck& cancelled) {
  Json::Value reply;
  try {
    reply = Execute(core, caller, line, output, cancelled);
  } catch (const maruseeker::Error& error) {
    if (error.Code() != maruseeker::kErrorBadParameter &&
        error.Code() != maruseeker::kErrorNoPermission) {
      MARU_LOG("Request failed: %d, %s", error.Code(), error.what());
    }
    reply = ErrorReply(error.Code(), error.Reason());
  } catch (const index::Cancelled&) {
    reply = ErrorReply(maruseeker::kErrorDaemonExchange, "The request took too long");
  } catch (const std::exception& error) {
    reply = Internal(error.what());
  } catch (...) {
    reply = Internal("unknown exception");
  }
  output(json::ToString(reply), true);
}

}  // namespace maru::daemon
