#include "server/supervisor.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <sched.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "server/front/front.h"
#include "server/kernel/signals.h"
#include "server/listener.h"
#include "server/mounts.h"
#include "server/wire/letters.h"
#include "system/log.h"
#include "system/mounts.h"
#include "system/share_table.h"
#include "system/throw_errno.h"

namespace maru::server {
namespace {

constexpr int kLookEvery = 2000;  // milliseconds
/// What the front and the host may take to end by themselves, each.
constexpr int kEndWithin = 5000;  // milliseconds

/// The front or the host.
struct Part {
  const char* name;
  pid_t pid = -1;
  UniqueFd lifeline;
  bool ready = false;
};

/// Tells systemd, when it asked to be told.
void NotifyReady() {
  const char* path = getenv("NOTIFY_SOCKET");
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (!path || strlen(path) >= sizeof(address.sun_path)) return;
  strcpy(address.sun_path, path);
  if (path[0] == '@') address.sun_path[0] = '\0';
  const UniqueFd socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + strlen(path));
  constexpr std::string_view kText = "READY=1";
  if (sendto(socket.Get(), kText.data(), kText.size(), MSG_NOSIGNAL,
             reinterpret_cast<const sockaddr*>(&address), size) < 0)
    MARU_LOG("Cannot tell the service manager that the web server is ready");
}

class Supervisor {
 public:
  Supervisor(const Config& config, std::vector<std::string> host_command)
      : config_(config),
        host_command_(std::move(host_command)),
        listener_(OpenListener(config)),
        signals_(OpenSignals({SIGCHLD, SIGTERM, SIGINT, SIGHUP})) {
    mounts_.Apply(*ShareTable::Current());
  }

  int Run();

 private:
  void StartParts();
  void Start(Part& part, const std::function<int(UniqueFd lifeline)>& body);
  int BecomeHost(UniqueFd control, UniqueFd lifeline);
  void Watch();
  void TakeSignals();
  void TakeLifeline(Part& part);
  void End(Part& part);
  bool Reap(Part& part);

  const Config& config_;
  std::vector<std::string> host_command_;
  UniqueFd listener_;
  UniqueFd signals_;
  ShareMounts mounts_;
  MountWatch machine_{"/"};
  std::array<Part, 2> parts_{Part{"front", -1, {}}, Part{"host", -1, {}}};
  bool over_ = false;
  int status_ = 0;
};

int Supervisor::Run() {
  StartParts();
  while (!over_) Watch();
  // The front first: the host may then end the requests that are left.
  for (Part& part : parts_) End(part);
  return status_;
}

void Supervisor::StartParts() {
  SocketPair control = MakeSocketPair();
  auto& [front, host] = parts_;
  Start(front, [&](UniqueFd lifeline) {
    control.second.Close();
    return RunFront(config_, std::move(listener_), std::move(control.first), std::move(lifeline));
  });
  // Only the next child gets the new PID namespace; this process keeps its own.
  const UniqueFd own(open("/proc/self/ns/pid", O_RDONLY | O_CLOEXEC));
  CheckErrno(own.Get() >= 0, "/proc/self/ns/pid");
  CheckErrno(unshare(CLONE_NEWPID) == 0, "unshare");
  Start(host, [&](UniqueFd lifeline) {
    control.first.Close();
    listener_.Close();
    return BecomeHost(std::move(control.second), std::move(lifeline));
  });
  CheckErrno(setns(own.Get(), CLONE_NEWPID) == 0, "setns");
  listener_.Close();
}

void Supervisor::Start(Part& part, const std::function<int(UniqueFd)>& body) {
  SocketPair lifeline = MakeSocketPair();
  part.pid = fork();
  CheckErrno(part.pid >= 0, "fork");
  if (part.pid > 0) {
    part.lifeline = std::move(lifeline.first);
    return;
  }
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  UnblockSignals();
  signal(SIGPIPE, SIG_IGN);
  lifeline.first.Close();
  signals_.Close();
  for (Part& other : parts_) other.lifeline.Close();
  ReopenLog();
  _exit(body(std::move(lifeline.second)));
}

/// Request children are forked off the host all the time: it is a program of its own, without what
/// the front and this process have in memory.
int Supervisor::BecomeHost(UniqueFd control, UniqueFd lifeline) {
  for (const UniqueFd* kept : {&control, &lifeline}) {
    fcntl(kept->Get(), F_SETFD, 0);
    host_command_.push_back(std::to_string(kept->Get()));
  }
  std::vector<char*> words;
  for (std::string& word : host_command_) words.push_back(word.data());
  words.push_back(nullptr);
  execv(words[0], words.data());
  MARU_LOG("Failed to start %s", words[0]);
  return 1;
}

void Supervisor::Watch() {
  std::array<pollfd, 4> sources{
      pollfd{signals_.Get(), POLLIN, 0}, pollfd{parts_[0].lifeline.Get(), POLLIN, 0},
      pollfd{parts_[1].lifeline.Get(), POLLIN, 0}, pollfd{machine_.Descriptor(), POLLPRI, 0}};
  poll(sources.data(), sources.size(), kLookEvery);
  if (sources[0].revents) TakeSignals();
  for (std::size_t i = 0; i < parts_.size(); ++i)
    if (sources[i + 1].revents) TakeLifeline(parts_[i]);
  for (Part& part : parts_) {
    if (!Reap(part) || over_) continue;
    MARU_LOG("The %s ended; the web server ends with it", part.name);
    status_ = 1;
    over_ = true;
  }
  // Also when no settings changed: a share that could not be mounted may be there by now, and what
  // the operator mounts or unmounts ends the wait.
  mounts_.Apply(*ShareTable::Current());
}

void Supervisor::TakeSignals() {
  while (const int signal = NextSignal(signals_)) {
    if (signal == SIGTERM || signal == SIGINT) over_ = true;
    if (signal != SIGHUP) continue;
    for (const Part& part : parts_) kill(part.pid, SIGHUP);
  }
}

void Supervisor::TakeLifeline(Part& part) {
  if (!HeardWord<PartWord>(part.lifeline.Get())) {
    // It has ended, or is about to: its signal follows.
    part.lifeline.Close();
    return;
  }
  const bool known = std::exchange(part.ready, true);
  if (known || !parts_[0].ready || !parts_[1].ready) return;
  errno = 0;
  MARU_LOG("Ready at %s port %d", config_.listen_address.c_str(), config_.listen_port);
  NotifyReady();
}

bool Supervisor::Reap(Part& part) {
  if (part.pid <= 0) return false;
  int status = 0;
  if (waitpid(part.pid, &status, WNOHANG) != part.pid) return false;
  errno = 0;
  if (WIFSIGNALED(status)) MARU_LOG("The %s was ended by signal %d", part.name, WTERMSIG(status));
  part.pid = -1;
  return true;
}

void Supervisor::End(Part& part) {
  constexpr int kStep = 10;
  if (part.pid <= 0) return;
  kill(part.pid, SIGTERM);
  for (int waited = 0; waited < kEndWithin; waited += kStep) {
    if (Reap(part)) return;
    poll(nullptr, 0, kStep);
  }
  errno = 0;
  MARU_LOG("The %s does not end and is killed", part.name);
  kill(part.pid, SIGKILL);
  waitpid(part.pid, nullptr, 0);
  part.pid = -1;
}

}  // namespace

int RunSupervisor(const Config& config, std::vector<std::string> host_command) {
  if (geteuid() != 0) throw std::runtime_error("the web server must be started by root");
  return Supervisor(config, std::move(host_command)).Run();
}

}  // namespace maru::server
