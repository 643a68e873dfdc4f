#include "daemon/socket/server.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>

#include <condition_variable>
#include <thread>

#include "daemon/socket/listener.h"
#include "system/unique_fd.h"
#include "tests/daemon/fixture.h"

namespace maru::daemon::test {
namespace {

/// A client at a terminal.
class Client {
 public:
  /// Connects; as `uid` when given, with only that thread's identity changed.
  explicit Client(const std::string& path, uid_t uid = 0)
      : socket_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    std::thread([&] {
      if (uid != 0) {
        ASSERT_EQ(syscall(SYS_setgroups, 0, nullptr), 0);
        ASSERT_EQ(syscall(SYS_setresgid, uid, uid, uid), 0);
        ASSERT_EQ(syscall(SYS_setresuid, uid, uid, uid), 0);
      }
      sockaddr_un address{};
      address.sun_family = AF_UNIX;
      strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
      connected_ =
          connect(socket_.Get(), reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
    }).join();
  }

  bool Connected() const { return connected_; }

  /// As much of it as the server takes.
  void Send(const std::string& bytes) {
    for (std::size_t sent = 0; sent < bytes.size();) {
      const ssize_t count =
          send(socket_.Get(), bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL);
      if (count <= 0) return;
      sent += static_cast<std::size_t>(count);
    }
  }
  void NoMore() { shutdown(socket_.Get(), SHUT_WR); }
  void HangUp() { socket_ = UniqueFd(); }

  /// The next message; null at the end of the stream.
  Json::Value Receive() {
    std::size_t end;
    while ((end = received_.find('\n')) == std::string::npos) {
      char bytes[65536];
      const ssize_t count = recv(socket_.Get(), bytes, sizeof bytes, 0);
      if (count <= 0) return {};
      received_.append(bytes, static_cast<std::size_t>(count));
    }
    Json::Value message;
    EXPECT_TRUE(json::FromString(received_.substr(0, end), message));
    received_.erase(0, end + 1);
    return message;
  }
  Json::Value Ask(const std::string& line) {
    Send(line + "\n");
    return Receive();
  }

 private:
  UniqueFd socket_;
  bool connected_ = false;
  std::string received_;
};

/// Indices that take a search until it is cancelled, or they are released, to open; there is
/// nothing in them.
class SlowIndices : public Indices {
 public:
  struct Gate {
    std::mutex mutex;
    std::condition_variable changed;
    int running = 0;
    int cancelled = 0;
    bool released = false;

    void Wait(int& number, int wanted) {
      std::unique_lock lock(mutex);
      changed.wait(lock, [&] { return number >= wanted; });
    }
  };

  std::unique_ptr<index::View> Open(const std::vector<index::IndexFor>&,
                                    index::IsCancelled cancelled) override {
    if (cancelled) WaitForRelease(cancelled);
    return nothing_.Open(std::vector<index::IndexFor>{});
  }
  bool Has(const std::string&) const override { return true; }
  std::vector<std::string> Ids() const override { return {"fileindex_photo"}; }

  Gate gate;

 private:
  void WaitForRelease(const index::IsCancelled& cancelled) {
    std::unique_lock lock(gate.mutex);
    ++gate.running;
    gate.changed.notify_all();
    while (!gate.released) {
      gate.changed.wait_for(lock, std::chrono::milliseconds(5));
      if (!cancelled()) continue;
      ++gate.cancelled;
      gate.changed.notify_all();
      throw index::Cancelled();
    }
  }

  index::Library nothing_{"/nonexistent"};
};

class ServerTest : public DaemonTest {
 protected:
  ~ServerTest() override { End(); }

  void Start(Core& core, const Server::Limits& limits = {}) {
    listener_ = std::make_unique<Listener>(Path(), Identity{});
    server_ = std::make_unique<Server>(core, listener_->Socket(), kService, limits);
    thread_ = std::thread([this] { server_->Run(); });
  }
  void End() {
    if (!server_) return;
    server_->Stop();
    thread_.join();
    server_.reset();
    listener_.reset();
  }

  std::string Path() const { return root_ + "/socket"; }

  static constexpr uid_t kService = 4'000'000'000;
  static constexpr const char* kStatus = R"({"command": "status"})";
  static constexpr const char* kSearch =
      R"({"command": "search", "data": {"pre_query": {"keyword": "word"}}})";

  std::unique_ptr<Listener> listener_;
  std::unique_ptr<Server> server_;
  std::thread thread_;
  SlowIndices slow_;
  Core slow_core_{.indices = slow_, .usage = usage_, .shares = [this] { return table_; }};
};

TEST_F(ServerTest, FramesLinesHoweverTheyArrive) {
  Start(core_);
  Client client(Path());
  for (const char c : std::string(kStatus) + "\n") client.Send({c});
  EXPECT_TRUE(client.Receive()["success"].asBool());
  client.Send(std::string(kStatus) + "\n\r\n  \nnonsense\n" + kStatus + "\r\n");
  EXPECT_TRUE(client.Receive()["success"].asBool());
  EXPECT_EQ(client.Receive()["error"]["code"].asInt(), 120);
  EXPECT_TRUE(client.Receive()["success"].asBool());
  client.Send(std::string(3u << 20, '\n') + kStatus + "\n");
  client.NoMore();
  EXPECT_TRUE(client.Receive()["success"].asBool()) << "one who has said all still gets the answer";
  EXPECT_TRUE(client.Receive().isNull());
}

TEST_F(ServerTest, RefusesWhatIsTooLongOrNotFramed) {
  Start(core_);
  for (const std::size_t size : {Connection::kMaxRequest + 1, std::size_t{8} << 20}) {
    Client client(Path());
    client.Send("{\"command\": \"" + std::string(size, 'x') + "\"}\n");
    EXPECT_EQ(client.Receive()["error"]["code"].asInt(), 120);
    EXPECT_TRUE(client.Receive().isNull());
  }
  Client endless(Path());
  const std::string chunk(1u << 20, 'x');
  for (int i = 0; i < 66; ++i) endless.Send(chunk);
  EXPECT_EQ(endless.Receive()["error"]["code"].asInt(), 120);
  Client unframed(Path());
  unframed.Send(kStatus);
  unframed.NoMore();
  EXPECT_EQ(unframed.Receive()["error"]["code"].asInt(), 120);
  EXPECT_TRUE(unframed.Receive().isNull());
  EXPECT_TRUE(Client(Path()).Ask(kStatus)["success"].asBool());
}

TEST_F(ServerTest, StalledClientsCostNothing) {
  File("photo/a.txt", "word");
  Index();
  Start(core_);
  std::vector<std::unique_ptr<Client>> stalled;
  for (int i = 0; i < 200; ++i) {
    stalled.push_back(std::make_unique<Client>(Path(), i < 100 ? bin_.uid : 0));
    stalled.back()->Send(i % 2 ? "{\"command\": " : "");
  }
  for (int i = 0; i < 20; ++i) {
    Client client(Path(), bin_.uid);
    EXPECT_EQ(client.Ask(kSearch)["total"].asInt(), 1);
  }
  EXPECT_EQ(Client(Path()).Ask(kStatus)["data"]["connections"].asUInt() >= 200, true);
  stalled[1]->Send("\"status\"}\n");
  EXPECT_TRUE(stalled[1]->Receive()["success"].asBool());
}

TEST_F(ServerTest, ASlowReaderHoldsNoWorkerAndGetsAll) {
  for (int i = 0; i < 1200; ++i) {
    File("photo/" + std::string(150, 'n') + std::to_string(i), "word");
  }
  Index();
  Start(core_, {.workers = 2});
  const std::string page = R"({"command": "search", "data": {"pre_query": {"keyword": "word"},
    "size": 1200, "fields": ["MARUMDPath", "MARUMDFSName"]}})";
  std::string line = page;
  std::erase(line, '\n');
  std::vector<std::unique_ptr<Client>> slow;
  for (int i = 0; i < 4; ++i) {
    slow.push_back(std::make_unique<Client>(Path(), bin_.uid));
    slow.back()->Send(line + "\n");
  }
  for (int i = 0; i < 5; ++i) {
    EXPECT_TRUE(Client(Path(), games_.uid).Ask(kStatus)["success"].asBool());
  }
  for (auto& client : slow) {
    EXPECT_EQ(client->Receive()["total"].asInt(), 1200);
    for (int i = 0; i < 1200; ++i) ASSERT_TRUE(client->Receive().isMember("MARUMDPath"));
    EXPECT_TRUE(client->Receive()["success"].asBool());
  }
}

TEST_F(ServerTest, TheCallerIsWhomTheKernelSays) {
  File("photo/all.txt", "word");
  File("photo/bins.txt", "word", 0600, bin_.uid);
  File("photo/games.txt", "word", 0600, games_.uid);
  Index();
  Start(core_);
  EXPECT_EQ(Client(Path()).Ask(kSearch)["total"].asInt(), 3);
  EXPECT_EQ(Client(Path(), kService).Ask(kSearch)["total"].asInt(), 3);
  EXPECT_EQ(Client(Path(), bin_.uid).Ask(kSearch)["total"].asInt(), 2);
  const std::string named = R"({"command": "search", "data": {"pre_query": {"keyword": "word"},
    "filters": [{"name": "permission", "data": "games"}]}})";
  std::string line = named;
  std::erase(line, '\n');
  EXPECT_EQ(Client(Path(), bin_.uid).Ask(line)["total"].asInt(), 0);
  EXPECT_EQ(Client(Path(), games_.uid).Ask(line)["total"].asInt(), 2);
}

TEST_F(ServerTest, AHangUpEndsTheQuery) {
  Start(slow_core_);
  Client client(Path(), bin_.uid);
  client.Send(std::string(kSearch) + "\n");
  slow_.gate.Wait(slow_.gate.running, 1);
  client.HangUp();
  slow_.gate.Wait(slow_.gate.cancelled, 1);
  EXPECT_TRUE(Client(Path()).Ask(kStatus)["success"].asBool());
}

TEST_F(ServerTest, NoUserHoldsAllWorkersOrConnections) {
  Start(slow_core_, {.per_user = 4, .workers = 3});
  std::vector<std::unique_ptr<Client>> greedy;
  for (int i = 0; i < 4; ++i) {
    greedy.push_back(std::make_unique<Client>(Path(), bin_.uid));
    greedy.back()->Send(std::string(kSearch) + "\n");
  }
  slow_.gate.Wait(slow_.gate.running, 2);
  EXPECT_TRUE(Client(Path(), games_.uid).Ask(kStatus)["success"].asBool());
  Client fifth(Path(), bin_.uid);
  EXPECT_EQ(fifth.Receive()["error"]["msg"], "Too many connections");
  {
    const std::lock_guard lock(slow_.gate.mutex);
    slow_.gate.released = true;
  }
  for (auto& client : greedy) EXPECT_TRUE(client->Receive().isMember("total"));
}

TEST_F(ServerTest, AnAnswerHasItsTimeAndAStopGivesUp) {
  Start(slow_core_, {.answer = std::chrono::milliseconds(1)});
  EXPECT_EQ(Client(Path()).Ask(kSearch)["error"]["code"].asInt(), 121);
  End();
  Start(slow_core_);
  Client client(Path());
  client.Send(std::string(kSearch) + "\n");
  slow_.gate.Wait(slow_.gate.running, 2);
  End();
  EXPECT_FALSE(Client(Path()).Connected());
  EXPECT_NE(access(Path().c_str(), F_OK), 0);
}

TEST_F(ServerTest, TheSocketIsReplacedSafely) {
  const auto listen = [&](const Identity& owner = {}) {
    return std::make_unique<Listener>(Path(), owner);
  };
  auto live = listen();
  struct stat status {};
  ASSERT_EQ(lstat(Path().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0777, 0666u);
  EXPECT_THROW(listen(), std::runtime_error) << "somebody listens";
  // What a killed daemon leaves: a socket that nobody serves.
  std::filesystem::rename(Path(), root_ + "/kept");
  live.reset();
  std::filesystem::rename(root_ + "/kept", Path());
  live = listen();
  EXPECT_TRUE(Client(Path()).Connected());
  live.reset();
  EXPECT_NE(lstat(Path().c_str(), &status), 0);
  std::ofstream(Path()) << "a file";
  EXPECT_THROW(listen(), std::runtime_error);
  std::filesystem::remove(Path());
  // An account that cannot write in the folder gets a folder of its own beside the socket.
  live = listen(bin_);
  EXPECT_TRUE(std::filesystem::is_symlink(Path()));
  EXPECT_TRUE(Client(Path(), games_.uid).Connected());
  ASSERT_EQ(stat((root_ + "/maruelasticd").c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, bin_.uid);
  live.reset();
  EXPECT_NE(access(Path().c_str(), F_OK), 0);
  live = listen(bin_);
  EXPECT_TRUE(Client(Path()).Connected()) << "over the link that was left";
}

}  // namespace
}  // namespace maru::daemon::test
