#pragma once

#include <atomic>
#include <chrono>
#include <map>
#include <memory>
#include <mutex>
#include <vector>

#include "daemon/core/core.h"
#include "daemon/socket/connection.h"
#include "daemon/socket/workers.h"

namespace maru::daemon {

/// One thread waits on all connections, a few workers carry out requests. A connection has one
/// request under way at a time; its reply is written as far as the client takes it and the loop
/// writes the rest, so neither silent clients nor slow ones hold a worker.
class Server {
 public:
  struct Limits {
    /// Connections of all callers, what root and the service have besides, and those of one other
    /// user. Where a bound is met, the connection it counts that has been silent longest gives way.
    std::size_t connections = 512;
    std::size_t reserved = 64;
    std::size_t per_user = 128;
    /// Answers that one user leaves unread, in bytes.
    std::size_t unread = 64u << 20;
    /// Between requests; for a line to come in whole; for a client to take its answer; for an
    /// answer to be found.
    std::chrono::milliseconds idle{300'000};
    std::chrono::milliseconds line{30'000};
    std::chrono::milliseconds send{60'000};
    std::chrono::milliseconds answer{30'000};
    /// 0: twice the processors, at least 4.
    unsigned workers = 0;
  };

  /// Borrows the core and the listening socket. `service` is unrestricted like root.
  Server(Core& core, int listening, uid_t service, const Limits& limits);
  ~Server();
  Server(const Server&) = delete;
  Server& operator=(const Server&) = delete;

  /// Serves until Stop. A fault on one connection ends that connection. Throws std::system_error
  /// when the kernel lets it wait no longer.
  void Run();
  /// From any thread or signal handler: Run returns soon, requests under way are given up.
  void Stop();

 private:
  using Clock = std::chrono::steady_clock;
  using Connections = std::map<int, std::unique_ptr<Connection>>;

  void Wake();
  /// False with errno.
  bool Watch(int descriptor, unsigned events, int operation);
  void Await(Connection& connection, Connection::State state);
  void Accept();
  bool MakeRoom(const Identity& caller);
  bool EvictSilent(const Identity* only);
  void OnEvent(int descriptor);
  void Attend(Connection& connection);
  void Close(Connection& connection);
  /// What comes next on a connection that has no request under way.
  void Proceed(Connection& connection);
  void Start(Connection& connection, std::string line);
  void Execute(Connection& connection, const std::string& line) noexcept;
  void Refuse(Connection& connection, const std::string& why);
  void Deliver(Connection& connection);
  void TakeFinished();
  bool IsOverdue(const Connection& connection) const;
  void Sweep();
  std::size_t UnreadOf(uid_t user) const;
  void AddStatus(Json::Value& status) const;

  Core& core_;
  const int listening_;
  const uid_t service_;
  const Limits limits_;
  UniqueFd poll_;
  UniqueFd wake_;
  std::atomic<bool> stopped_ = false;
  bool accepting_ = true;
  std::atomic<std::size_t> open_ = 0;
  std::atomic<std::uint64_t> carried_ = 0;
  Connections connections_;
  std::mutex finished_mutex_;
  /// Carried out, and of these what the loop has taken over. Both have room for all connections, so
  /// that reporting never fails.
  std::vector<Connection*> finished_, taken_;
  /// Last, so that its threads end before anything they use.
  std::unique_ptr<Workers> workers_;
};

}  // namespace maru::daemon
