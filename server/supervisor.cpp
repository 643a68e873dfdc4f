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
#include <system_error>
#include <vector>

#include "server/frames.h"
#include "server/front.h"
#include "server/listener.h"
#include "server/mounts.h"
#include "server/signals.h"
#include "system/log.h"
#include "system/share_table.h"

namespace maru::server {
namespace {

constexpr int kLookEvery = 2000;  // milliseconds
/// What the front and the host may take to end by themselves, each.
constexpr int kEndWithin = 5000;  // milliseconds

/// The front or the host.
struct Part {
  const char* name;
  pid_t pid = -1;
  Descriptor lifeline;
  bool ready = false;
};

void Demand(bool good, const char* what) {
  if (!good) throw std::system_error(errno, std::generic_category(), what);
}

/// Tells systemd, when it asked to be told.
void NotifyReady() {
  const char* path = getenv("NOTIFY_SOCKET");
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (!path || strlen(path) >= sizeof(address.sun_path)) return;
  strcpy(address.sun_path, path);
  if (path[0] == '@') address.sun_path[0] = '\0';
  const Descriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + strlen(path));
  constexpr std::string_view text = "READY=1";
  if (sendto(socket.Get(), text.data(), text.size(), MSG_NOSIGNAL,
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
    shares_ = ShareTable::Current();
    mounts_.Apply(*shares_);
  }

  int Run();

 private:
  void StartParts();
  void Start(Part& part, const std::function<int(Descriptor lifeline)>& body);
  int BecomeHost(Descriptor control, Descriptor lifeline);
  void Watch();
  void TakeSignals();
  void TakeLifeline(Part& part);
  void LookAtShares();
  void End(Part& part);
  bool Reap(Part& part);

  const Config& config_;
  std::vector<std::string> host_command_;
  Descriptor listener_;
  Descriptor signals_;
  ShareMounts mounts_;
  std::shared_ptr<const ShareTable> shares_;
  std::array<Part, 2> parts_{Part{"front", -1, {}}, Part{"host", -1, {}}};
  bool ready_ = false;
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
  Start(front, [&](Descriptor lifeline) {
    control.second.Close();
    return RunFront(config_, std::move(listener_), std::move(control.first), std::move(lifeline));
  });
  // Only the next child gets the new PID namespace; this process keeps its own.
  const Descriptor own(open("/proc/self/ns/pid", O_RDONLY | O_CLOEXEC));
  Demand(static_cast<bool>(own), "/proc/self/ns/pid");
  Demand(unshare(CLONE_NEWPID) == 0, "unshare");
  Start(host, [&](Descriptor lifeline) {
    control.first.Close();
    listener_.Close();
    return BecomeHost(std::move(control.second), std::move(lifeline));
  });
  Demand(setns(own.Get(), CLONE_NEWPID) == 0, "setns");
  listener_.Close();
}

void Supervisor::Start(Part& part, const std::function<int(Descriptor)>& body) {
  SocketPair lifeline = MakeSocketPair();
  part.pid = fork();
  Demand(part.pid >= 0, "fork");
  if (part.pid > 0) {
    part.lifeline = std::move(lifeline.first);
    return;
  }
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  sigset_t none;
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &none, nullptr);
  signal(SIGPIPE, SIG_IGN);
  lifeline.first.Close();
  signals_.Close();
  for (Part& other : parts_) other.lifeline.Close();
  ReopenLog();
  _exit(body(std::move(lifeline.second)));
}

/// Request children are forked off the host all the time: it is a program of its own, without what
/// the front and this process have in memory.
int Supervisor::BecomeHost(Descriptor control, Descriptor lifeline) {
  for (const Descriptor* kept : {&control, &lifeline}) {
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
  std::array<pollfd, 3> sources{pollfd{signals_.Get(), POLLIN, 0},
                                pollfd{parts_[0].lifeline.Get(), POLLIN, 0},
                                pollfd{parts_[1].lifeline.Get(), POLLIN, 0}};
  poll(sources.data(), sources.size(), kLookEvery);
  errno = 0;
  if (sources[0].revents) TakeSignals();
  for (std::size_t i = 0; i < parts_.size(); ++i)
    if (sources[i + 1].revents) TakeLifeline(parts_[i]);
  for (Part& part : parts_) {
    if (!Reap(part) || over_) continue;
    MARU_LOG("The %s ended; the web server ends with it", part.name);
    status_ = 1;
    over_ = true;
  }
  LookAtShares();
}

void Supervisor::TakeSignals() {
  while (const int signal = NextSignal(signals_)) {
    if (signal == SIGTERM || signal == SIGINT) over_ = true;
    if (signal != SIGHUP) continue;
    for (const Part& part : parts_) kill(part.pid, SIGHUP);
  }
}

void Supervisor::TakeLifeline(Part& part) {
  char byte;
  if (read(part.lifeline.Get(), &byte, 1) != 1) {
    // It has ended, or is about to: its signal follows.
    part.lifeline.Close();
    return;
  }
  part.ready = true;
  if (ready_ || !parts_[0].ready || !parts_[1].ready) return;
  ready_ = true;
  MARU_LOG("Ready at %s port %d", config_.listen_address.c_str(), config_.listen_port);
  NotifyReady();
}

void Supervisor::LookAtShares() {
  auto newest = ShareTable::Current();
  errno = 0;
  // Also when nothing changed: a share that could not be mounted may be there by now.
  mounts_.Apply(*newest);
  shares_ = std::move(newest);
}

bool Supervisor::Reap(Part& part) {
  if (part.pid <= 0) return false;
  int status = 0;
  if (waitpid(part.pid, &status, WNOHANG) != part.pid) return false;
  if (WIFSIGNALED(status)) MARU_LOG("The %s was ended by signal %d", part.name, WTERMSIG(status));
  part.pid = -1;
  return true;
}

void Supervisor::End(Part& part) {
  constexpr int step = 10;
  if (part.pid <= 0) return;
  kill(part.pid, SIGTERM);
  for (int waited = 0; waited < kEndWithin; waited += step) {
    if (Reap(part)) return;
    poll(nullptr, 0, step);
  }
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
