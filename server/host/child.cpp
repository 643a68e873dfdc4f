#include "server/host/child.h"

#include <errno.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <exception>
#include <utility>

#include "common/error.h"
#include "server/host/surrogate_escape.h"
#include "server/host/user.h"
#include "server/kernel/confinement.h"
#include "server/wire/answer.h"
#include "system/accounts.h"
#include "system/acting.h"
#include "system/client_address.h"
#include "system/json.h"
#include "system/keep_errno.h"
#include "system/log.h"
#include "system/reason_to_end.h"
#include "system/share_table.h"

namespace maru::server {
namespace {

/// Then a new child takes over, and what a method may have left in memory is gone.
constexpr int kMostRequests = 1000;
/// After a longer answer (bytes) a child ends instead of keeping the memory that it took.
constexpr std::size_t kLongAnswer = 4u << 20;
/// How soon a process that a request has left behind is reaped.
constexpr int kReapMilliseconds = 100;

void LimitMemory() {
#ifndef __SANITIZE_ADDRESS__
  constexpr rlim_t kMost = rlim_t{2} << 30;
  const rlimit limit{kMost, kMost};
  setrlimit(RLIMIT_AS, &limit);
#endif
}

/// False when the front went away before the body was whole.
bool ReadBody(int socket, std::size_t size, Packet& packet, std::string& body) {
  while (body.size() < size) {
    if (ReceivePacket(socket, packet, Wait::kYes) != ReceiveResult::kPacket) return false;
    body += packet.View();
  }
  return body.size() == size;
}

/// Absent parameters are an empty object; false when the body is anything but one JSON object.
bool ParseParams(const std::string& body, Json::Value& params) {
  params = Json::objectValue;
  if (body.empty()) return true;
  return json::FromString(UnescapeBytes(body), params) && params.isObject();
}

/// The process serves no other request.
void EndAfterThis() {
  static const ReasonToEnd reason;
}

/// Where the one answer of a request goes.
class Reply {
 public:
  /// `front` takes the answer, `host` hears first that there is one: when the front then closes its
  /// end, the child is left to finish what follows. Both outlive this object.
  Reply(const UniqueFd& front, const UniqueFd& host) : front_(front), host_(host) {}

  /// Sends the first answer; what comes after it is only logged.
  void Give(Answer answer) {
    if (std::exchange(given_, true)) {
      MARU_LOG("An answer was already given; status %d came after it", answer.status);
      return;
    }
    answer.body = EscapeBytes(std::move(answer.body));
    if (answer.body.size() > kMaxAnswer) {
      MARU_LOG("An answer of %zu bytes is too long", answer.body.size());
      answer = Unknown();
    }
    const KeepErrno keep;
    if (answer.body.size() > kLongAnswer) EndAfterThis();
    Say(host_.Get(), ChildWord::kAnswered);
    sent_ = SendAnswer(front_.Get(), answer, Wait::kYes);
  }

  /// All of an answer has gone out.
  bool IsSent() const { return sent_; }

  static Answer Unknown() { return Failure(maruseeker::kErrorUnknown, Json::Value()); }

 private:
  const UniqueFd& front_;
  const UniqueFd& host_;
  bool given_ = false;
  bool sent_ = false;
};

void RunMethod(const Plugin::Method& method, MARU::APIRequest& request, Reply& reply) {
  MARU::APIResponse response([&](const Json::Value& data) { reply.Give(Success(data)); });
  try {
    if (method.check(&request, &response)) method.entry(&request, &response);
  } catch (const std::exception& exception) {
    MARU_LOG("An exception left the plug-in: %s", exception.what());
    EndAfterThis();
    return reply.Give(Reply::Unknown());
  } catch (...) {
    MARU_LOG("An exception left the plug-in");
    EndAfterThis();
    return reply.Give(Reply::Unknown());
  }
  if (response.IsSuccess()) return;
  reply.Give(response.IsSet() ? Failure(response.ErrorCode(), response.Data()) : Reply::Unknown());
}

void Call(const Task& task, std::string body, const Plugin& plugin, bool is_admin, Reply& reply) {
  const Plugin::Method method = plugin.Find(task.name);
  if (!method.entry) return reply.Give(Refusal(404));
  Json::Value params;
  if (!ParseParams(body, params)) return reply.Give(Refusal(400));
  MARU::APIRequest request({task.uid, task.user, task.session_id, is_admin}, std::move(params));
  RunMethod(method, request, reply);
}

int Serve(const Task& task, const UniqueFd& socket, const UniqueFd& host, Packet& packet,
          const Plugin& plugin, Reply& reply) {
  const auto user = FindUser(task.user);
  if (!user || user->uid != task.uid || user->stamp != task.stamp ||
      (task.ask_pam && !IsAdmitted(task.user))) {
    reply.Give(Refusal(401));
    return kExitSessionOver;
  }
  if (!user->is_admin && task.uid != 0) Say(host.Get(), ChildWord::kEndsOwnOnly);
  std::string body;
  if (!ReadBody(socket.Get(), task.body_size, packet, body)) return 0;
  errno = 0;  // for what the plug-in logs
  if (task.kind == AskKind::kWho)
    reply.Give(Success(Description(*user)));
  else
    Call(task, std::move(body), plugin, user->is_admin, reply);
  return 0;
}

/// Goes the road of a request once, off any request's time: most of what a fresh process spends on
/// its first request is the kernel's copying of the pages it touches.
void WarmUp() {
  FindUser("root");
  Json::Value params;
  ParseParams(R"({"warm": ["up", 1, {}]})", params);
  Success(params);
}

/// What one request may write into the log, in bytes: its parameters, thousands of them, may each
/// be worth a line.
constexpr long kMaxLogged = 64 << 10;

/// Serves the request in `packet`. Not 0 when the child is not to go on: the status to end with.
int ServeOne(const UniqueFd& tasks, Packet& packet, const Plugin& plugin) {
  const auto task = UnpackTask(packet.View());
  const UniqueFd socket = std::move(packet.passed);
  ForgetAccounts();
  LimitLog(kMaxLogged);
  if (!task || !socket) return 1;
  WorkFor(ClientAddress(task->source));
  Reply reply(socket, tasks);
  try {
    if (const int status = Serve(*task, socket, tasks, packet, plugin, reply)) return status;
  } catch (const std::exception& exception) {
    MARU_LOG("Failed to serve a request: %s", exception.what());
    return 1;
  }
  return reply.IsSent() ? 0 : 1;
}

/// Until there is a task, or nothing is left of what the requests before have forked.
void ReapUntilAsked(const UniqueFd& tasks) {
  pollfd asked{tasks.Get(), POLLIN, 0};
  pid_t pid;
  do {
    pid = waitpid(-1, nullptr, WNOHANG);
  } while (pid > 0 || (pid == 0 && poll(&asked, 1, kReapMilliseconds) == 0));
}

}  // namespace

void RunRequestChild(UniqueFd tasks, const Plugin& plugin) {
  tasks = KeepOnly(std::move(tasks));
  prctl(PR_SET_NAME, "maruweb-request");
  LimitMemory();
  ShareTable::Freeze();
  WarmUp();
  Packet packet;
  for (int served = 0;; ++served) {
    ReapUntilAsked(tasks);
    if (ReceivePacket(tasks.Get(), packet, Wait::kYes) != ReceiveResult::kPacket) _exit(0);
    if (const int status = ServeOne(tasks, packet, plugin)) _exit(status);
    // Who says that the request is over is about to wait for the next one.
    const bool last = served + 1 == kMostRequests || ReasonToEnd::Exists();
    if (last || !ActAs("root")) _exit(0);
    Say(tasks.Get(), ChildWord::kRequestOver);
  }
}

}  // namespace maru::server
