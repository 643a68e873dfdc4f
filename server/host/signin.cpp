#include "server/host/signin.h"

#include <signal.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <limits>

#include "server/kernel/confinement.h"
#include "server/wire/fields.h"
#include "server/wire/packets.h"
#include "system/log.h"

namespace maru::server {
namespace {

std::string Pack(const User& user) {
  return PackFields({user.name, std::to_string(user.uid), user.stamp, user.is_admin ? "1" : "0"});
}

std::optional<User> UnpackUser(std::string_view packet) {
  const auto fields = UnpackFields<4>(packet);
  if (!fields) return std::nullopt;
  const auto& [name, uid_text, stamp, admin] = *fields;
  const auto uid = ParseNumber(uid_text, std::numeric_limits<uid_t>::max());
  if (!uid) return std::nullopt;
  return User{std::string(name), static_cast<uid_t>(*uid), std::string(stamp), admin == "1"};
}

[[noreturn]] void RunSignInChild(UniqueFd result, const Ask& ask) {
  result = KeepOnly(std::move(result));
  prctl(PR_SET_NAME, "maruweb-signin");
  try {
    if (const auto user = SignIn(ask.user, ask.password, ask.source))
      SendPacket(result.Get(), Pack(*user), Wait::kYes);
  } catch (const std::exception& exception) {
    MARU_LOG("Failed to sign in: %s", exception.what());
  }
  _exit(0);
}

}  // namespace

bool SignIns::Begin(const Ask& ask, UniqueFd& request, Seconds now) {
  if (pending_.size() >= kMaxPending) return false;
  SocketPair pair = MakeSocketPair();
  const pid_t pid = fork();
  if (pid == 0) RunSignInChild(std::move(pair.second), ask);
  if (pid < 0) {
    MARU_LOG("Failed to fork a sign-in child");
    return false;
  }
  Outcome refused{std::move(request), ask.user, ask.source, std::nullopt};
  pending_.insert_or_assign(pid, Pending{std::move(refused), std::move(pair.first), now});
  return true;
}

std::optional<SignIns::Outcome> SignIns::Reaped(pid_t pid) {
  const auto found = pending_.find(pid);
  if (found == pending_.end()) return std::nullopt;
  Outcome outcome = std::move(found->second.refused);
  Packet packet;
  if (ReceivePacket(found->second.result.Get(), packet, Wait::kNo) == ReceiveResult::kPacket)
    outcome.user = UnpackUser(packet.View());
  pending_.erase(found);
  return outcome;
}

void SignIns::EndOverdue(Seconds now) {
  for (const auto& [pid, pending] : pending_)
    if (now - pending.since >= kMaxSeconds) kill(pid, SIGKILL);
}

}  // namespace maru::server
