#include "server/host/host.h"

#include <errno.h>
#include <signal.h>
#include <sodium.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <exception>

#include "server/host/children.h"
#include "server/host/session.h"
#include "server/host/signin.h"
#include "server/host/signin_limits.h"
#include "server/kernel/confinement.h"
#include "server/kernel/signals.h"
#include "server/wire/answer.h"
#include "system/log.h"
#include "system/share_table.h"

namespace maru::server {
namespace {

constexpr unsigned kMaxPerSession = 64;
constexpr int kTickMilliseconds = 2000;
/// Forking takes a core for a while, which a request under way may need: children are forked ahead
/// when nothing has happened for so long, or when they run short.
constexpr int kQuietMilliseconds = 2;
constexpr Seconds kSweepEvery = 600;
/// How long what PAM said of an account holds.
constexpr Seconds kAdmittedFor = 300;
constexpr Seconds kGrace = 2;

// Keys beyond every process id.
constexpr Poller::Key kControl = Poller::Key{1} << 32;
constexpr Poller::Key kLifeline = kControl + 1;
constexpr Poller::Key kSignals = kControl + 2;

class Host {
 public:
  Host(const Config& config, const Plugin& plugin, UniqueFd control, UniqueFd lifeline)
      : control_(std::move(control)),
        lifeline_(std::move(lifeline)),
        signals_(OpenSignals({SIGCHLD, SIGTERM, SIGHUP})),
        plugin_(plugin),
        sessions_(Seconds{60} * config.session_minutes),
        children_(poller_, plugin_),
        shares_(ShareTable::Current()) {
    poller_.Add(control_.Get(), kControl, EPOLLIN);
    poller_.Add(lifeline_.Get(), kLifeline, EPOLLIN);
    poller_.Add(signals_.Get(), kSignals, EPOLLIN);
  }

  int Run();

 private:
  void Handle(const epoll_event& event);
  void Tick();
  void LookAtShares();
  void TakeSignals();
  void ReapAll();
  void End(const std::optional<Children::Finished>& request);
  void TakeAsks();
  void Take(Ask ask, UniqueFd request);
  void TakeSignIn(Ask& ask, UniqueFd request);
  void FinishSignIn(SignIns::Outcome outcome);
  void TakeCall(const Ask& ask, Session& session, UniqueFd request);
  Answer Status() const;

  UniqueFd control_, lifeline_, signals_;
  const Plugin& plugin_;
  Poller poller_;
  TokenSeal seal_;
  SessionTable sessions_;
  SignInLimits limits_;
  SignIns sign_ins_;
  Children children_;
  std::shared_ptr<const ShareTable> shares_;
  Packet packet_;
  Seconds next_tick_ = 0;
  Seconds next_sweep_ = 0;
  Seconds end_ = 0;
  bool over_ = false;
};

void Reply(const UniqueFd& request, const Answer& answer) {
  SendAnswer(request.Get(), answer, Wait::kNo);
}

int Host::Run() {
  while (children_.WantsMore(Now())) children_.ForkAhead(Now());
  if (!Say(lifeline_.Get(), PartWord::kReady)) return 1;
  while (!over_) {
    const bool fork_ahead = !end_ && children_.WantsMore(Now());
    const int quiet = children_.RunsShort() ? 0 : kQuietMilliseconds;
    const auto events = poller_.Wait(fork_ahead ? quiet : kTickMilliseconds);
    for (const epoll_event& event : events) Handle(event);
    if (events.empty() && fork_ahead) children_.ForkAhead(Now());
    if (Now() >= next_tick_) Tick();
  }
  return 0;
}

void Host::Handle(const epoll_event& event) {
  const Poller::Key key = event.data.u64;
  if (key == kControl) return TakeAsks();
  if (key == kSignals) return TakeSignals();
  if (key == kLifeline)
    over_ = true;
  else
    End(children_.Hear(static_cast<pid_t>(key), Now()));
}

void Host::Tick() {
  const Seconds now = Now();
  next_tick_ = now + 1;
  if (end_ && now >= end_) over_ = true;
  children_.EndOverdue(now);
  sign_ins_.EndOverdue(now);
  sessions_.Expire(now);
  LookAtShares();
  if (now < next_sweep_) return;
  next_sweep_ = now + kSweepEvery;
  SweepPrivateTmp();
}

void Host::LookAtShares() {
  auto newest = ShareTable::Current();
  if (newest == shares_) return;
  shares_ = std::move(newest);
  children_.Renew();
}

void Host::TakeSignals() {
  while (const int signal = NextSignal(signals_)) {
    if (signal == SIGCHLD) ReapAll();
    if (signal == SIGHUP) LookAtShares();
    if (signal != SIGTERM || end_) continue;
    end_ = Now() + kGrace;
    children_.Renew();
    ReapAll();
  }
}

void Host::ReapAll() {
  int status = 0;
  pid_t pid;
  while ((pid = waitpid(-1, &status, WNOHANG | WUNTRACED)) > 0) {
    if (WIFSTOPPED(status)) {
      children_.EndStopped(pid);
      continue;
    }
    if (auto outcome = sign_ins_.Reaped(pid)) FinishSignIn(std::move(*outcome));
    End(children_.Reaped(pid, status, Now()));
  }
  // When ending: nothing is left, also none of the children's own children.
  if (end_ && pid < 0) over_ = true;
}

void Host::End(const std::optional<Children::Finished>& request) {
  if (!request) return;
  if (Session* session = sessions_.Find(request->session_id)) --session->running;
  if (request->session_over) sessions_.End(request->session_id);
}

void Host::TakeAsks() {
  for (;;) {
    switch (ReceivePacket(control_.Get(), packet_, Wait::kNo)) {
      case ReceiveResult::kNothing:
        return;
      case ReceiveResult::kEnd:
        over_ = true;
        return;
      case ReceiveResult::kPacket:
        break;
    }
    auto ask = UnpackAsk(packet_.View());
    packet_.Wipe();
    if (!ask || !packet_.passed) {
      errno = 0;
      MARU_LOG("The front sent a malformed packet");
      continue;
    }
    try {
      Take(std::move(*ask), std::move(packet_.passed));
    } catch (const std::exception& exception) {
      MARU_LOG("Failed to take a request: %s", exception.what());
    }
  }
}

void Host::Take(Ask ask, UniqueFd request) {
  if (end_) return Reply(request, Refusal(503));
  if (ask.kind == AskKind::kStatus) return Reply(request, Status());
  if (ask.kind == AskKind::kSignIn) return TakeSignIn(ask, std::move(request));
  const auto claims = seal_.Open(ask.token);
  Session* session = claims ? sessions_.Use(*claims, Now()) : nullptr;
  if (!session) return Reply(request, Refusal(401));
  if (ask.kind != AskKind::kSignOut) return TakeCall(ask, *session, std::move(request));
  sessions_.End(claims->session_id);
  Answer answer = Success(Json::Value());
  answer.cookie = "";
  Reply(request, answer);
}

void Host::TakeCall(const Ask& ask, Session& session, UniqueFd request) {
  if (session.running >= kMaxPerSession) return Reply(request, Refusal(429));
  const Seconds now = Now();
  const Task task{ask.kind,      ask.name,    ask.body_size,
                  session.id,    session.uid, session.user,
                  session.stamp, ask.source,  now - session.admitted >= kAdmittedFor};
  if (!children_.Hand(task, request, now)) return Reply(request, Refusal(503));
  ++session.running;
  if (task.ask_pam) session.admitted = now;
}

void Host::TakeSignIn(Ask& ask, UniqueFd request) {
  if (!limits_.Admit(ask.user, ask.source, Now())) {
    errno = 0;
    MARU_LOG("Too many failed attempts to sign in from %s", ask.source.c_str());
    Reply(request, Refusal(429));
  } else if (!sign_ins_.Begin(ask, request, Now())) {
    limits_.Succeeded(ask.user, ask.source);
    Reply(request, Refusal(503));
  }
  sodium_memzero(ask.password.data(), ask.password.size());
}

void Host::FinishSignIn(SignIns::Outcome outcome) {
  if (!outcome.user) {
    errno = 0;
    MARU_LOG("An attempt to sign in from %s failed", outcome.source.c_str());
    return Reply(outcome.request, Refusal(401));
  }
  limits_.Succeeded(outcome.name, outcome.source);
  const User& user = *outcome.user;
  const Session& session = sessions_.Begin(user, Now());
  Json::Value data = Description(user);
  data["token"] = seal_.Seal({session.id, session.user, session.uid, session.expires});
  Answer answer = Success(data);
  answer.cookie = data["token"].asString();
  Reply(outcome.request, answer);
}

Answer Host::Status() const {
  Json::Value numbers;
  numbers["children_busy"] = Json::UInt64{children_.AtWork()};
  numbers["children_idle"] = Json::UInt64{children_.Idle()};
  numbers["children_forked"] = Json::UInt64{children_.Forked()};
  numbers["sign_ins"] = Json::UInt64{sign_ins_.Count()};
  numbers["sessions"] = Json::UInt64{sessions_.Count()};
  return Success(numbers);
}

}  // namespace

int RunHost(const Config& config, UniqueFd control, UniqueFd lifeline) {
  try {
    prctl(PR_SET_NAME, "maruweb-host");
    // Before /tmp is hidden: a plug-in being tried may lie there.
    const Plugin plugin(config.plugin);
    MakePrivateMounts();
    umask(077);
    KeepHostCapabilities();
    // Loads the name service's modules once, for all children.
    FindUser("root");
    return Host(config, plugin, std::move(control), std::move(lifeline)).Run();
  } catch (const std::exception& exception) {
    MARU_LOG("The host cannot go on: %s", exception.what());
    return 1;
  }
}

}  // namespace maru::server
