#include "server/host/children.h"

#include <errno.h>
#include <signal.h>
#include <sys/wait.h>

#include <algorithm>
#include <system_error>
#include <utility>

#include "server/host/child.h"
#include "server/host/left_behind.h"
#include "system/log.h"

namespace maru::server {

std::optional<Children::Child> Children::Fork() {
  SocketPair pair = MakeSocketPair();
  const pid_t pid = fork();
  if (pid == 0) RunRequestChild(std::move(pair.second), plugin_);
  if (pid < 0) {
    MARU_LOG("Failed to fork a request child");
    return std::nullopt;
  }
  ++forked_;
  return Child{pid, std::move(pair.first)};
}

void Children::ForkAhead(Seconds now) {
  if (auto child = Fork())
    fresh_.push_back(std::move(*child));
  else
    not_before_ = now + 1;
}

void Children::Renew() {
  fresh_.clear();
  rested_.clear();
  renewed_ = next_number_;
}

/// Whether the request that the child works at can end processes of the user.
bool Children::MayEnd(const BusyChild& child, const std::string& user) {
  if (child.user == user) return true;
  return !child.ends_own_only &&
         HeardWord<ChildWord>(child.tasks.Get(), MSG_PEEK) != ChildWord::kEndsOwnOnly;
}

/// A request that was under way when a child's own ended may have read of that child's process id
/// and be about to end it. So a child works again only when all those that could are over.
std::optional<Children::Child> Children::TakeRested(const std::string& user) {
  std::uint64_t oldest = next_number_;
  for (const auto& [pid, child] : busy_) {
    if (MayEnd(child, user)) oldest = std::min(oldest, child.number);
  }
  // The last one first: the others may go when there is less to do.
  const auto found = std::find_if(rested_.rbegin(), rested_.rend(), [&](const RestedChild& rested) {
    return rested.user == user && rested.first <= oldest;
  });
  if (found == rested_.rend()) return std::nullopt;
  Child child = std::move(found->child);
  rested_.erase(std::prev(found.base()));
  return child;
}

bool Children::Hand(const Task& task, UniqueFd& request, Seconds now) {
  if (busy_.size() >= kMaxBusy) return false;
  const std::string packet = Pack(task);
  for (;;) {
    std::optional<Child> child = TakeRested(task.user);
    if (!child && !fresh_.empty()) {
      child = std::move(fresh_.front());
      fresh_.pop_front();
    }
    const bool waited = child.has_value();
    if (!waited) child = Fork();
    if (!child) return false;
    if (SendPacket(child->tasks.Get(), packet, Wait::kNo, request.Get()) == SendResult::kDone) {
      poller_.Add(request.Get(), static_cast<Poller::Key>(child->pid), 0);
      busy_.insert_or_assign(child->pid,
                             BusyChild{task.session_id, task.user, std::move(child->tasks),
                                       std::move(request), next_number_++, now});
      return true;
    }
    if (!waited) return false;
  }
}

std::optional<Children::Finished> Children::Hear(pid_t pid, Seconds now) {
  const auto found = busy_.find(pid);
  if (found == busy_.end()) return std::nullopt;
  BusyChild& child = found->second;
  // What it has said has waited in its socket: while the request is the front's, only that socket
  // is listened to, so that a child that answers and is done costs one event.
  while (const auto word = HeardWord<ChildWord>(child.tasks.Get())) {
    if (*word == ChildWord::kRequestOver) return Rest(found, now);
    if (*word == ChildWord::kEndsOwnOnly)
      child.ends_own_only = true;
    else
      child.answered = true;
  }
  if (!child.request) return std::nullopt;
  poller_.Remove(child.request.Get());
  child.request.Close();
  if (!child.answered || !ListenTo(child, pid)) kill(pid, SIGKILL);
  return std::nullopt;
}

bool Children::ListenTo(const BusyChild& child, pid_t pid) {
  try {
    poller_.Add(child.tasks.Get(), static_cast<Poller::Key>(pid), EPOLLIN);
    return true;
  } catch (const std::system_error& error) {
    MARU_LOG("Failed to listen to request child %d: %s", pid, error.what());
    return false;
  }
}

/// Until the front hangs up its socket is listened to; then, for what follows the answer, the
/// child's.
void Children::StopListening(const BusyChild& child) {
  poller_.Remove(child.request ? child.request.Get() : child.tasks.Get());
}

std::optional<Children::Finished> Children::Rest(Busy::iterator place, Seconds now) {
  BusyChild& child = place->second;
  StopListening(child);
  if (child.number >= renewed_ && !child.overdue) {
    if (rested_.size() >= kMaxRested) rested_.pop_front();
    rested_.push_back(
        {{place->first, std::move(child.tasks)}, std::move(child.user), next_number_, now});
  }
  Finished finished{std::move(child.session_id)};
  busy_.erase(place);
  return finished;
}

void Children::EndOverdue(Seconds now) {
  std::erase_if(rested_,
                [&](const RestedChild& rested) { return now - rested.since >= kRestSeconds; });
  for (auto& [pid, child] : busy_) {
    if (child.overdue || now - child.since < kMaxSeconds) continue;
    errno = 0;
    MARU_LOG("Request child %d has worked for %lld s and is ended", pid,
             static_cast<long long>(now - child.since));
    child.overdue = true;
    kill(pid, SIGKILL);
  }
}

void Children::EndStopped(pid_t pid) {
  errno = 0;
  MARU_LOG("Process %d was stopped and is ended", pid);
  const auto found = busy_.find(pid);
  if (found != busy_.end()) found->second.overdue = true;
  kill(pid, SIGKILL);
}

std::optional<Children::Finished> Children::Reaped(pid_t pid, int wait_status, Seconds now) {
  errno = 0;  // for what is logged of the end of another process
  if (std::erase_if(fresh_, [&](const Child& child) { return child.pid == pid; })) {
    MARU_LOG("Request child %d ended before it had a request (status 0x%x)", pid, wait_status);
    not_before_ = now + 1;
    return std::nullopt;
  }
  std::erase_if(rested_, [&](const RestedChild& rested) { return rested.child.pid == pid; });
  RemoveFilesOf(pid);
  const auto found = busy_.find(pid);
  if (found == busy_.end()) return std::nullopt;
  BusyChild& child = found->second;
  const bool killed = WIFSIGNALED(wait_status) && WTERMSIG(wait_status) == SIGKILL;
  if (child.request) {
    if (WIFSIGNALED(wait_status) && !killed)
      MARU_LOG("Request child %d was ended by signal %d", pid, WTERMSIG(wait_status));
    // When there is no room for it the front learns as much from the closed socket.
    Say(child.request.Get(), killed && !child.overdue ? AnswerPart::kKilled : AnswerPart::kFailed);
  }
  StopListening(child);
  Finished finished{std::move(child.session_id),
                    WIFEXITED(wait_status) && WEXITSTATUS(wait_status) == kExitSessionOver};
  busy_.erase(found);
  return finished;
}

}  // namespace maru::server
