#include "server/children.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include "platform/log.h"
#include "server/answer.h"
#include "server/child.h"
#include "server/frames.h"

namespace maru::server {

std::optional<Children::IdleChild> Children::Fork() {
  SocketPair pair = MakeSocketPair();
  const pid_t pid = fork();
  if (pid == 0) RunRequestChild(std::move(pair.second), plugin_);
  if (pid < 0) {
    MARU_LOG("Failed to fork a request child");
    return std::nullopt;
  }
  ++forked_;
  return IdleChild{pid, std::move(pair.first)};
}

void Children::ForkAhead(Seconds now) {
  if (auto child = Fork())
    idle_.push_back(std::move(*child));
  else
    not_before_ = now + 1;
}

Children::Start Children::Hand(const Task& task, Descriptor& request, Seconds now) {
  if (busy_.size() >= kMaxBusy) return Start::kTooMany;
  const std::string packet = Pack(task);
  for (;;) {
    std::optional<IdleChild> child;
    const bool was_idle = !idle_.empty();
    if (was_idle) {
      child = std::move(idle_.front());
      idle_.pop_front();
    } else {
      child = Fork();
    }
    if (!child) return Start::kFailed;
    if (SendPacket(child->tasks.Get(), packet, Wait::kNo, request.Get()) == SendResult::kDone) {
      poller_.Add(request.Get(), static_cast<Poller::Key>(child->pid), 0);
      busy_.insert_or_assign(
          child->pid, BusyChild{task.session_id, std::move(child->tasks), std::move(request), now});
      return Start::kDone;
    }
    if (!was_idle) return Start::kFailed;
  }
}

bool Children::HasAnswered(const BusyChild& child) {
  char letter;
  return recv(child.tasks.Get(), &letter, sizeof(letter), MSG_DONTWAIT) == sizeof(letter);
}

void Children::HangUp(pid_t pid) {
  const auto found = busy_.find(pid);
  if (found == busy_.end() || !found->second.request) return;
  if (!HasAnswered(found->second)) kill(pid, SIGKILL);
  poller_.Remove(found->second.request.Get());
  found->second.request.Close();
}

void Children::EndOverdue(Seconds now) {
  for (auto& [pid, child] : busy_) {
    if (child.overdue || now - child.since < kMaxSeconds) continue;
    MARU_LOG("Request child %d has worked for %lld s and is ended", pid,
             static_cast<long long>(now - child.since));
    child.overdue = true;
    kill(pid, SIGKILL);
  }
}

std::optional<Children::Finished> Children::Reaped(pid_t pid, int wait_status, Seconds now) {
  if (std::erase_if(idle_, [&](const IdleChild& child) { return child.pid == pid; })) {
    MARU_LOG("Request child %d ended before it had a request (status 0x%x)", pid, wait_status);
    not_before_ = now + 1;
    return std::nullopt;
  }
  const auto found = busy_.find(pid);
  if (found == busy_.end()) return std::nullopt;
  BusyChild& child = found->second;
  const bool killed = WIFSIGNALED(wait_status) && WTERMSIG(wait_status) == SIGKILL;
  if (child.request) {
    if (WIFSIGNALED(wait_status) && !killed)
      MARU_LOG("Request child %d was ended by signal %d", pid, WTERMSIG(wait_status));
    SendChildEnd(child.request.Get(),
                 killed && !child.overdue ? ChildEnd::kKilled : ChildEnd::kFailed);
    poller_.Remove(child.request.Get());
  }
  Finished finished{child.session_id,
                    WIFEXITED(wait_status) && WEXITSTATUS(wait_status) == kExitSessionOver};
  busy_.erase(found);
  return finished;
}

}  // namespace maru::server
