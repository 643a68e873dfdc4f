#include "system/daemon_connection.h"

#include <errno.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

#include <atomic>
#include <thread>

#include "tests/support/support.h"

namespace {

using marudaemon::DomainSockConnection;

class Connection : public testing::Test {
 protected:
  void SetUp() override { Listen(16); }
  void TearDown() override {
    if (peer_.joinable()) peer_.join();
    close(listener_);
  }
  void Listen(int queue) {
    sockaddr_un address{AF_UNIX, {}};
    path_.copy(address.sun_path, sizeof(address.sun_path) - 1);
    unlink(path_.c_str());
    if (listener_ >= 0) close(listener_);
    listener_ = socket(AF_UNIX, SOCK_STREAM, 0);
    ASSERT_EQ(bind(listener_, reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
    ASSERT_EQ(listen(listener_, queue), 0);
  }
  /// What a peer does with its one connection, which is closed afterwards.
  void Peer(std::function<void(int)> work) {
    peer_ = std::thread([this, work = std::move(work)] {
      const int client = accept(listener_, nullptr, nullptr);
      work(client);
      close(client);
    });
  }
  static void Say(int client, const std::string& bytes) {
    for (std::size_t sent = 0; sent < bytes.size();) {
      const ssize_t count = send(client, bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL);
      if (count < 0) return;
      sent += static_cast<std::size_t>(count);
    }
  }
  static std::string ReadAll(int client) {
    std::string text;
    char buffer[4096];
    for (ssize_t count; (count = read(client, buffer, sizeof(buffer))) > 0;) {
      text.append(buffer, static_cast<std::size_t>(count));
    }
    return text;
  }

  TempFolder folder_;
  std::string path_ = folder_ / "socket";
  int listener_ = -1;
  std::thread peer_;
};

TEST_F(Connection, CarriesMessagesHoweverTheyAreCut) {
  const std::string large(3 << 20, 'x');
  Peer([&](int client) {
    for (const char c : std::string("{\"a\":1}\n")) Say(client, {c});
    Say(client, "two\nthree\n\nfi");
    Say(client, "ve\n" + large + "\n");
  });
  DomainSockConnection connection(path_);
  ASSERT_TRUE(connection.Connect());
  std::string message;
  for (const std::string& expected :
       {std::string("{\"a\":1}"), std::string("two"), std::string("three"), std::string(),
        std::string("five"), large}) {
    ASSERT_TRUE(connection.Recv(message));
    EXPECT_EQ(message, expected);
  }
  errno = 5;
  EXPECT_FALSE(connection.Recv(message));
  EXPECT_EQ(errno, 0);  // an end between messages
}

TEST_F(Connection, SendsWholeMessagesToSlowReaders) {
  std::string received;
  Peer([&](int client) {
    usleep(20'000);
    received = ReadAll(client);
  });
  DomainSockConnection connection(path_);
  ASSERT_TRUE(connection.Connect());
  const std::string large(5 << 20, 'y');
  EXPECT_TRUE(connection.Send(large));
  EXPECT_TRUE(connection.Send("b"));
  EXPECT_FALSE(connection.Send("a\nb"));
  EXPECT_EQ(errno, EINVAL);
  EXPECT_FALSE(connection.Send(std::string(DomainSockConnection::kMaxMessage + 1, 'z')));
  EXPECT_EQ(errno, EMSGSIZE);
  connection.Disconnect();
  peer_.join();
  EXPECT_TRUE(received == large + "\nb\n");
}

TEST_F(Connection, TellsACutMessageFromAnEnd) {
  Peer([](int client) { Say(client, "{\"half"); });
  DomainSockConnection connection(path_);
  ASSERT_TRUE(connection.Connect());
  std::string message = "before";
  EXPECT_FALSE(connection.Recv(message));
  EXPECT_EQ(errno, EPROTO);
  EXPECT_EQ(message, "before");
}

TEST_F(Connection, RefusesAnEndlessMessage) {
  Peer([](int client) {
    const std::string chunk(1 << 20, 'x');
    for (int i = 0; i < 66; ++i) Say(client, chunk);
  });
  DomainSockConnection connection(path_);
  ASSERT_TRUE(connection.Connect());
  std::string message;
  EXPECT_FALSE(connection.Recv(message));
  EXPECT_EQ(errno, EMSGSIZE);
  connection.Disconnect();
}

TEST_F(Connection, SurvivesAPeerThatIsGone) {
  Peer([](int) {});
  DomainSockConnection connection(path_);
  ASSERT_TRUE(connection.Connect());
  peer_.join();
  EXPECT_FALSE(connection.Send("x"));
  EXPECT_EQ(errno, EPIPE);
  connection.Disconnect();
  EXPECT_FALSE(connection.Send("x"));
  EXPECT_EQ(errno, ENOTCONN);
  DomainSockConnection nowhere(folder_ / "none");
  EXPECT_FALSE(nowhere.Connect());
  EXPECT_EQ(errno, ENOENT);
  DomainSockConnection far(std::string(200, 'a'));
  EXPECT_FALSE(far.Connect());
  EXPECT_EQ(errno, ENAMETOOLONG);
}

TEST_F(Connection, WaitsForRoomInAFullQueue) {
  Listen(0);
  DomainSockConnection first(path_);
  ASSERT_TRUE(first.Connect());  // fills it
  std::atomic<bool> accepted = false;
  peer_ = std::thread([&] {
    usleep(50'000);
    accepted = true;
    close(accept(listener_, nullptr, nullptr));
  });
  DomainSockConnection second(path_);
  EXPECT_TRUE(second.Connect());
  EXPECT_TRUE(accepted);
}

TEST_F(Connection, GoesOnAfterSignals) {
  struct sigaction action {};
  action.sa_handler = [](int) {};
  sigaction(SIGALRM, &action, nullptr);
  const itimerval often{{0, 1'000}, {0, 1'000}};
  Peer([](int client) {
    usleep(30'000);
    Say(client, "late\n");
  });
  setitimer(ITIMER_REAL, &often, nullptr);
  errno = 0;
  DomainSockConnection connection(path_);
  std::string message;
  EXPECT_TRUE(connection.Connect() && connection.Send(std::string(1 << 16, 'x')) &&
              connection.Recv(message));
  EXPECT_EQ(errno, 0);  // else the next log line would name it
  const itimerval never{};
  setitimer(ITIMER_REAL, &never, nullptr);
  signal(SIGALRM, SIG_DFL);
  EXPECT_EQ(message, "late");
}

}  // namespace
