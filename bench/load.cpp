// Sends HTTP requests over connections that stay open, and tells how long the answers took.
#include <arpa/inet.h>
#include <netinet/tcp.h>
#include <sys/socket.h>
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
  std::string token;
  std::string path;
  std::vector<std::string> bodies;
  std::size_t connections = 1;
  std::size_t rounds = 1;
};

struct Totals {
  std::vector<double> times;
  std::size_t failed = 0;
  std::size_t bytes = 0;
  std::size_t hits = 0;
};

class Connection {
 public:
  explicit Connection(std::uint16_t port)
      : socket_(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const int on = 1;
    setsockopt(socket_, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
    if (connect(socket_, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
      throw std::runtime_error("cannot connect");
    }
  }
  ~Connection() { close(socket_); }
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;

  /// The answer's head and body.
  const std::string& Exchange(const std::string& request) {
    for (std::size_t sent = 0; sent < request.size();) {
      const ssize_t done =
          send(socket_, request.data() + sent, request.size() - sent, MSG_NOSIGNAL);
      if (done <= 0) throw std::runtime_error("cannot send");
      sent += static_cast<std::size_t>(done);
    }
    answer_.clear();
    std::size_t whole = 0;
    while (whole == 0 || answer_.size() < whole) {
      char buffer[65536];
      const ssize_t got = recv(socket_, buffer, sizeof buffer, 0);
      if (got <= 0) throw std::runtime_error("the server hung up");
      answer_.append(buffer, static_cast<std::size_t>(got));
      const std::size_t head = answer_.find("\r\n\r\n");
      if (whole > 0 || head == std::string::npos) continue;
      const std::size_t length = answer_.find("Content-Length: ");
      if (length > head) throw std::runtime_error("an answer without a length");
      whole = head + 4 + std::strtoul(answer_.c_str() + length + 16, nullptr, 10);
    }
    return answer_;
  }

 private:
  int socket_;
  std::string answer_;
};

std::string Request(const Options& options, const std::string& body) {
  return "POST " + options.path + " HTTP/1.1\r\nHost: 127.0.0.1\r\nAuthorization: Bearer " +
         options.token +
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
  std::vector<std::string> requests;
  for (const std::string& body : options.bodies) requests.push_back(Request(options, body));
  Connection connection(options.port);
  for (std::size_t i = 0; i < options.rounds * requests.size(); ++i) {
    const auto start = Clock::now();
    const std::string& answer = connection.Exchange(requests[(first + i) % requests.size()]);
    totals.times.push_back(std::chrono::duration<double, std::micro>(Clock::now() - start).count());
    totals.bytes += answer.size();
    totals.hits += HitsIn(answer);
    totals.failed += answer.find("\"success\":true") == std::string::npos &&
                     answer.find("\"success\" : true") == std::string::npos;
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

int main(int count, char** words) {
  if (count != 7) {
    std::cerr << "Usage: maru-bench-load PORT TOKEN PATH BODIES CONNECTIONS ROUNDS\n"
                 "Sends each line of the file BODIES to PATH, ROUNDS times on each connection, and "
                 "prints one JSON object; times in microseconds.\n";
    return 2;
  }
  Options options;
  options.port = static_cast<std::uint16_t>(std::strtoul(words[1], nullptr, 10));
  options.token = words[2];
  options.path = words[3];
  std::ifstream file(words[4]);
  for (std::string line; std::getline(file, line);) options.bodies.push_back(line);
  options.connections = std::max(1ul, std::strtoul(words[5], nullptr, 10));
  options.rounds = std::max(1ul, std::strtoul(words[6], nullptr, 10));
  return options.bodies.empty() ? 2 : Measure(options);
}
