#include "daemon/socket/server.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <exception>
#include <optional>

#include "common/error.h"
#include "daemon/socket/peer_credentials.h"
#include "system/json.h"
#include "system/log.h"
#include "system/throw_errno.h"

namespace maru::daemon {
namespace {

/// A reply may hold this much; a message less.
constexpr std::size_t kMaxReply = 64u << 20;
constexpr int kSweepMilliseconds = 500;
/// New connections taken before others have their turn.
constexpr int kAcceptsAtOnce = 64;
/// A connection that has been silent for less is left alone when others need its place.
constexpr std::chrono::milliseconds kSilence{250};

/// A request may ask whether it is still wanted far more often than the kernel need be.
constexpr std::chrono::milliseconds kBetweenLooks{1};

// A connection is read until it has a line, belongs to a worker until that line is carried out, and
// is written until the reply is out; then it is read again. The loop waits for one event of it at a
// time (EPOLLONESHOT), and for none while it works: no event finds it in a worker's hands, and what
// a worker did it reports through `finished_`.

std::string LineOf(const Json::Value& message) {
  return json::ToString(message) + "\n";
}

/// Does something for one connection; false when that failed.
template <class Work>
bool Unharmed(Work work) {
  try {
    work();
    return true;
  } catch (const std::exception& error) {
    MARU_LOG("Connection failed: %s", error.what());
    return false;
  }
}

}  // namespace

Server::Server(Core& core, int listening, uid_t service, const Limits& limits)
    : core_(core),
      listening_(listening),
      service_(service),
      limits_(limits),
      poll_(epoll_create1(EPOLL_CLOEXEC)),
      wake_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  CheckErrno(poll_ && wake_ && Watch(listening_, EPOLLIN, EPOLL_CTL_ADD) &&
                 Watch(wake_.Get(), EPOLLIN, EPOLL_CTL_ADD),
             "Cannot wait for connections");
  for (auto* list : {&finished_, &taken_}) list->reserve(limits.connections + limits.reserved);
  core_.server_status = [this](Json::Value& status) { AddStatus(status); };
  const unsigned threads =
      limits.workers ? limits.workers : std::max(4u, 2 * std::thread::hardware_concurrency());
  workers_ = std::make_unique<Workers>(threads);
}

Server::~Server() {
  stopped_ = true;
  workers_.reset();
  core_.server_status = nullptr;
}

void Server::Stop() {
  stopped_ = true;
  Wake();
}

void Server::Wake() {
  const std::uint64_t one = 1;
  [[maybe_unused]] const ssize_t written = write(wake_.Get(), &one, sizeof one);
}

bool Server::Watch(int descriptor, unsigned events, int operation) {
  epoll_event event{};
  event.events = events;
  event.data.fd = descriptor;
  return epoll_ctl(poll_.Get(), operation, descriptor, &event) == 0;
}

/// Until it can be read or written once.
void Server::Await(Connection& connection, Connection::State state) {
  connection.state = state;
  const unsigned events = state == Connection::State::kReading ? EPOLLIN : EPOLLOUT;
  if (!Watch(connection.Socket(), events | EPOLLONESHOT, EPOLL_CTL_MOD)) Close(connection);
}

void Server::Run() {
  epoll_event events[64];
  auto swept = Clock::now();
  while (!stopped_) {
    const int timeout = connections_.empty() && accepting_ ? -1 : kSweepMilliseconds;
    const int count = epoll_wait(poll_.Get(), events, std::size(events), timeout);
    CheckErrno(count >= 0 || errno == EINTR, "Cannot wait for connections");
    for (int i = 0; i < count; ++i) OnEvent(events[i].data.fd);
    if (Clock::now() - swept >= std::chrono::milliseconds(kSweepMilliseconds)) {
      Sweep();
      swept = Clock::now();
    }
  }
}

void Server::OnEvent(int descriptor) {
  if (descriptor == listening_) {
    Unharmed([this] { Accept(); });
  } else if (descriptor == wake_.Get()) {
    TakeFinished();
  } else if (const auto found = connections_.find(descriptor); found != connections_.end()) {
    if (found->second->state != Connection::State::kWorking) Attend(*found->second);
  }
}

/// After an event of a connection, or when its request is carried out.
void Server::Attend(Connection& connection) {
  const bool unharmed = Unharmed([&] {
    if (connection.state != Connection::State::kReading) return Deliver(connection);
    if (!connection.Receive()) return Close(connection);
    Proceed(connection);
  });
  if (!unharmed) Close(connection);
}

void Server::Accept() {
  for (int i = 0; i < kAcceptsAtOnce; ++i) {
    UniqueFd socket(accept4(listening_, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
    if (!socket) {
      if (errno == EAGAIN || errno == EINTR || errno == ECONNABORTED) return;
      // No descriptors or memory: try again at the next sweep.
      MARU_LOG("Failed [accept4]");
      Watch(listening_, 0, EPOLL_CTL_MOD);
      accepting_ = false;
      return;
    }
    std::optional<Identity> caller = IdentityOfPeer(socket.Get(), service_);
    if (!caller || !HearSenders(socket.Get())) continue;
    if (!MakeRoom(*caller)) {
      const std::string refusal =
          LineOf(ErrorReply(maruseeker::kErrorDaemonExchange, "Too many connections"));
      send(socket.Get(), refusal.data(), refusal.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
      continue;
    }
    const int descriptor = socket.Get();
    if (!Watch(descriptor, EPOLLIN | EPOLLONESHOT, EPOLL_CTL_ADD)) continue;
    connections_[descriptor] = std::make_unique<Connection>(std::move(socket), std::move(*caller));
    open_ = connections_.size();
  }
}

bool Server::MakeRoom(const Identity& caller) {
  if (!caller.unrestricted) {
    const auto mine = std::count_if(connections_.begin(), connections_.end(), [&](const auto& row) {
      return row.second->Caller().uid == caller.uid;
    });
    if (static_cast<std::size_t>(mine) >= limits_.per_user && !EvictSilent(&caller)) return false;
  }
  const std::size_t most = limits_.connections + (caller.unrestricted ? limits_.reserved : 0);
  return connections_.size() < most || EvictSilent(nullptr);
}

/// Closes the connection (of `only`, or of anybody) that has said nothing for longest.
bool Server::EvictSilent(const Identity* only) {
  Connection* longest = nullptr;
  const auto latest = Clock::now() - kSilence;
  for (const auto& [descriptor, connection] : connections_) {
    if (connection->state != Connection::State::kReading || connection->since > latest) continue;
    if (only && connection->Caller().uid != only->uid) continue;
    if (connection->HasInput()) continue;
    if (!longest || connection->since < longest->since) longest = connection.get();
  }
  if (longest) Close(*longest);
  return longest != nullptr;
}

void Server::Close(Connection& connection) {
  connections_.erase(connection.Socket());
  open_ = connections_.size();
}

void Server::Proceed(Connection& connection) {
  std::string line;
  switch (connection.Take(line)) {
    case Connection::Input::kLine:
      return Start(connection, std::move(line));
    case Connection::Input::kTooLong:
      return Refuse(connection, "The request is longer than " +
                                    std::to_string(Connection::kMaxRequest) + " bytes");
    case Connection::Input::kUnframed:
      return Refuse(connection, "The request does not end with a line break");
    case Connection::Input::kEnd:
      return Close(connection);
    case Connection::Input::kNone:
      return Await(connection, Connection::State::kReading);
  }
}

void Server::Start(Connection& connection, std::string line) {
  workers_->Add(connection.Caller().uid, [this, &connection, line = std::move(line)] {
    Execute(connection, line);
    {
      const std::lock_guard lock(finished_mutex_);
      finished_.push_back(&connection);
    }
    Wake();
  });
  connection.state = Connection::State::kWorking;
}

/// In a worker. What cannot be sent at once is left to the loop.
void Server::Execute(Connection& connection, const std::string& line) noexcept {
  const auto deadline = Clock::now() + limits_.answer;
  auto next_look = Clock::time_point::min();
  const CancelCheck cancelled = [&] {
    const auto now = Clock::now();
    if (stopped_ || now > deadline) return true;
    if (now < next_look) return false;
    next_look = now + kBetweenLooks;
    return connection.HasHungUp();
  };
  if (cancelled()) return;
  ++carried_;
  std::string reply;
  const Output output = [&](std::string_view message, bool last) {
    if (reply.size() > kMaxReply && !last) {
      throw maruseeker::Error(maruseeker::kErrorBadParameter,
                              "The page is too large; ask for a smaller one");
    }
    reply.append(message).append(1, '\n');
  };
  try {
    Answer(core_, {connection.Caller(), connection.Client()}, line, output, cancelled);
    connection.SetReply(std::move(reply));
    connection.Flush();
  } catch (const std::exception& error) {
    MARU_LOG("Request failed: %s", error.what());
    connection.last = true;
  }
}

void Server::TakeFinished() {
  std::uint64_t count;
  [[maybe_unused]] const ssize_t taken = read(wake_.Get(), &count, sizeof count);
  {
    const std::lock_guard lock(finished_mutex_);
    taken_.swap(finished_);
  }
  for (Connection* connection : taken_) Attend(*connection);
  taken_.clear();
}

void Server::Refuse(Connection& connection, const std::string& why) {
  connection.last = true;
  connection.SetReply(LineOf(ErrorReply(maruseeker::kErrorBadParameter, why)));
  Deliver(connection);
}

/// Sends on; with all sent, the connection goes on or ends.
void Server::Deliver(Connection& connection) {
  if (!connection.Flush()) return Close(connection);
  if (connection.AllSent()) {
    if (connection.last) return Close(connection);
    connection.since = Clock::now();
    return Proceed(connection);
  }
  if (connection.state != Connection::State::kWriting) {
    connection.state = Connection::State::kWriting;
    connection.since = Clock::now();
    if (UnreadOf(connection.Caller().uid) > limits_.unread) {
      MARU_LOG("User %u leaves too many answers unread", connection.Caller().uid);
      return Close(connection);
    }
  }
  Await(connection, Connection::State::kWriting);
}

std::size_t Server::UnreadOf(uid_t user) const {
  std::size_t bytes = 0;
  for (const auto& [descriptor, connection] : connections_) {
    if (connection->state == Connection::State::kWriting && connection->Caller().uid == user) {
      bytes += connection->Unsent();
    }
  }
  return bytes;
}

bool Server::IsOverdue(const Connection& connection) const {
  if (connection.state == Connection::State::kWorking) return false;
  const bool reading = connection.state == Connection::State::kReading;
  const auto limit = !reading                  ? limits_.send
                     : connection.WithinLine() ? limits_.line
                                               : limits_.idle;
  return Clock::now() - connection.since > limit;
}

void Server::Sweep() {
  for (auto row = connections_.begin(); row != connections_.end();) {
    Connection& connection = *(row++)->second;
    if (IsOverdue(connection)) Close(connection);
  }
  if (!accepting_) accepting_ = Watch(listening_, EPOLLIN, EPOLL_CTL_MOD);
}

void Server::AddStatus(Json::Value& status) const {
  status["connections"] = Json::UInt64{open_};
  status["requests"] = Json::UInt64{carried_};
  status["waiting_requests"] = Json::UInt64{workers_->Waiting()};
  status["workers"] = Json::UInt64{workers_->Threads()};
}

}  // namespace maru::daemon
