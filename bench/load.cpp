// Sends requests over connections that stay open, to the web server or to the daemon's socket, and
// tells how long the answers took.
#include <arpa/inet.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

struct Options {
  std::uint16_t port = 0;
  std::string socket;  // the daemon's, in place of a port
  std::vector<std::string> requests;
  std::size_t connections = 1;
  std::size_t rounds = 1;
  std::string expected;  // stands in every answer that is as it should be
};

struct Totals {
  std::vector<double> times;
  std::size_t failed = 0;
  std::size_t bytes = 0;
  std::size_t hits = 0;
};

/// How long an HTTP answer is, which may not have come in whole; 0 as long as that is open.
std::size_t HttpLength(const std::string& answer) {
  const std::size_t head = answer.find("\r\n\r\n");
  if (head == std::string::npos) return 0;
  const std::size_t length = answer.find("Content-Length: ");
  if (length > head) throw std::runtime_error("an answer without a length");
  return head + 4 + std::strtoul(answer.c_str() + length + 16, nullptr, 10);
}

/// Whether the daemon's last message has come: the one that says whether it succeeded.
bool DaemonIsDone(const std::string& answer) {
  if (!answer.ends_with('\n')) return false;
  const std::size_t before = answer.rfind('\n', answer.size() - 2);
  return answer.find("\"success\"", before == std::string::npos ? 0 : before) != std::string::npos;
}

class Connection {
 public:
  explicit Connection(const Options& options)
      : is_http_(options.socket.empty()),
        socket_(socket(is_http_ ? AF_INET : AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    if (is_http_) {
      sockaddr_in address{};
      address.sin_family = AF_INET;
      address.sin_port = htons(options.port);
      address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
      const int on = 1;
      setsockopt(socket_, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
      Connect(address);
    } else {
      sockaddr_un address{};
      address.sun_family = AF_UNIX;
      options.socket.copy(address.sun_path, sizeof address.sun_path - 1);
      Connect(address);
    }
  }
  ~Connection() { close(socket_); }
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;

  /// The whole answer, of HTTP with its head.
  const std::string& Exchange(const std::string& request) {
    for (std::size_t sent = 0; sent < request.size();) {
      const ssize_t done =
          send(socket_, request.data() + sent, request.size() - sent, MSG_NOSIGNAL);
      if (done <= 0) throw std::runtime_error("cannot send");
      sent += static_cast<std::size_t>(done);
    }
    answer_.clear();
    std::size_t whole = 0;
    do {
      char buffer[65536];
      const ssize_t got = recv(socket_, buffer, sizeof buffer, 0);
      if (got <= 0) throw std::runtime_error("the server hung up");
      answer_.append(buffer, static_cast<std::size_t>(got));
      if (is_http_ && whole == 0) whole = HttpLength(answer_);
    } while (is_http_ ? whole == 0 || answer_.size() < whole : !DaemonIsDone(answer_));
    return answer_;
  }

 private:
  template <typename Address>
  void Connect(const Address& address) {
    if (connect(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
      throw std::runtime_error("cannot connect");
    }
  }

  bool is_http_;
  int socket_;
  std::string answer_;
};

/// A request over HTTP; one without a body is a GET.
std::string HttpRequest(const std::string& token, const std::string& path,
                        const std::string& body) {
  return (body.empty() ? "GET " : "POST ") + path +
         " HTTP/1.1\r\nHost: 127.0.0.1\r\nAuthorization: Bearer " + token +
         "\r\nContent-Type: application/json\r\nContent-Length: " + std::to_string(body.size()) +
         "\r\n\r\n" + body;
}

std::size_t HitsIn(const std::string& answer) {
  std::size_t hits = 0;
  const std::string_view mark = "\"MARUMDPath\"";
  for (std::size_t at = 0; (at = answer.find(mark, at)) != std::string::npos; at += mark.size()) {
    ++hits;
  }
  return hits;
}

void Run(const Options& options, std::size_t first, Totals& totals) {
  const std::vector<std::string>& requests = options.requests;
  Connection connection(options);
  for (std::size_t i = 0; i < options.rounds * requests.size(); ++i) {
    const auto start = Clock::now();
    const std::string& answer = connection.Exchange(requests[(first + i) % requests.size()]);
    totals.times.push_back(std::chrono::duration<double, std::micro>(Clock::now() - start).count());
    totals.bytes += answer.size();
    totals.hits += HitsIn(answer);
    if (answer.find(options.expected) == std::string::npos && totals.failed++ == 0) {
      std::cerr << "instead of " + options.expected + ": " + answer.substr(0, 600) + "\n";
    }
  }
}

int Measure(const Options& options) {
  std::vector<Totals> totals(options.connections);
  std::vector<std::thread> threads;
  const auto start = Clock::now();
  for (std::size_t i = 0; i < options.connections; ++i) {
    threads.emplace_back([&, i] {
      try {
        Run(options, i * 7, totals[i]);
      } catch (const std::exception& error) {
        std::cerr << error.what() << "\n";
        totals[i].failed += 1;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  const double seconds = std::chrono::duration<double>(Clock::now() - start).count();
  Totals all;
  for (const Totals& one : totals) {
    all.times.insert(all.times.end(), one.times.begin(), one.times.end());
    all.failed += one.failed;
    all.bytes += one.bytes;
    all.hits += one.hits;
  }
  if (all.times.empty()) return 1;
  std::sort(all.times.begin(), all.times.end());
  const auto at = [&](std::size_t percent) {
    return all.times[(all.times.size() - 1) * percent / 100];
  };
  std::cout << "{\"p50\": " << at(50) << ", \"p95\": " << at(95) << ", \"p99\": " << at(99)
            << ", \"per_second\": " << static_cast<double>(all.times.size()) / seconds
            << ", \"failed\": " << all.failed << ", \"bytes\": " << all.bytes
            << ", \"hits\": " << all.hits << "}\n";
  return 0;
}

}  // namespace

int main(int count, char** given) {
  const std::vector<std::string> words(given + 1, given + count);
  const bool is_http = words.size() == 7 && words[0] == "http";
  if (!is_http && !(words.size() == 5 && words[0] == "daemon")) {
    std::cerr << "Usage: maru-bench-load http PORT TOKEN PATH CONNECTIONS ROUNDS EXPECTED\n"
                 "       maru-bench-load daemon SOCKET CONNECTIONS ROUNDS EXPECTED\n"
                 "Sends each line that it reads (an empty one: a GET) ROUNDS times on each "
                 "connection, counts answers\nwithout the text EXPECTED as failed, and prints one "
                 "JSON object; times in microseconds.\n";
    return 2;
  }
  Options options;
  for (std::string line; std::getline(std::cin, line);) {
    options.requests.push_back(is_http ? HttpRequest(words[2], words[3], line) : line + "\n");
  }
  const auto number = [&](std::size_t from_end) {
    return std::strtoul(words[words.size() - from_end].c_str(), nullptr, 10);
  };
  if (is_http) {
    options.port = static_cast<std::uint16_t>(number(6));
  } else {
    options.socket = words[1];
  }
  options.connections = number(3);
  options.rounds = number(2);
  options.expected = words.back();
  return options.requests.empty() ? 2 : Measure(options);
}
