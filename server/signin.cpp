#include "server/signin.h"

#include <signal.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <limits>

#include "server/child.h"
#include "server/frames.h"
#include "system/log.h"

namespace maru::server {
namespace {

[[noreturn]] void RunSignInChild(Descriptor result, const Ask& ask) {
  result = KeepOnly(std::move(result));
  prctl(PR_SET_NAME, "maruweb-signin");
  try {
    const auto account = SignIn(ask.user, ask.password, ask.source);
    if (account)
      SendPacket(result.Get(),
                 PackFields({account->name, std::to_string(account->uid), account->stamp,
                             IsAdministrator(account->name) ? "1" : "0"}),
                 Wait::kYes);
  } catch (const std::exception& exception) {
    MARU_LOG("Failed to sign in: %s", exception.what());
  }
  _exit(0);
}

}  // namespace

bool SignIns::Begin(const Ask& ask, Descriptor& request, Seconds now) {
  if (pending_.size() >= kMaxPending) return false;
  SocketPair pair = MakeSocketPair();
  const pid_t pid = fork();
  if (pid == 0) RunSignInChild(std::move(pair.second), ask);
  if (pid < 0) {
    MARU_LOG("Failed to fork a sign-in child");
    return false;
  }
  pending_.insert_or_assign(
      pid, Pending{std::move(request), std::move(pair.first), ask.user, ask.source, now});
  return true;
}

std::optional<SignIns::Outcome> SignIns::Reaped(pid_t pid) {
  const auto found = pending_.find(pid);
  if (found == pending_.end()) return std::nullopt;
  Pending pending = std::move(found->second);
  pending_.erase(found);
  Outcome outcome{std::move(pending.request), std::move(pending.user), std::move(pending.source),
                  std::nullopt};
  Packet packet;
  if (ReceivePacket(pending.result.Get(), packet, Wait::kNo) != ReceiveResult::kPacket)
    return outcome;
  const auto fields = UnpackFields<4>(packet.View());
  if (!fields) return outcome;
  const auto& [name, uid_text, stamp, admin] = *fields;
  const auto uid = ParseNumber(uid_text, std::numeric_limits<uid_t>::max());
  if (!uid) return outcome;
  outcome.account = Account{std::string(name), static_cast<uid_t>(*uid), std::string(stamp)};
  outcome.is_admin = admin == "1";
  return outcome;
}

void SignIns::EndOverdue(Seconds now) {
  for (const auto& [pid, pending] : pending_)
    if (now - pending.since >= kMaxSeconds) kill(pid, SIGKILL);
}

}  // namespace maru::server
